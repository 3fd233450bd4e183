#include "DADatabase.h"

#include <chrono>
#include <functional>
#include <iterator>
#include <stdexcept>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

const char* const kFile = "t.db";
const char* const kContacts = "CREATE TABLE contacts(_ID INTEGER PRIMARY KEY, name TEXT, phone TEXT);"
                              "INSERT INTO contacts(name, phone) VALUES ('Kim', '010'), ('Lee', '011');";

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

// One write operation: it succeeds on seed, leaving checked as the rows of
// check; after breaking it fails with SQLite's failureText.
struct WriteCase {
    const char* function;
    const char* word;  // of its log lines
    const char* seed;
    const char* check;
    const char* checked;
    const char* breaking;
    const char* failureText;
    std::function<int(DADatabase&, const std::string&)> run;
};

const char* const kNoContacts = "DROP TABLE IF EXISTS contacts";
const WriteCase kWriteCases[] = {
    {"DropTable", "DropTable", kContacts, "SELECT count(*) FROM sqlite_master", "0", "", "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DADropRequest request;
         return db.DropTable(At(request, dir, "contacts"));
     }},
    {"Update", "update", kContacts, "SELECT name, phone FROM contacts ORDER BY _ID", "Park|010;Lee|011", kNoContacts,
     "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DAUpdateRequest request;
         At(request, dir, "contacts").SetData("name", "Park");
         request.SetWhere("phone", "010");
         return db.Update(request);
     }},
    {"Delete", "delete", kContacts, "SELECT name, phone FROM contacts ORDER BY _ID", "Lee|011", kNoContacts,
     "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DADeleteRequest request;
         At(request, dir, "contacts").SetWhere("phone", "010");
         return db.Delete(request);
     }},
    {"Upsert", "Upsert", kContacts, "SELECT _ID, name, phone FROM contacts ORDER BY _ID", "1|Cho|012;2|Lee|011",
     kNoContacts, "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DAUpsertRequest request;  // replaces the row whose key exists
         At(request, dir, "contacts").SetData("_ID", 1);
         request.SetData("name", "Cho");
         request.SetData("phone", "012");
         return db.Upsert(request);
     }},
    {"CreateTable", "createTable", "", "SELECT sql FROM sqlite_master",
     "CREATE TABLE groups (_ID INTEGER PRIMARY KEY, title TEXT)",
     "DROP TABLE groups; CREATE TABLE other(x); CREATE INDEX groups ON other(x);",
     "there is already an index named groups",
     [](DADatabase& db, const std::string& dir) {
         DACreateRequest request;
         At(request, dir, "groups").SetColumnKey("title", "TEXT");
         return db.CreateTable(request);
     }},
};

class DADatabaseTest : public TempDirTest {
protected:
    void Seed(const std::string& sql)
    {
        if (!sql.empty()) {
            RawDb(PathOf(kFile)).Run(sql);
        }
    }
    std::string Query(const std::string& sql) { return RawDb(PathOf(kFile)).Query(sql); }

    DADatabase m_db;
};

class DADatabaseWrite : public DADatabaseTest, public ::testing::WithParamInterface<WriteCase> {};

}  // namespace

// The success line, or the failure line with SQLite's text; the file is
// created when missing and closed again either way.
TEST_P(DADatabaseWrite, SucceedsOrFailsWithOneLine)
{
    const WriteCase& c = GetParam();
    Seed(c.seed);
    const int descriptors = OpenDescriptorCount();
    LogCapture log;
    EXPECT_EQ(0, c.run(m_db, Dir()));
    EXPECT_EQ(c.checked, Query(c.check));
    Seed(c.breaking);
    EXPECT_EQ(1, c.run(m_db, Dir()));
    EXPECT_EQ((Strings{Line(4, c.function, std::string(c.word) + " SUCCESS[0]"),
                       Line(6, c.function, std::string(c.word) + " FAILED[1]: " + c.failureText)}),
              Described(log));
    EXPECT_EQ(descriptors, OpenDescriptorCount());
}

INSTANTIATE_TEST_SUITE_P(Operations, DADatabaseWrite, ::testing::ValuesIn(kWriteCases),
                         [](const ::testing::TestParamInfo<WriteCase>& info) { return info.param.function; });

// Another connection holds the file exclusively for the whole call: the
// statement is tried 17 times, with 15 pauses of 100 ms. A Select is busy
// the same way, as its new connection must read the schema to prepare.
TEST_F(DADatabaseTest, BusyWriteAndSelectGiveUpOrSucceedOnceTheOtherConnectionCommits)
{
    Seed(kContacts);
    RawDb holder(PathOf(kFile));
    holder.Run("BEGIN EXCLUSIVE");
    LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(5, kWriteCases[3].run(m_db, Dir()));
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    Strings expected = BusyWarnings("DADatabase.cpp", 15);
    expected.push_back(Line(6, "IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY"));
    expected.push_back(Line(6, "Upsert", "Upsert FAILED[5]: database is locked"));
    EXPECT_EQ(expected, Described(log));
    EXPECT_GE(seconds, 1.4);
    EXPECT_LT(seconds, 10.0);

    log.Clear();
    DACursor cursor;
    Preload(cursor);
    DASelectRequest request;
    EXPECT_EQ(5, m_db.Select(At(request, Dir(), "contacts"), cursor));
    expected.back() = Line(6, "Select", "SELECT FAILED[5]: database is locked");
    EXPECT_EQ(expected, Described(log));
    EXPECT_EQ(Strings{"kept"}, ColumnValues(cursor, "mine"));

    // Once the other connection commits, the retried write goes through.
    log.Clear();
    std::thread release([&holder] {
        std::this_thread::sleep_for(std::chrono::milliseconds(250));
        holder.Run("COMMIT");
    });
    EXPECT_EQ(0, kWriteCases[3].run(m_db, Dir()));
    release.join();
    Strings lines = Described(log);
    ASSERT_GE(lines.size(), 2U);
    ASSERT_LE(lines.size(), 16U);
    EXPECT_EQ(Line(4, "Upsert", "Upsert SUCCESS[0]"), lines.back());
    lines.pop_back();
    EXPECT_EQ(BusyWarnings("DADatabase.cpp", static_cast<int>(lines.size())), lines);
    EXPECT_EQ("Cho|012;Lee|011", Query("SELECT name, phone FROM contacts ORDER BY _ID"));
}

// Matching rows replace the cursor's content, no row empties it, and a
// failure leaves it as it was.
TEST_F(DADatabaseTest, SelectReadsMatchingRowsIntoTheCursor)
{
    Seed(kContacts);
    DASelectRequest request;
    At(request, Dir(), "contacts").SetWhere("phone", "011");
    DACursor cursor;
    Preload(cursor);
    LogCapture log;
    EXPECT_EQ(0, m_db.Select(request, cursor));
    Strings names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((Strings{"_ID", "name", "phone"}), names);
    EXPECT_EQ(Strings{"Lee"}, ColumnValues(cursor, "name"));

    log.Clear();
    DASelectRequest none;
    At(none, Dir(), "contacts").SetWhere("name", "Nobody");
    EXPECT_EQ(0, m_db.Select(none, cursor));
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ(-1, cursor.GetPosition());
    Preload(cursor);
    EXPECT_EQ(1, m_db.Select(At(none, Dir(), "x"), cursor));
    EXPECT_EQ(Strings{"kept"}, ColumnValues(cursor, "mine"));
    EXPECT_EQ((Strings{Line(6, "Select", "SELECT FAILED[1]: no such table: x"),
                       Logged(4, "DACursor.cpp", "MoveToNext", "Last Row")}),
              Described(log));
}

// Both tables carry the _ID column of tables made without a key, so the join
// yields _ID twice; it sorts first among the names, and the count stays the
// number of rows.
TEST_F(DADatabaseTest, JoinSelectRegistersTheSharedColumnTwice)
{
    Seed("CREATE TABLE groups (_ID INTEGER PRIMARY KEY, title TEXT);"
         "CREATE TABLE contacts (_ID INTEGER PRIMARY KEY, name TEXT, group_id INTEGER);"
         "INSERT INTO groups(title) VALUES ('Family'), ('Work');"
         "INSERT INTO contacts(name, group_id) VALUES ('Kim', 1), ('Lee', 2), ('Park', 1);");
    DAJoinRequest join;
    join.SetPath(Dir().c_str(), kFile);
    join.SetLeftJoin("contacts", "group_id");
    join.SetRightJoin("groups", "_ID");
    DACursor cursor;
    LogCapture log;
    EXPECT_EQ(0, m_db.JoinSelect(join, cursor));
    Strings names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((Strings{"_ID", "name", "group_id", "_ID", "title"}), names);
    EXPECT_EQ(3, cursor.GetCount());
    // _ID's one list takes both values of each row (1,1 2,2 3,1); rows read its head.
    EXPECT_EQ((Strings{"1", "1", "2"}), ColumnValues(cursor, "_ID"));
    join.SetLeftJoin("people", "group_id");
    EXPECT_EQ(1, m_db.JoinSelect(join, cursor));
    EXPECT_EQ(3, cursor.GetCount());
    EXPECT_EQ((Strings{Logged(4, "DACursor.cpp", "MoveToNext", "Last Row"),
                       Line(6, "JoinSelect", "JoinSelect FAILED[1]: no such table: people")}),
              Described(log));
}

// A null name throws, and the file is closed on the way out.
TEST_F(DADatabaseTest, CheckExistTableMatchesTablesByExactName)
{
    Seed("CREATE TABLE Contacts(x); CREATE VIEW v AS SELECT 1;");
    DABasePath location;
    location.SetPath(Dir().c_str(), kFile);
    const std::pair<const char*, bool> cases[] = {{"Contacts", true}, {"contacts", false}, {"v", false}};
    const int descriptors = OpenDescriptorCount();
    LogCapture log;
    for (const auto& c : cases) {
        bool exists = !c.second;
        EXPECT_EQ(0, m_db.CheckExistTable(location, c.first, exists)) << c.first;
        EXPECT_EQ(c.second, exists) << c.first;
    }
    bool exists = true;
    EXPECT_THROW(m_db.CheckExistTable(location, nullptr, exists), std::logic_error);
    EXPECT_TRUE(exists);
    EXPECT_EQ(descriptors, OpenDescriptorCount());
    EXPECT_TRUE(log.Lines().empty());
}

// OpenDB hands back a null handle after a failed open and the open file
// otherwise. Every operation opens through it: a failed open is the
// operation's code with OpenDB's line, and Select adds an info line.
TEST_F(DADatabaseTest, OpenDBHandsBackNullOnFailureAndEveryOperationItsCode)
{
    LogCapture log;
    sqlite3* handle = reinterpret_cast<sqlite3*>(&log);  // to see it replaced
    EXPECT_EQ(14, m_db.OpenDB(handle, PathOf("missing"), kFile));
    EXPECT_EQ(nullptr, handle);
    ASSERT_EQ(0, m_db.OpenDB(handle, Dir(), kFile));
    ASSERT_NE(nullptr, handle);
    EXPECT_EQ(SQLITE_OK, sqlite3_exec(handle, "CREATE TABLE opened(x)", nullptr, nullptr, nullptr));
    sqlite3_close(handle);
    EXPECT_EQ("opened", Query("SELECT name FROM sqlite_master"));

    const std::string missing = PathOf("missing");
    DACursor cursor;
    Preload(cursor);
    DASelectRequest select;
    DAQueryRequest query;
    DAJoinRequest join;
    join.SetPath(missing.c_str(), kFile);
    bool exists = true;
    for (const WriteCase& write : kWriteCases) {
        EXPECT_EQ(14, write.run(m_db, missing)) << write.function;
    }
    EXPECT_EQ(14, m_db.Select(At(select, missing, "contacts"), cursor));
    EXPECT_EQ(14, m_db.Query(At(query, missing, "contacts"), cursor));
    EXPECT_EQ(14, m_db.JoinSelect(join, cursor));
    EXPECT_EQ(14, m_db.CheckExistTable(join, "contacts", exists));
    Strings expected(1 + std::size(kWriteCases) + 1, kOpenFailed);  // OpenDB's own, each write's, Select's
    expected.insert(expected.end(),
                    {Line(4, "Select", "OpenDB Error: 14"), kOpenFailed, Line(4, "Query", "OpenDB Error: 14"),
                     kOpenFailed, kOpenFailed});
    EXPECT_EQ(expected, Described(log));
    EXPECT_EQ(Strings{"kept"}, ColumnValues(cursor, "mine"));
    EXPECT_TRUE(exists);
    EXPECT_FALSE(FileExists("missing"));
}
