#include "DADatabaseParser.h"

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sqlite3.h>

#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

// fail_on(n, value): returns value, except on its n-th call on the connection,
// where it raises an error.
void FailOn(sqlite3_context* context, int /*argc*/, sqlite3_value** argv)
{
    int* calls = static_cast<int*>(sqlite3_user_data(context));
    if (++*calls == sqlite3_value_int(argv[0])) {
        sqlite3_result_error(context, "third row refused", -1);
        return;
    }
    sqlite3_result_value(context, argv[1]);
}

class DADatabaseParserTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        m_db.reset(new RawDb(PathOf("parse.db")));
        m_db->Run("CREATE TABLE t(v INTEGER); INSERT INTO t VALUES (1), (2), (3), (4), (5);");
        ASSERT_EQ(
            SQLITE_OK,
            sqlite3_create_function(m_db->Handle(), "fail_on", 2, SQLITE_UTF8, &m_calls, FailOn, nullptr, nullptr));
    }
    void TearDown() override
    {
        sqlite3_finalize(m_stmt);
        m_db.reset();
        TempDirTest::TearDown();
    }

    // Prepares sql the way the queries do (the legacy call).
    sqlite3_stmt* Prepare(const std::string& sql)
    {
        sqlite3_finalize(m_stmt);
        m_stmt = nullptr;
        EXPECT_EQ(SQLITE_OK, sqlite3_prepare(m_db->Handle(), sql.c_str(), -1, &m_stmt, nullptr))
            << sqlite3_errmsg(m_db->Handle());
        return m_stmt;
    }

    std::unique_ptr<RawDb> m_db;
    sqlite3_stmt* m_stmt = nullptr;
    int m_calls = 0;
};

const std::string kParser = "DADatabasePasrser.cpp";

std::string Error(const std::string& function, const std::string& message)
{
    return Logged(6, kParser, function, message);
}

}  // namespace

TEST_F(DADatabaseParserTest, ParseExistTableReadsTheCount)
{
    struct Case {
        const char* sql;
        bool exists;
    };
    const Case cases[] = {
        {"SELECT 0", false},
        {"SELECT 1", true},
        {"SELECT 7", true},
        {"SELECT -1", false},
        {"SELECT 1 WHERE 0", false},  // no row
        {"SELECT v - 1 FROM t", true},  // 0 first, then positive
        {"SELECT 2 - v FROM t", true},  // positive first, then 0 and below: stays true
        {"SELECT COUNT(*) FROM sqlite_master WHERE name = 't'", true},
    };
    for (const Case& c : cases) {
        LogCapture log;
        DADatabaseParser parser;
        bool exists = !c.exists;
        EXPECT_EQ(SQLITE_DONE, parser.ParseExistTable(Prepare(c.sql), exists)) << c.sql;
        EXPECT_EQ(c.exists, exists) << c.sql;
        EXPECT_TRUE(log.Lines().empty()) << c.sql;
    }
}

TEST_F(DADatabaseParserTest, ParseExistTableStepsOnceMoreAfterAnError)
{
    LogCapture log;
    DADatabaseParser parser;
    bool exists = false;
    const int rc = parser.ParseExistTable(Prepare("SELECT fail_on(3, v) FROM t"), exists);
    // Rows 1 and 2, the error on the third, then one step that restarts the
    // statement and yields its first row again, unread.
    EXPECT_EQ(SQLITE_ROW, rc);
    EXPECT_EQ(4, m_calls);
    EXPECT_TRUE(exists);
    EXPECT_EQ((Strings{Error("ParseExistTable", "SQLITE STEP ERROR!!!")}), Described(log));
}

TEST_F(DADatabaseParserTest, ParseDatabaseStoresValuesAsSqliteText)
{
    LogCapture log;
    DACursor cursor;
    DADatabaseParser parser;
    parser.ParseDatabase(m_db->Handle(),
                         Prepare("SELECT 42 AS i, 2.5 AS r, NULL AS n, x'0102' AS b, 'txt' AS t, "
                                 "'' AS e, 1 AS i UNION ALL SELECT -3, 1e20, 'x', 'y', 'z', 'w', 2"),
                         cursor);
    Strings names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((Strings{"i", "r", "n", "b", "t", "e", "i"}), names);
    EXPECT_EQ(-1, cursor.GetPosition());
    EXPECT_EQ((Strings{Error("ParseDatabase", "UNKNOWN TYPE")}), Described(log));
    // i's one list holds 42, 1, -3, 2; the count (2) comes from e, so rows read 42, 1.
    EXPECT_EQ(2, cursor.GetCount());
    EXPECT_EQ((Strings{"42", "1"}), ColumnValues(cursor, "i"));
    EXPECT_EQ((Strings{"", "x"}), ColumnValues(cursor, "n"));
    EXPECT_EQ((Strings{"", "y"}), ColumnValues(cursor, "b"));
    EXPECT_EQ((Strings{"2.5", "1.0e+20"}), ColumnValues(cursor, "r"));
    EXPECT_EQ((Strings{"txt", "z"}), ColumnValues(cursor, "t"));
    EXPECT_EQ((Strings{"", "w"}), ColumnValues(cursor, "e"));
}

TEST_F(DADatabaseParserTest, ParseDatabaseKeepsRowsReadBeforeAStepError)
{
    LogCapture log;
    DACursor cursor;
    DADatabaseParser parser;
    parser.ParseDatabase(m_db->Handle(), Prepare("SELECT v, fail_on(3, v * 10) AS w FROM t"), cursor);
    // A statement from the legacy preparation reports a failed step with the
    // generic text; the function's own message comes only with a reset.
    EXPECT_EQ((Strings{Error("ParseDatabase", "SQLITE STEP ERROR!!! SQL logic error")}), Described(log));
    EXPECT_EQ(4, m_calls);  // exactly one step after the error
    EXPECT_EQ(2, cursor.GetCount());
    EXPECT_EQ((Strings{"1", "2"}), ColumnValues(cursor, "v"));
    EXPECT_EQ((Strings{"10", "20"}), ColumnValues(cursor, "w"));
}

// A step result with no branch of its own (misuse, from a null statement) is
// handled like a step error: one line, one more step, and the loop ends.
TEST_F(DADatabaseParserTest, UnexpectedStepResultEndsTheLoop)
{
    LogCapture log;
    DADatabaseParser parser;
    bool exists = true;
    EXPECT_EQ(SQLITE_MISUSE, parser.ParseExistTable(nullptr, exists));
    EXPECT_FALSE(exists);
    DACursor cursor;
    parser.ParseDatabase(m_db->Handle(), nullptr, cursor);
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ((Strings{Error("ParseExistTable", "SQLITE STEP ERROR!!!"),
                       Error("ParseDatabase", "SQLITE STEP ERROR!!! not an error")}),
              Described(log));
}

// The statement is prepared first; then another connection takes the file
// exclusively, so every step is busy.
TEST_F(DADatabaseParserTest, BusyStepGivesUpAfterFifteenWaits)
{
    sqlite3_stmt* stmt = Prepare("SELECT v FROM t");
    RawDb holder(PathOf("parse.db"));
    holder.Run("BEGIN EXCLUSIVE");
    LogCapture log;
    DACursor cursor;
    const auto start = std::chrono::steady_clock::now();
    DADatabaseParser().ParseDatabase(m_db->Handle(), stmt, cursor);
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    holder.Run("COMMIT");

    Strings expected = BusyWarnings(kParser, 15);
    expected.push_back(Error("IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY"));
    EXPECT_EQ(expected, Described(log));
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_GE(seconds, 1.4);
    EXPECT_LT(seconds, 10.0);
}
