#include "DABaseSet.h"

#include <chrono>
#include <cmath>
#include <cstring>
#include <functional>
#include <future>
#include <memory>
#include <numeric>
#include <stdexcept>
#include <thread>

#include <gtest/gtest.h>

#include "DASqlGenerator.h"
#include "DAUpsertRequest.h"

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

// Every refused form stores nothing (the statement, conditions and typed
// values as before) and writes one line: names that could carry SQL, null
// texts and blobs, NaN and infinities, rows of unequal length, text matches
// of numbers, patterns too long.
#define FORM(call) [](DAUpsertRequest& r, const char* n) { (void)n, r.call; }

TEST(DABaseSet, RefusedFormsStoreNothingWithOneLine)
{
    // Each form with its line (less " NOT STORED"); a form about a name runs
    // once for every bad name (null last: values refuse a qualified one).
    const std::pair<const char*, void (*)(DAUpsertRequest&, const char*)> kForms[] = {
        {"SetWhere INVALID COLUMN NAME, CONDITION", FORM(SetWhere(n, DACompare::Less, 1))},
        {"SetWhereIn INVALID COLUMN NAME, CONDITION", FORM(SetWhereIn(n, {}))},
        {"SetWhereNull INVALID COLUMN NAME, CONDITION", FORM(SetWhereNull(n))},
        {"SetWhereRow INVALID COLUMN NAME, CONDITION", FORM(SetWhereRow({"a", n}, DACompare::Less, {1, 2}))},
        {"SetNull INVALID COLUMN NAME, VALUE", FORM(SetNull(n != nullptr ? n : "t.v"))},
        {"SetBlob INVALID COLUMN NAME, VALUE", FORM(SetBlob(n != nullptr ? n : "t.v", "", 0))},
        {"SetIncrement INVALID COLUMN NAME, VALUE", FORM(SetIncrement(n, 1))},
        {"AddConflictKey INVALID COLUMN NAME, KEY", FORM(AddConflictKey(n != nullptr ? n : "t.k"))},
        {"SetWhere NULL VALUE, CONDITION", FORM(SetWhere("v", DACompare::Equal, static_cast<const char*>(nullptr)))},
        {"SetWhere INVALID NUMBER, CONDITION", FORM(SetWhere("v", DACompare::Equal, std::nan("")))},
        {"SetWhere INVALID NUMBER, CONDITION", FORM(SetWhere("v", DACompare::Less, HUGE_VAL))},
        {"SetWhereRow INVALID NUMBER, CONDITION", FORM(SetWhereRow({"a"}, DACompare::Less, {-HUGE_VAL}))},
        {"SetWhereRow NULL VALUE, CONDITION",
         FORM(SetWhereRow({"a"}, DACompare::Less, {static_cast<char const*>(nullptr)}))},
        {"SetWhereRow COLUMN AND VALUE COUNTS DIFFER, CONDITION", FORM(SetWhereRow({"a", "b"}, DACompare::Less, {1}))},
        {"SetWhereRow COLUMN AND VALUE COUNTS DIFFER, CONDITION", FORM(SetWhereRow({}, DACompare::Less, {}))},
        {"SetWhereRow INVALID OPERATOR, CONDITION", FORM(SetWhereRow({"a"}, DACompare::Like, {"x"}))},
        {"SetWhereRow NULL BLOB, CONDITION", FORM(SetWhereRow({"a"}, DACompare::Less, {DAValue::Blob(nullptr, 1)}))},
        {"SetBlob NULL BLOB,", FORM(SetBlob("b", nullptr, 1))},
        {"SetWhere TEXT MATCH OF A NUMBER, CONDITION", FORM(SetWhere("a", DACompare::Contains, 5))},
        {"SetWhere TEXT MATCH OF A NUMBER, CONDITION", FORM(SetWhere("a", DACompare::EndsWith, 5ULL))},
        {"SetWhere PATTERN TOO LONG, CONDITION",
         FORM(SetWhere("a", DACompare::StartsWith, std::string(49999, '%').c_str()))},
    };
    for (const auto& [line, form] : kForms) {
        for (const char* bad :
             {"", "1ts", "0ts", "ts;--", "a b", "a.b.c", "t.", "ts'", static_cast<const char*>(nullptr)}) {
            DAUpsertRequest request;
            request.SetTable("t");
            request.SetData("v", "1");
            std::string before;
            std::string after;
            DASqlGenerator().GetUpsertSql(request, before);
            const LogCapture log;
            form(request, bad);
            DASqlGenerator().GetUpsertSql(request, after);
            std::vector<DABaseSet::Condition> conditions;
            std::vector<DABaseSet::TypedValue> typed;
            request.GetConditions(conditions);
            request.GetTypedData(typed);
            EXPECT_TRUE(before == after && conditions.empty() && typed.empty()) << line;
            ASSERT_EQ(1U, log.Lines().size()) << line;
            EXPECT_EQ(line + std::string(" NOT STORED"), log.Lines()[0].function + " " + log.Lines()[0].message);
            if (std::strstr(line, "COLUMN NAME") == nullptr) {
                break;
            }
        }
    }
}

// What is accepted is kept as given and copied at the call: every edge of
// the name bytes, quotes and "%n", a 10 MB value, a blob's 256 bytes.
TEST(DABaseSet, KeepsCopiesOfWhatItAccepts)
{
    DABaseSet set;
    std::string name = "é_Az09.aZ";
    const std::string big(10 << 20, '\'');
    std::vector<unsigned char> bytes(256);
    std::iota(bytes.begin(), bytes.end(), 0);
    const std::vector<unsigned char> given = bytes;
    set.SetWhere(name.c_str(), DACompare::Like, "%n%s'");
    set.SetWhere("big", DACompare::Equal, big.c_str());
    set.SetBlob("b", bytes.data(), bytes.size());
    name = "overwritten";
    bytes.assign(256, 0);
    std::vector<DABaseSet::Condition> listed;
    std::vector<DABaseSet::TypedValue> typed;
    set.GetConditions(listed);
    set.GetTypedData(typed);
    ASSERT_EQ(2U, listed.size());
    EXPECT_EQ("é_Az09.aZ", listed[0].column);
    EXPECT_EQ((std::vector<std::string>{"%n%s'"}), listed[0].values);
    EXPECT_EQ(big, listed[1].values.at(0));
    ASSERT_EQ(1U, typed.size());
    EXPECT_EQ(given, typed[0].bytes);
}

}  // namespace
