#include "DABaseSet.h"

#include <chrono>
#include <cmath>
#include <future>
#include <memory>
#include <stdexcept>
#include <thread>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"

namespace {

// "name" lies below "phone"; a second "name" lies above both.
const char kNames[] = "name\0phone\0name";
const char* const kName = kNames;
const char* const kPhone = kNames + 5;
const char* const kName2 = kNames + 11;

// The data map and the where map; the getters must replace the stale entry.
std::pair<DAValueMap, DAValueMap> MapsOf(DABaseSet& set)
{
    std::pair<DAValueMap, DAValueMap> maps{{{kName2, "stale"}}, {{kName2, "stale"}}};
    set.GetDataMap(maps.first);
    set.GetWhereMap(maps.second);
    return maps;
}

// The first value stored under a name pointer stays, whatever its type; text
// is stored unchanged, numbers as default stream text; a null column is
// refused with one error line.
TEST(DABaseSet, FirstValueStaysInItsOwnMap)
{
    DABaseSet set;
    LogCapture log;
    set.SetData(kName, "Kim's \\ \"x\"");
    set.SetData(kName, "Lee");
    set.SetData(kName, 7);
    set.SetData(kName, 2.5);
    set.SetData(kPhone, 3.14159265);
    set.SetWhere(kName, -42);
    set.SetWhere(kName, "Lee");
    set.SetWhere(kPhone, 1e7);
    set.SetData(nullptr, 1);
    set.SetWhere(nullptr, "Kim");
    EXPECT_EQ(MapsOf(set).first, (DAValueMap{{kName, "Kim's \\ \"x\""}, {kPhone, "3.14159"}}));
    EXPECT_EQ(MapsOf(set).second, (DAValueMap{{kName, "-42"}, {kPhone, "1e+07"}}));
    DABaseSet numbers;
    numbers.SetData(kName, -1);
    numbers.SetWhere(kName, "");
    EXPECT_EQ(MapsOf(numbers), std::make_pair(DAValueMap{{kName, "-1"}}, DAValueMap{{kName, ""}}));
    EXPECT_EQ((Strings{Logged(6, "DABaseSet.cpp", "SetData", "NULL COLUMN NAME, VALUE NOT STORED"),
                       Logged(6, "DABaseSet.cpp", "SetWhere", "NULL COLUMN NAME, VALUE NOT STORED")}),
              Described(log));
}

TEST(DABaseSet, NullValueThrowsAndReleasesTheLock)
{
    DABaseSet set;
    EXPECT_THROW(set.SetData(kName, static_cast<const char*>(nullptr)), std::logic_error);
    EXPECT_THROW(set.SetWhere(kName, static_cast<const char*>(nullptr)), std::logic_error);
    // A lock left held would block this thread forever: it is then abandoned.
    auto done = std::make_shared<std::promise<void>>();
    std::thread([&set, done] {
        set.SetData(kName, "Kim");
        set.SetWhere(kName, "Lee");
        done->set_value();
    }).detach();
    ASSERT_EQ(done->get_future().wait_for(std::chrono::seconds(5)), std::future_status::ready)
        << "a map lock stayed held after the exception";
    EXPECT_EQ(MapsOf(set), std::make_pair(DAValueMap{{kName, "Kim"}}, DAValueMap{{kName, "Lee"}}));
}

// Names that could carry SQL, a null text, NaN and infinities are refused
// with one line each and store nothing; quotes, "%n" and 10 MB values are
// kept as given; names are copied at the call.
TEST(DABaseSet, ListedConditionsRefuseWhatIsNotPlainAndCopyNames)
{
    DABaseSet set;
    LogCapture log;
    Strings expected;
    for (const char* bad :
         {static_cast<const char*>(nullptr), "", "1ts", "0ts", "ts;--", "a b", "a.b.c", "t.", "ts'"}) {
        set.SetWhere(bad, DACompare::Less, 1);
        set.SetWhereIn(bad, {});
        set.SetWhereNull(bad);
        for (const char* function : {"SetWhere", "SetWhereIn", "SetWhereNull"}) {
            expected.push_back(Logged(6, "DABaseSet.cpp", function, "INVALID COLUMN NAME, CONDITION NOT STORED"));
        }
    }
    set.SetWhere("v", DACompare::Equal, static_cast<const char*>(nullptr));
    expected.push_back(Logged(6, "DABaseSet.cpp", "SetWhere", "NULL VALUE, CONDITION NOT STORED"));
    for (const double number : {std::nan(""), HUGE_VAL, -HUGE_VAL}) {
        set.SetWhere("v", DACompare::Equal, number);
        expected.push_back(Logged(6, "DABaseSet.cpp", "SetWhere", "INVALID NUMBER, CONDITION NOT STORED"));
    }
    std::string name = "é_Az09.aZ";  // every edge of the name bytes
    const std::string big(10 << 20, '\'');
    set.SetWhere(name.c_str(), DACompare::Like, "%n%s'");
    set.SetWhere("big", DACompare::Equal, big.c_str());
    name = "overwritten";
    std::vector<DABaseSet::Condition> listed;
    set.GetConditions(listed);
    ASSERT_EQ(2U, listed.size());
    EXPECT_EQ("é_Az09.aZ", listed[0].column);
    EXPECT_EQ((std::vector<std::string>{"%n%s'"}), listed[0].values);
    EXPECT_EQ(big, listed[1].values.at(0));
    EXPECT_EQ(expected, Described(log));
}

// Typed values refuse what listed conditions refuse, and a null blob with a
// size, with one line each; a blob's bytes are copied at the call.
TEST(DABaseSet, TypedValuesRefuseBadNamesAndCopyBytes)
{
    DABaseSet set;
    LogCapture log;
    Strings expected;
    for (const char* bad : {static_cast<const char*>(nullptr), "", "t.v", "a b"}) {
        set.SetNull(bad);
        set.SetBlob(bad, "", 0);
        expected.push_back(Logged(6, "DABaseSet.cpp", "SetNull", "INVALID COLUMN NAME, VALUE NOT STORED"));
        expected.push_back(Logged(6, "DABaseSet.cpp", "SetBlob", "INVALID COLUMN NAME, VALUE NOT STORED"));
    }
    set.SetBlob("b", nullptr, 1);
    expected.push_back(Logged(6, "DABaseSet.cpp", "SetBlob", "NULL BLOB, NOT STORED"));
    std::vector<unsigned char> bytes(256);
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        bytes[i] = static_cast<unsigned char>(i);
    }
    const std::vector<unsigned char> given = bytes;
    set.SetBlob("b", bytes.data(), bytes.size());
    bytes.assign(256, 0);
    std::vector<DABaseSet::TypedValue> typed;
    set.GetTypedData(typed);
    ASSERT_EQ(1U, typed.size());
    EXPECT_EQ(given, typed[0].bytes);
    EXPECT_EQ(expected, Described(log));
}

}  // namespace
