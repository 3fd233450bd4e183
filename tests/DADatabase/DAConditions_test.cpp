// Listed conditions, select lists, inserts and change counts on real files.

#include <cmath>
#include <cstdint>

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

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
// request cleared for each page; 20 events share each time stamp, so ties
// cross page boundaries. Every event comes exactly once, in order.
TEST_F(DAConditions, KeysetPagesWithTiesMissNothing)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE e(id INTEGER PRIMARY KEY, ts INTEGER); CREATE INDEX e_ts ON e(ts, id);"
             "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 420) "
             "INSERT INTO e(ts) SELECT 1700000000000 + i / 20 FROM n");  // 20 rows a stamp, 50 a page
    std::string seen;
    DAQueryRequest page;
    At(page, Dir(), "e").SetOrderBy("ts", true);
    page.SetOrderBy("id", true);
    page.SetLimit(50);
    for (std::int64_t ts = INT64_MAX, id = INT64_MAX, count = 50; count == 50;) {
        page.ClearWhere();
        page.SetWhereRow({"ts", "id"}, DACompare::Less, {ts, id});
        DACursor cursor;
        ASSERT_EQ(0, DADatabase().Query(page, cursor));
        while (cursor.MoveToNext() == 0) {
            EXPECT_EQ(0, cursor.GetInt64("ts", ts) + cursor.GetInt64("id", id));
            seen += std::to_string(id) + " ";
        }
        count = cursor.GetCount();
    }
    std::string expected;
    for (int id = 420; id > 0; --id) {
        expected += std::to_string(id) + " ";
    }
    EXPECT_EQ(expected, seen);
}

}  // namespace
