// Listed conditions, select lists, inserts and change counts on real files.

#include <atomic>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <thread>

#include <sys/wait.h>
#include <unistd.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

// Files on tmpfs where there is one: the concurrent writers commit hundreds
// of times, and a slow disk would make them meet the busy limit.
[[maybe_unused]] const bool g_onTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

class DAConditions : public TempDirTest {
protected:
    // The ids request's query gives, sorted by id, and its statement.
    std::string Ids(DAQueryRequest& request, int expectedRc = 0)
    {
        At(request, Dir(), "m").SetOrderBy("id");
        DACursor cursor;
        EXPECT_EQ(expectedRc, DADatabase().Query(request, cursor));
        std::string ids;
        for (const std::string& id : ColumnValues(cursor, "id")) {
            ids += id;
        }
        return ids;
    }
};

// A condition, its text after "WHERE ", and the ids of the rows it selects.
struct OperatorCase {
    void (*set)(DABaseSet&);
    const char* text;
    const char* ids;
};

// Numbers in an INTEGER, a REAL, a TEXT and an untyped column: unquoted
// numbers compare as numbers wherever the column's affinity lets them (a
// TEXT column turns them into text, as SQLite's rules say), quoted ones as
// text.
const OperatorCase kOperators[] = {
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::Less, 10); }, "i<10", "1"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::LessEqual, 10L); }, "i<=10", "12"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::Greater, short{9}); }, "i>9", "23"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::GreaterEqual, std::uint64_t{100}); }, "i>=100", "3"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::Equal, 10U); }, "i=10", "2"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::NotEqual, "10"); }, "i<>'10'", "13"},
    {[](DABaseSet& r) { r.SetWhere("i", DACompare::Less, UINT64_MAX); }, "i<18446744073709551615", "123"},
    {[](DABaseSet& r) { r.SetWhere("r", DACompare::GreaterEqual, 2.5); }, "r>=2.5", "12"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Greater, 10); }, "t>10", "1356"},
    {[](DABaseSet& r) { r.SetWhere("u", DACompare::Less, 10); }, "u<10", "1"},
    {[](DABaseSet& r) { r.SetWhere("u", DACompare::Less, "10"); }, "u<'10'", "12"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Like, "A%"); }, "t LIKE 'A%'", "356"},
    // Matched as typed: '%', '_' and '\\' are themselves, ASCII case folded.
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Contains, "50%"); }, "t LIKE '%50\\%%' ESCAPE '\\'", "5"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Contains, "0_"); }, "t LIKE '%0\\_%' ESCAPE '\\'", ""},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Contains, "%_\\"); }, "t LIKE '%\\%\\_\\\\%' ESCAPE '\\'", "5"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::StartsWith, "A5"); }, "t LIKE 'A5%' ESCAPE '\\'", "56"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::EndsWith, "\\b"); }, "t LIKE '%\\\\b' ESCAPE '\\'", "5"},
    {[](DABaseSet& r) { r.SetWhere("t", DACompare::Contains, ""); }, "t LIKE '%%' ESCAPE '\\'", "12356"},
    {[](DABaseSet& r) {
         r.SetWhereRow({"i", "id"}, DACompare::Less, {10, 2});
     },
     "(i, id)<(10, 2)", "1"},
    {[](DABaseSet& r) {
         r.SetWhereRow({"i", "m.id"}, DACompare::GreaterEqual, {10, 2});
     },
     "(i, m.id)>=(10, 2)", "23"},
    {[](DABaseSet& r) {
         r.SetWhereIn("t", {"9", "abc", "x'y"});
     },
     "t IN ('9', 'abc', 'x''y')", "13"},
    {[](DABaseSet& r) { r.SetWhereIn("i", {}); }, "i IN ()", ""},
    {[](DABaseSet& r) { r.SetWhereNull("u"); }, "u IS NULL", "456"},
    {[](DABaseSet& r) { r.SetWhereNull("m.u", false); }, "m.u IS NOT NULL", "123"},
};

TEST_F(DAConditions, EachOperatorSelectsItsRows)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE m(id INTEGER PRIMARY KEY, i INTEGER, r REAL, t TEXT, u);"
             "INSERT INTO m VALUES (1, 9, 2.5, '9', 9), (2, 10, 10.0, '10', 10), (3, 100, -1.5, 'abc', 'x'),"
             "(4, NULL, NULL, NULL, NULL), (5, NULL, NULL, 'a50%_\\b', NULL), (6, NULL, NULL, 'a50xyb', NULL)");
    for (const OperatorCase& c : kOperators) {
        DAQueryRequest request;
        c.set(request);
        std::string sql;
        DASqlGenerator().GetSelectSql(At(request, Dir(), "m"), sql);
        EXPECT_EQ(std::string("SELECT * FROM m WHERE ") + c.text, sql);
        EXPECT_EQ(c.ids, Ids(request)) << c.text;
    }
}

// Pages of 50 after the last (ts, id) seen, newest first, through one
// request cleared for each page, while another thread adds newer events (at
// a pace: a writer that never pauses starves readers under the busy rule);
// 20 events share each time stamp, so ties cross page boundaries. Every
// event up to the first page's newest comes exactly once, in order.
TEST_F(DAConditions, KeysetPagesWithTiesMissNothingWhileAnotherThreadInserts)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE e(id INTEGER PRIMARY KEY, ts INTEGER); CREATE INDEX e_ts ON e(ts, id);"
             "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 420) "
             "INSERT INTO e(ts) SELECT 1700000000000 + i / 20 FROM n");
    std::atomic<bool> done{false};
    std::atomic<int> written{0};
    std::thread writer([&] {
        DADatabase db;
        for (int k = 0; !done.load(); ++k, ++written) {
            DAInsertRequest insert;
            At(insert, Dir(), "e").SetData("ts", std::int64_t{1700000000100 + k / 3});
            std::int64_t id = 0;
            EXPECT_EQ(0, db.Insert(insert, id));
            std::this_thread::sleep_for(std::chrono::milliseconds(5));  // events come at a pace
        }
    });
    while (written.load() == 0) {
        std::this_thread::yield();
    }
    std::vector<std::int64_t> seen;
    DAQueryRequest page;
    At(page, Dir(), "e").SetOrderBy("ts", true);
    page.SetOrderBy("id", true);
    page.SetLimit(50);
    for (std::int64_t ts = INT64_MAX, id = INT64_MAX;;) {
        page.ClearWhere();
        page.SetWhereRow({"ts", "id"}, DACompare::Less, {ts, id});
        DACursor cursor;
        const int rc = DADatabase().Query(page, cursor);
        EXPECT_EQ(0, rc);
        while (cursor.MoveToNext() == 0) {
            EXPECT_EQ(0, cursor.GetInt64("ts", ts) + cursor.GetInt64("id", id));
            seen.push_back(id);
        }
        if (rc != 0 || cursor.GetCount() < 50) {
            break;
        }
    }
    done.store(true);
    writer.join();
    EXPECT_GT(seen.front(), 420) << "the writer's first event is on the first page";
    ASSERT_GE(seen.size(), 420U);
    for (std::size_t i = 0; i < seen.size(); ++i) {
        ASSERT_EQ(seen.front() - static_cast<std::int64_t>(i), seen[i]) << i;
    }
    EXPECT_EQ(1, seen.back());
}

// Every refused form: one line, nothing stored (the statement unchanged).
TEST_F(DAConditions, RefusedFormsStoreNothingWithOneLine)
{
    const std::pair<void (*)(DAUpsertRequest&), const char*> cases[] = {
        {[](DAUpsertRequest& r) {
             r.SetWhereRow({"a", "b c"}, DACompare::Less, {1, 2});
         },
         "INVALID COLUMN NAME, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) {
             r.SetWhereRow({"a", nullptr}, DACompare::Less, {1, 2});
         },
         "INVALID COLUMN NAME, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) {
             r.SetWhereRow({"a", "b"}, DACompare::Less, {1});
         },
         "COLUMN AND VALUE COUNTS DIFFER, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhereRow({}, DACompare::Less, {}); },
         "COLUMN AND VALUE COUNTS DIFFER, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhereRow({"a"}, DACompare::Like, {"x"}); },
         "INVALID OPERATOR, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhereRow({"a"}, DACompare::Less, {static_cast<char const*>(nullptr)}); },
         "NULL VALUE, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhereRow({"a"}, DACompare::Less, {NAN}); },
         "INVALID NUMBER, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhereRow({"a"}, DACompare::Less, {DAValue::Blob(nullptr, 1)}); },
         "NULL BLOB, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhere("a", DACompare::Contains, 5); },
         "TEXT MATCH OF A NUMBER, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhere("a", DACompare::EndsWith, 5ULL); },
         "TEXT MATCH OF A NUMBER, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetWhere("a", DACompare::StartsWith, std::string(49999, '%').c_str()); },
         "PATTERN TOO LONG, CONDITION NOT STORED"},
        {[](DAUpsertRequest& r) { r.SetIncrement("a;b", 1); }, "INVALID COLUMN NAME, VALUE NOT STORED"},
        {[](DAUpsertRequest& r) { r.AddConflictKey("t.k"); }, "INVALID COLUMN NAME, KEY NOT STORED"},
        {[](DAUpsertRequest& r) { r.AddConflictKey(nullptr); }, "INVALID COLUMN NAME, KEY NOT STORED"},
    };
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
        EXPECT_EQ(before, after) << line;
        std::vector<DABaseSet::Condition> conditions;
        request.GetConditions(conditions);
        EXPECT_TRUE(conditions.empty()) << line;
        ASSERT_EQ(1U, log.Lines().size()) << line;
        EXPECT_EQ(line, log.Lines()[0].message);
    }
}

}  // namespace
