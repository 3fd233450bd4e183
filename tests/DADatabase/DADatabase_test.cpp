#include "DADatabase.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

const char* const kFile = "t.db";

std::string Line(int priority, const std::string& function, const std::string& message)
{
    return Logged(priority, "DADatabase.cpp", function, message);
}

const std::string kOpenFailed = Line(6, "OpenDB", "DB open failed. Error no(14): unable to open database file");

// A cursor holding one row of its own, to see whether an operation replaced it.
void Preload(DACursor& cursor)
{
    cursor.SetColumn("mine");
    cursor.SetData("mine", "kept");
}

class DADatabaseTest : public TempDirTest {
protected:
    void Seed(const std::string& sql) { RawDb(PathOf(kFile)).Run(sql); }

    DADatabase m_db;
};

}  // namespace

// Another connection holds the file exclusively for the whole call: a
// Select, whose new connection must read the schema to prepare, is tried 17
// times with 15 pauses of 100 ms, and leaves the cursor alone. (A write's
// wait is the batch's.)
TEST_F(DADatabaseTest, BusySelectGivesUpAfterFifteenPauses)
{
    Seed("CREATE TABLE contacts(name TEXT)");
    RawDb holder(PathOf(kFile));
    holder.Run("BEGIN EXCLUSIVE");
    LogCapture log;
    DACursor cursor;
    Preload(cursor);
    DASelectRequest request;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(5, m_db.Select(At(request, Dir(), "contacts"), cursor));
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    Strings expected = BusyWarnings("DADatabase.cpp", 15);
    expected.push_back(Line(6, "IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY"));
    expected.push_back(Line(6, "Select", "SELECT FAILED[5]: database is locked"));
    EXPECT_EQ(expected, Described(log));
    EXPECT_EQ(Strings{"kept"}, ColumnValues(cursor, "mine"));
    EXPECT_GE(seconds, 1.4);
    EXPECT_LT(seconds, 10.0);
}

// A null name throws, and the file is closed on the way out. (Which
// tables count, by their exact name, is the statement's text.)
TEST_F(DADatabaseTest, CheckExistTableThrowsOnANullNameAndClosesTheFile)
{
    DABasePath location;
    const int descriptors = OpenDescriptorCount();
    bool exists = true;
    EXPECT_THROW(m_db.CheckExistTable(At(location, Dir()), nullptr, exists), std::logic_error);
    EXPECT_TRUE(exists);
    EXPECT_EQ(descriptors, OpenDescriptorCount());
}

// OpenDB hands back a null handle after a failed open (the open file
// otherwise, as every operation shows). Every operation opens through it: a failed open is the
// operation's code with OpenDB's line, and Select adds an info line.
TEST_F(DADatabaseTest, OpenDBHandsBackNullOnFailureAndEveryOperationItsCode)
{
    LogCapture log;
    sqlite3* handle = reinterpret_cast<sqlite3*>(&log);  // to see it replaced
    EXPECT_EQ(14, m_db.OpenDB(handle, PathOf("missing"), kFile));
    EXPECT_EQ(nullptr, handle);

    const std::string missing = PathOf("missing");
    DACursor cursor;
    Preload(cursor);
    DASelectRequest select;
    DAQueryRequest query;
    DAJoinRequest join;
    join.SetPath(missing.c_str(), kFile);
    bool exists = true;
    DAUpsertRequest upsert;
    EXPECT_EQ(14, m_db.Upsert(At(upsert, missing, "contacts")));  // every write opens in one frame
    EXPECT_EQ(14, m_db.Select(At(select, missing, "contacts"), cursor));
    EXPECT_EQ(14, m_db.Query(At(query, missing, "contacts"), cursor));
    EXPECT_EQ(14, m_db.QueryEach(query, [](DARow const&) { return true; }));
    EXPECT_EQ(14, m_db.JoinSelect(join, cursor));
    EXPECT_EQ(14, m_db.CheckExistTable(join, "contacts", exists));
    Strings expected(1 + 1 + 1, kOpenFailed);  // OpenDB's own, the write's, Select's
    expected.insert(expected.end(),
                    {Line(4, "Select", "OpenDB Error: 14"), kOpenFailed, Line(4, "Query", "OpenDB Error: 14"),
                     kOpenFailed, Line(4, "QueryEach", "OpenDB Error: 14"), kOpenFailed, kOpenFailed});
    EXPECT_EQ(expected, Described(log));
    EXPECT_EQ(Strings{"kept"}, ColumnValues(cursor, "mine"));
    EXPECT_TRUE(exists);
    EXPECT_FALSE(FileExists("missing"));
}

// Half the rows deleted: their pages are free, and Compact gives them back
// to the file system. Reads of a file that is
// not a database leave their outputs alone.
TEST_F(DADatabaseTest, CompactReturnsTheSpaceOfDeletedRows)
{
    Seed("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 "
         "FROM n WHERE i < 4000) INSERT INTO t SELECT i, printf('%0200d', i) FROM n; DELETE FROM t WHERE k > 2000;");
    DABasePath location;
    At(location, Dir());
    std::int64_t fileBytes = -1;
    std::int64_t freeBytes = -1;
    EXPECT_EQ(0, m_db.GetSpace(location, fileBytes, freeBytes));
    const auto size = static_cast<std::int64_t>(std::filesystem::file_size(PathOf(kFile)));
    EXPECT_EQ(size, fileBytes);
    EXPECT_GT(freeBytes, size * 2 / 5);
    LogCapture log;
    EXPECT_EQ(0, m_db.Compact(location));
    std::int64_t freeAfter = -1;
    EXPECT_EQ(0, m_db.GetSpace(location, fileBytes, freeAfter));
    EXPECT_EQ(0, freeAfter);
    EXPECT_LE(fileBytes, size - freeBytes);
    EXPECT_EQ(static_cast<std::int64_t>(std::filesystem::file_size(PathOf(kFile))), fileBytes);

    std::ofstream(PathOf("text.db")) << std::string(5000, 'x');
    location.SetPath(Dir().c_str(), "text.db");
    int version = -1;
    EXPECT_EQ(26, m_db.GetSpace(location, fileBytes, freeAfter));
    EXPECT_EQ(26, m_db.GetVersion(location, version));
    EXPECT_EQ(-1, version);
    EXPECT_EQ(0, freeAfter);
    EXPECT_EQ((Strings{Line(4, "Compact", "Compact SUCCESS[0]"),
                       Line(6, "GetSpace", "GetSpace FAILED[26]: file is not a database"),
                       Line(6, "GetVersion", "GetVersion FAILED[26]: file is not a database")}),
              Described(log));
}
