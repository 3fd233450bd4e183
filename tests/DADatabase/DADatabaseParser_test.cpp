#include "DADatabaseParser.h"

#include <chrono>
#include <memory>
#include <string>

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
        return sqlite3_result_error(context, "third row refused", -1);
    }
    sqlite3_result_value(context, argv[1]);
}

std::string Error(const std::string& function, const std::string& message)
{
    return Logged(6, "DADatabasePasrser.cpp", function, message);
}

class DADatabaseParserTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        m_db = std::make_unique<RawDb>(PathOf("parse.db"));
        m_db->Run("CREATE TABLE t(v INTEGER); INSERT INTO t VALUES (1), (2), (3), (4), (5);");
        sqlite3_create_function(m_db->Handle(), "fail_on", 2, SQLITE_UTF8, &m_calls, FailOn, nullptr, nullptr);
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
        EXPECT_EQ(SQLITE_OK, sqlite3_prepare(m_db->Handle(), sql.c_str(), -1, &m_stmt, nullptr));
        return m_stmt;
    }

    std::unique_ptr<RawDb> m_db;
    sqlite3_stmt* m_stmt = nullptr;
    int m_calls = 0;
    LogCapture m_log;
    DADatabaseParser m_parser;
    DACursor m_cursor;
};

}  // namespace

// Any row with a positive count sets the answer; later rows never clear it.
// After an error (on the third row) one step restarts the statement and
// yields its first row again, unread. A step result with no branch of its
// own (misuse, from a null statement) ends the loop the same way.
TEST_F(DADatabaseParserTest, ParseExistTableReadsTheCountAndStepsOnceMoreAfterAnError)
{
    const std::pair<const char*, bool> cases[] = {{"SELECT 0", false},           {"SELECT 1", true},
                                                  {"SELECT -1", false},          {"SELECT 1 WHERE 0", false},
                                                  {"SELECT v - 1 FROM t", true}, {"SELECT 2 - v FROM t", true}};
    bool exists = true;
    EXPECT_EQ(SQLITE_MISUSE, m_parser.ParseExistTable(nullptr, exists));
    EXPECT_FALSE(exists);
    m_parser.ParseDatabase(m_db->Handle(), nullptr, m_cursor);
    EXPECT_EQ(-1, m_cursor.GetCount());
    for (const auto& c : cases) {
        exists = !c.second;
        EXPECT_EQ(SQLITE_DONE, m_parser.ParseExistTable(Prepare(c.first), exists)) << c.first;
        EXPECT_EQ(c.second, exists) << c.first;
    }
    EXPECT_EQ(SQLITE_ROW, m_parser.ParseExistTable(Prepare("SELECT fail_on(3, v) FROM t"), exists));
    EXPECT_EQ(4, m_calls);
    EXPECT_TRUE(exists);
    EXPECT_EQ((Strings{Error("ParseExistTable", "SQLITE STEP ERROR!!!"),
                       Error("ParseDatabase", "SQLITE STEP ERROR!!! not an error"),
                       Error("ParseExistTable", "SQLITE STEP ERROR!!!")}),
              Described(m_log));
}

TEST_F(DADatabaseParserTest, ParseDatabaseStoresValuesAsSqliteText)
{
    m_parser.ParseDatabase(m_db->Handle(),
                           Prepare("SELECT 42 AS i, 2.5 AS r, NULL AS n, x'0102' AS b, 'txt' AS t, "
                                   "'' AS e, 1 AS i UNION ALL SELECT -3, 1e20, 'x', 'y', 'z', 'w', 2"),
                           m_cursor);
    EXPECT_EQ(-1, m_cursor.GetPosition());
    EXPECT_EQ((Strings{Error("ParseDatabase", "UNKNOWN TYPE")}), Described(m_log));
    // i's one list holds 42, 1, -3, 2; the count (2) comes from e, so rows read 42, 1.
    EXPECT_EQ(2, m_cursor.GetCount());
    EXPECT_EQ((Strings{"i", "r", "n", "b", "t",   "e", "i", "42", "1",  "2.5", "1.0e+20",
                       "",  "x", "",  "y", "txt", "z", "",  "w",  "42", "1"}),
              Dump(m_cursor));
}

// ParseRows tells how the rows ended: a failed step's code (the function's
// error is a plain 1) with its text, the rows before it kept; the busy
// limit's 5 with its text. The statements are prepared first; then another
// connection takes the file exclusively, so every step is busy, and
// ParseDatabase gives up after 15 waits too.
TEST_F(DADatabaseParserTest, ParseRowsAndParseDatabaseEndOnAFailedOrBusyStep)
{
    std::string failure;
    EXPECT_EQ(SQLITE_ERROR,
              m_parser.ParseRows(m_db->Handle(), Prepare("SELECT fail_on(3, v) AS v FROM t"), m_cursor, failure));
    EXPECT_EQ("third row refused", failure);
    EXPECT_EQ((Strings{"1", "2"}), ColumnValues(m_cursor, "v"));
    m_log.Clear();
    m_cursor.Initialize();
    sqlite3_stmt* stmt = Prepare("SELECT v FROM t");
    RawDb holder(PathOf("parse.db"));
    holder.Run("BEGIN EXCLUSIVE");
    const auto start = std::chrono::steady_clock::now();
    m_parser.ParseDatabase(m_db->Handle(), stmt, m_cursor);
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    Strings expected = BusyWarnings("DADatabasePasrser.cpp", 15);
    expected.push_back(Error("IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY"));
    EXPECT_EQ(expected, Described(m_log));
    EXPECT_EQ(-1, m_cursor.GetCount());
    EXPECT_GE(seconds, 1.4);
    EXPECT_LT(seconds, 10.0);
    EXPECT_EQ(SQLITE_BUSY, m_parser.ParseRows(m_db->Handle(), stmt, m_cursor, failure));
    EXPECT_EQ("database is locked", failure);
    holder.Run("COMMIT");
}
