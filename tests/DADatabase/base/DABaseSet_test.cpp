#include "DABaseSet.h"

#include <chrono>
#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <functional>
#include <future>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DAMemberLock.h"
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

TEST(DABaseSet, FirstValueUnderAPointerStays)
{
    DABaseSet set;
    set.SetData(kName, "Kim");
    set.SetData(kName, "Lee");
    set.SetData(kName, 7);
    set.SetData(kName, 2.5);
    EXPECT_EQ(DataOf(set), (DAValueMap{{kName, "Kim"}}));
}

TEST(DABaseSet, KeysAreAddressesInAscendingOrder)
{
    DABaseSet set;
    set.SetData(kName2, "Lee");
    set.SetData(kPhone, "010");
    set.SetData(kName, "Kim");
    std::vector<std::pair<const char*, std::string>> entries;
    for (const auto& entry : DataOf(set)) {
        entries.push_back(entry);
    }
    const std::vector<std::pair<const char*, std::string>> expected{{kName, "Kim"}, {kPhone, "010"}, {kName2, "Lee"}};
    EXPECT_EQ(entries, expected);
}

TEST(DABaseSet, TextsAreStoredUnchangedAndMapsAreIndependent)
{
    DABaseSet set;
    set.SetData(kName, "Kim's \\ \"x\"");
    set.SetData(kPhone, "");
    set.SetWhere(kName, "Lee");
    EXPECT_EQ(DataOf(set), (DAValueMap{{kName, "Kim's \\ \"x\""}, {kPhone, ""}}));
    EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, "Lee"}}));
}

TEST(DABaseSet, NumbersAreStoredAsDefaultStreamText)
{
    const std::pair<int, const char*> ints[] = {{0, "0"}, {-42, "-42"}, {-7, "-7"}, {2147483647, "2147483647"}};
    const std::pair<double, const char*> doubles[] = {{2.0, "2"},
                                                      {2.5, "2.5"},
                                                      {0.1, "0.1"},
                                                      {3.14159265, "3.14159"},
                                                      {123456.7, "123457"},
                                                      {100000.0, "100000"},
                                                      {1234567.0, "1.23457e+06"},
                                                      {0.00001, "1e-05"},
                                                      {-0.0, "-0"},
                                                      {1e7, "1e+07"},
                                                      {12345.678, "12345.7"}};
    const auto check = [](auto value, const char* text) {
        DABaseSet set;
        set.SetData(kName, value);
        set.SetWhere(kName, value);
        EXPECT_EQ(DataOf(set), (DAValueMap{{kName, text}})) << "stored " << text;
        EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, text}})) << "stored " << text;
    };
    for (const auto& row : ints) {
        check(row.first, row.second);
    }
    for (const auto& row : doubles) {
        check(row.first, row.second);
    }
}

TEST(DABaseSet, NullColumnIsRefusedWithOneErrorLine)
{
    const std::pair<const char*, std::function<void(DABaseSet&)>> setters[] = {
        {"SetData", [](DABaseSet& s) { s.SetData(nullptr, "Kim"); }},
        {"SetData", [](DABaseSet& s) { s.SetData(nullptr, 1); }},
        {"SetData", [](DABaseSet& s) { s.SetData(nullptr, 1.5); }},
        {"SetWhere", [](DABaseSet& s) { s.SetWhere(nullptr, "Kim"); }},
        {"SetWhere", [](DABaseSet& s) { s.SetWhere(nullptr, 1); }},
        {"SetWhere", [](DABaseSet& s) { s.SetWhere(nullptr, 1.5); }},
    };
    for (const auto& setter : setters) {
        SCOPED_TRACE(setter.first);
        DABaseSet set;
        LogCapture log;
        setter.second(set);
        EXPECT_TRUE(DataOf(set).empty());
        EXPECT_TRUE(WhereOf(set).empty());
        const std::vector<LogLine> lines = log.Lines();
        ASSERT_EQ(lines.size(), 1U);
        EXPECT_EQ(lines[0].logId, 0);
        EXPECT_EQ(lines[0].priority, 6);
        EXPECT_EQ(lines[0].tag, "ULO_DB");
        EXPECT_EQ(lines[0].file, "DABaseSet.cpp");
        EXPECT_EQ(lines[0].function, setter.first);
        EXPECT_FALSE(lines[0].message.empty());
    }
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
