#include "DABaseSet.h"

#include <chrono>
#include <cmath>
#include <functional>
#include <future>
#include <memory>
#include <numeric>
#include <stdexcept>
#include <thread>
#include <tuple>

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
TEST(DABaseSet, RefusedFormsStoreNothingWithOneLine)
{
    using Set = std::function<void(DAUpsertRequest&)>;
    using Named = void (*)(DAUpsertRequest&, const char*);
    const std::tuple<const char*, const char*, Named> kNamed[] = {
        // values refuse a qualified name too
        {"SetWhere", "CONDITION", [](DAUpsertRequest& r, const char* n) { r.SetWhere(n, DACompare::Less, 1); }},
        {"SetWhereIn", "CONDITION", [](DAUpsertRequest& r, const char* n) { r.SetWhereIn(n, {}); }},
        {"SetWhereNull", "CONDITION", [](DAUpsertRequest& r, const char* n) { r.SetWhereNull(n); }},
        {"SetWhereRow", "CONDITION",
         [](DAUpsertRequest& r, const char* n) {
             r.SetWhereRow({"a", n}, DACompare::Less, {1, 2});
         }},
        {"SetNull", "VALUE", [](DAUpsertRequest& r, const char* n) { r.SetNull(n ? n : "t.v"); }},
        {"SetBlob", "VALUE", [](DAUpsertRequest& r, const char* n) { r.SetBlob(n ? n : "t.v", "", 0); }},
        {"SetIncrement", "VALUE", [](DAUpsertRequest& r, const char* n) { r.SetIncrement(n, 1); }},
        {"AddConflictKey", "KEY", [](DAUpsertRequest& r, const char* n) { r.AddConflictKey(n ? n : "t.k"); }},
    };
    std::vector<std::pair<Set, std::string>> cases;
    for (const char* bad :
         {static_cast<const char*>(nullptr), "", "1ts", "0ts", "ts;--", "a b", "a.b.c", "t.", "ts'"}) {
        for (const auto& [function, what, set] : kNamed) {
            cases.push_back({[=](auto& r) { set(r, bad); },
                             function + std::string(" INVALID COLUMN NAME, ") + what + " NOT STORED"});
        }
    }
    const std::string condition = ", CONDITION NOT STORED";
    for (const double number : {std::nan(""), HUGE_VAL, -HUGE_VAL}) {
        cases.push_back(
            {[=](auto& r) { r.SetWhere("v", DACompare::Equal, number); }, "SetWhere INVALID NUMBER" + condition});
        cases.push_back({[=](auto& r) { r.SetWhereRow({"a"}, DACompare::Less, {number}); },
                         "SetWhereRow INVALID NUMBER" + condition});
    }
    const std::string longPattern(49999, '%');
    cases.insert(
        cases.end(),
        {{[](auto& r) { r.SetWhere("v", DACompare::Equal, static_cast<const char*>(nullptr)); },
          "SetWhere NULL VALUE" + condition},
         {[](auto& r) { r.SetWhereRow({"a"}, DACompare::Less, {static_cast<char const*>(nullptr)}); },
          "SetWhereRow NULL VALUE" + condition},
         {[](auto& r) {
              r.SetWhereRow({"a", "b"}, DACompare::Less, {1});
          },
          "SetWhereRow COLUMN AND VALUE COUNTS DIFFER" + condition},
         {[](auto& r) { r.SetWhereRow({}, DACompare::Less, {}); },
          "SetWhereRow COLUMN AND VALUE COUNTS DIFFER" + condition},
         {[](auto& r) { r.SetWhereRow({"a"}, DACompare::Like, {"x"}); }, "SetWhereRow INVALID OPERATOR" + condition},
         {[](auto& r) { r.SetWhereRow({"a"}, DACompare::Less, {DAValue::Blob(nullptr, 1)}); },
          "SetWhereRow NULL BLOB" + condition},
         {[](auto& r) { r.SetBlob("b", nullptr, 1); }, "SetBlob NULL BLOB, NOT STORED"},
         {[](auto& r) { r.SetWhere("a", DACompare::Contains, 5); }, "SetWhere TEXT MATCH OF A NUMBER" + condition},
         {[](auto& r) { r.SetWhere("a", DACompare::EndsWith, 5ULL); }, "SetWhere TEXT MATCH OF A NUMBER" + condition},
         {[&](auto& r) { r.SetWhere("a", DACompare::StartsWith, longPattern.c_str()); },
          "SetWhere PATTERN TOO LONG" + condition}});
    for (const auto& [set, line] : cases) {
        DAUpsertRequest request;
        request.SetTable("t");
        request.SetData("v", "1");
        std::string before;
        std::string after;
        DASqlGenerator().GetUpsertSql(request, before);
        const LogCapture log;
        set(request);
        DASqlGenerator().GetUpsertSql(request, after);
        std::vector<DABaseSet::Condition> conditions;
        std::vector<DABaseSet::TypedValue> typed;
        request.GetConditions(conditions);
        request.GetTypedData(typed);
        EXPECT_EQ(before, after) << line;
        EXPECT_TRUE(conditions.empty() && typed.empty()) << line;
        ASSERT_EQ(1U, log.Lines().size()) << line;
        EXPECT_EQ(line, log.Lines()[0].function + " " + log.Lines()[0].message);
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
