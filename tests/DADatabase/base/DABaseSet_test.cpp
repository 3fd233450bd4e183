#include "DABaseSet.h"

#include <chrono>
#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <future>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DAMemberLock.h"
#include "DatabaseTestUtil.h"
#include "LogCapture.h"

namespace {

// "name" lies below "phone"; a second "name" lies above both.
const char kNames[] = "name\0phone\0name";
const char* const kName = kNames;
const char* const kPhone = kNames + 5;
const char* const kName2 = kNames + 11;

DAValueMap DataOf(DABaseSet& set)
{
    DAValueMap map{{kPhone, "stale"}};  // the getter must replace this
    set.GetDataMap(map);
    return map;
}

DAValueMap WhereOf(DABaseSet& set)
{
    DAValueMap map{{kName2, "stale"}};
    set.GetWhereMap(map);
    return map;
}

// The first value stored under a name pointer stays, whatever its type; the
// text is stored unchanged; data and conditions are separate maps.
TEST(DABaseSet, FirstValueStaysUnchangedInItsOwnMap)
{
    DABaseSet set;
    set.SetData(kName, "Kim's \\ \"x\"");
    set.SetData(kName, "Lee");
    set.SetData(kName, 7);
    set.SetData(kName, 2.5);
    set.SetData(kPhone, "");
    set.SetWhere(kName, "Lee");
    EXPECT_EQ(DataOf(set), (DAValueMap{{kName, "Kim's \\ \"x\""}, {kPhone, ""}}));
    EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, "Lee"}}));
}

TEST(DABaseSet, NumbersAreStoredAsDefaultStreamText)
{
    const auto check = [](auto value, const char* text) {
        DABaseSet set;
        set.SetData(kName, value);
        set.SetWhere(kName, value);
        EXPECT_EQ(DataOf(set), (DAValueMap{{kName, text}})) << "stored " << text;
        EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, text}})) << "stored " << text;
    };
    check(0, "0");
    check(-42, "-42");
    check(2147483647, "2147483647");
    check(2.0, "2");
    check(2.5, "2.5");
    check(0.1, "0.1");
    check(3.14159265, "3.14159");
    check(123456.7, "123457");
    check(100000.0, "100000");
    check(1234567.0, "1.23457e+06");
    check(0.00001, "1e-05");
    check(-0.0, "-0");
    check(1e7, "1e+07");
    check(12345.678, "12345.7");
}

TEST(DABaseSet, NullColumnIsRefusedWithOneErrorLineEach)
{
    DABaseSet set;
    LogCapture log;
    set.SetData(nullptr, "Kim");
    set.SetData(nullptr, 1);
    set.SetData(nullptr, 1.5);
    set.SetWhere(nullptr, "Kim");
    set.SetWhere(nullptr, 1);
    set.SetWhere(nullptr, 1.5);
    EXPECT_TRUE(DataOf(set).empty());
    EXPECT_TRUE(WhereOf(set).empty());
    const std::string data = "6 DABaseSet.cpp:SetData > NULL COLUMN NAME, VALUE NOT STORED";
    const std::string where = "6 DABaseSet.cpp:SetWhere > NULL COLUMN NAME, VALUE NOT STORED";
    EXPECT_EQ((Strings{data, data, data, where, where, where}), Described(log));
    // The library's lines go to the main log under its own tag.
    EXPECT_EQ(log.Lines()[0].logId, 0);
    EXPECT_EQ(log.Lines()[0].tag, "ULO_DB");
}

TEST(DABaseSet, NullValueThrowsAndReleasesTheLock)
{
    DABaseSet set;
    LogCapture log;
    EXPECT_THROW(set.SetData(kName, static_cast<const char*>(nullptr)), std::logic_error);
    EXPECT_THROW(set.SetWhere(kName, static_cast<const char*>(nullptr)), std::logic_error);
    EXPECT_TRUE(DataOf(set).empty());
    EXPECT_TRUE(WhereOf(set).empty());

    // A lock left held would block this thread forever: it is then abandoned.
    auto done = std::make_shared<std::promise<void>>();
    std::thread([&set, done] {
        set.SetData(kName, "Kim");
        set.SetWhere(kName, "Lee");
        done->set_value();
    }).detach();
    ASSERT_EQ(done->get_future().wait_for(std::chrono::seconds(5)), std::future_status::ready)
        << "a map lock stayed held after the exception";
    EXPECT_EQ(DataOf(set), (DAValueMap{{kName, "Kim"}}));
    EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, "Lee"}}));
    EXPECT_TRUE(log.Lines().empty());
}

TEST(DAMemberLock, NameIsTheAddressInLowerCaseHex)
{
    int local = 0;
    const std::uintptr_t addresses[] = {0, 0x1, 0xABCDEF0, UINTPTR_MAX, reinterpret_cast<std::uintptr_t>(&local)};
    for (const std::uintptr_t address : addresses) {
        char expected[DAMemberLock::kNameSize];
        std::snprintf(expected, sizeof expected, "%" PRIxPTR, address);
        char name[DAMemberLock::kNameSize] = "ZZZZZZZZZZZZZZZZZZZZZZZZ";
        const int length = DAMemberLock::FormatName(reinterpret_cast<const void*>(address), name);
        EXPECT_STREQ(name, expected);
        EXPECT_EQ(length, static_cast<int>(std::strlen(expected)));
    }
}

}  // namespace
