#include "DABaseSet.h"

#include <chrono>
#include <future>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"

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

// Numbers are stored as default stream text (six significant digits); a
// null column is refused with one error line per map.
TEST(DABaseSet, NumbersAreStreamTextAndNullColumnsAreRefused)
{
    DABaseSet set;
    LogCapture log;
    set.SetData(kName, -42);
    set.SetData(kPhone, 3.14159265);
    set.SetWhere(kName, 7);
    set.SetWhere(kPhone, 1e7);
    set.SetData(nullptr, 1.5);
    set.SetWhere(nullptr, "Kim");
    EXPECT_EQ(DataOf(set), (DAValueMap{{kName, "-42"}, {kPhone, "3.14159"}}));
    EXPECT_EQ(WhereOf(set), (DAValueMap{{kName, "7"}, {kPhone, "1e+07"}}));
    EXPECT_EQ((Strings{Logged(6, "DABaseSet.cpp", "SetData", "NULL COLUMN NAME, VALUE NOT STORED"),
                       Logged(6, "DABaseSet.cpp", "SetWhere", "NULL COLUMN NAME, VALUE NOT STORED")}),
              Described(log));
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

}  // namespace
