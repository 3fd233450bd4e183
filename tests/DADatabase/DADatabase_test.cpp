#include "DADatabase.h"

#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"
#include "LogCapture.h"
#include "TempDirTest.h"

namespace {

const char* const kFile = "t.db";
const char* const kContacts = "CREATE TABLE contacts(_ID INTEGER PRIMARY KEY, name TEXT, phone TEXT);"
                              "INSERT INTO contacts(name, phone) VALUES ('Kim', '010'), ('Lee', '011');";

std::string Line(int priority, const std::string& function, const std::string& message)
{
    return std::to_string(priority) + " DADatabase.cpp:" + function + " > " + message;
}

const std::string kOpenFailed = Line(6, "OpenDB", "DB open failed. Error no(14): unable to open database file");
const std::string kLimit = Line(6, "IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY");

// A cursor holding one row of its own, at row 0, to see that it stays so.
void Preload(DACursor& cursor)
{
    cursor.SetColumn("mine");
    cursor.SetData("mine", "kept");
    ASSERT_EQ(0, cursor.MoveToNext());
}

void ExpectPreloaded(DACursor& cursor)
{
    std::string value;
    EXPECT_EQ(0, cursor.GetPosition());
    EXPECT_EQ(0, cursor.GetString("mine", value));
    EXPECT_EQ("kept", value);
}

int UpsertContact(DADatabase& db, const std::string& dir, const char* name, const char* phone)
{
    DAUpsertRequest request;
    request.SetPath(dir.c_str(), kFile);
    request.SetTable("contacts");
    request.SetData("name", name);
    request.SetData("phone", phone);
    return db.Upsert(request);
}

// One write operation: how to make it succeed or fail, and what it leaves.
struct WriteCase {
    const char* name;
    const char* function;
    const char* word;
    const char* seed;  // before the call that succeeds
    const char* check;  // query on the file afterwards
    const char* checked;  // its rows
    const char* failSeed;  // before the call that fails
    const char* failureText;  // SQLite's text then
    std::function<int(DADatabase&, const std::string&)> run;
};

void PrintTo(const WriteCase& c, std::ostream* os)
{
    *os << c.name;
}

const WriteCase kWriteCases[] = {
    {"DropTable", "DropTable", "DropTable", kContacts, "SELECT count(*) FROM sqlite_master", "0", "",
     "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DADropRequest request;
         request.SetPath(dir.c_str(), kFile);
         request.SetTable("contacts");
         return db.DropTable(request);
     }},
    {"Update", "Update", "update", kContacts, "SELECT name, phone FROM contacts ORDER BY _ID", "Park|010;Lee|011", "",
     "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DAUpdateRequest request;
         request.SetPath(dir.c_str(), kFile);
         request.SetTable("contacts");
         request.SetData("name", "Park");
         request.SetWhere("phone", "010");
         return db.Update(request);
     }},
    {"Delete", "Delete", "delete", kContacts, "SELECT name, phone FROM contacts ORDER BY _ID", "Lee|011", "",
     "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DADeleteRequest request;
         request.SetPath(dir.c_str(), kFile);
         request.SetTable("contacts");
         request.SetWhere("phone", "010");
         return db.Delete(request);
     }},
    {"Upsert", "Upsert", "Upsert", kContacts, "SELECT _ID, name, phone FROM contacts ORDER BY _ID",
     "1|Cho|012;2|Lee|011", "", "no such table: contacts",
     [](DADatabase& db, const std::string& dir) {
         DAUpsertRequest request;  // replaces the row whose key exists
         request.SetPath(dir.c_str(), kFile);
         request.SetTable("contacts");
         request.SetData("_ID", 1);
         request.SetData("name", "Cho");
         request.SetData("phone", "012");
         return db.Upsert(request);
     }},
    {"CreateTable", "CreateTable", "createTable", "", "SELECT sql FROM sqlite_master",
     "CREATE TABLE groups (_ID INTEGER PRIMARY KEY, title TEXT)",
     "CREATE TABLE other(x); CREATE INDEX groups ON other(x);", "there is already an index named groups",
     [](DADatabase& db, const std::string& dir) {
         DACreateRequest request;
         request.SetPath(dir.c_str(), kFile);
         request.SetTable("groups");
         request.SetColumnKey("title", "TEXT");
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

TEST_P(DADatabaseWrite, SucceedsAndLogsItsSuccessLine)
{
    const WriteCase& c = GetParam();
    Seed(c.seed);
    const int descriptors = OpenDescriptorCount();
    LogCapture log;
    EXPECT_EQ(0, c.run(m_db, Dir()));
    EXPECT_EQ((std::vector<std::string>{Line(4, c.function, std::string(c.word) + " SUCCESS[0]")}), Described(log));
    EXPECT_EQ(descriptors, OpenDescriptorCount());
    EXPECT_EQ(c.checked, Query(c.check));
}

TEST_P(DADatabaseWrite, FailureLineCarriesSqliteText)
{
    const WriteCase& c = GetParam();
    Seed(c.failSeed);
    const int descriptors = OpenDescriptorCount();
    LogCapture log;
    EXPECT_EQ(1, c.run(m_db, Dir()));
    EXPECT_EQ((std::vector<std::string>{Line(6, c.function, std::string(c.word) + " FAILED[1]: " + c.failureText)}),
              Described(log));
    EXPECT_EQ(descriptors, OpenDescriptorCount());
    EXPECT_TRUE(FileExists(kFile));  // a missing file is created by the open
}

TEST_P(DADatabaseWrite, OpenFailsInAMissingDirectory)
{
    LogCapture log;
    EXPECT_EQ(14, GetParam().run(m_db, PathOf("missing")));
    EXPECT_EQ((std::vector<std::string>{kOpenFailed}), Described(log));
    EXPECT_FALSE(FileExists("missing"));
}

INSTANTIATE_TEST_SUITE_P(Operations, DADatabaseWrite, ::testing::ValuesIn(kWriteCases),
                         [](const ::testing::TestParamInfo<WriteCase>& info) { return info.param.name; });

// Another connection holds the file exclusively for the whole call: the
// statement is tried 17 times, with 15 pauses of 100 ms.
TEST_F(DADatabaseTest, WriteGivesUpWhileAnotherConnectionHoldsTheFile)
{
    Seed(kContacts);
    RawDb holder(PathOf(kFile));
    holder.Run("BEGIN EXCLUSIVE");
    LogCapture log;
    const auto start = std::chrono::steady_clock::now();
    const int rc = UpsertContact(m_db, Dir(), "Cho", "012");
    const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    holder.Run("COMMIT");

    EXPECT_EQ(5, rc);
    std::vector<std::string> expected = BusyWarnings("DADatabase.cpp", 15);
    expected.push_back(kLimit);
    expected.push_back(Line(6, "Upsert", "Upsert FAILED[5]: database is locked"));
    EXPECT_EQ(expected, Described(log));
    EXPECT_GE(seconds, 1.4);
    EXPECT_LT(seconds, 10.0);
    RecordProperty("give_up_seconds", std::to_string(seconds));
    std::printf("[ measured ] busy write gave up after %.3f s\n", seconds);
    EXPECT_EQ("Kim;Lee", Query("SELECT name FROM contacts ORDER BY _ID"));
}

TEST_F(DADatabaseTest, WriteSucceedsOnceTheOtherConnectionCommits)
{
    Seed(kContacts);
    RawDb holder(PathOf(kFile));
    holder.Run("BEGIN EXCLUSIVE");
    LogCapture log;
    std::thread release([&holder] {
        std::this_thread::sleep_for(std::chrono::milliseconds(250));
        holder.Run("COMMIT");
    });
    const int rc = UpsertContact(m_db, Dir(), "Cho", "012");
    release.join();

    EXPECT_EQ(0, rc);
    std::vector<std::string> lines = Described(log);
    ASSERT_GE(lines.size(), 2u);
    ASSERT_LE(lines.size(), 16u);
    EXPECT_EQ(Line(4, "Upsert", "Upsert SUCCESS[0]"), lines.back());
    lines.pop_back();
    EXPECT_EQ(BusyWarnings("DADatabase.cpp", static_cast<int>(lines.size())), lines);
    EXPECT_EQ("Kim|010;Lee|011;Cho|012", Query("SELECT name, phone FROM contacts ORDER BY _ID"));
}

// A new connection must read the schema to prepare, which the exclusive lock
// of the other connection keeps busy.
TEST_F(DADatabaseTest, SelectGivesUpWhileAnotherConnectionHoldsTheFile)
{
    Seed(kContacts);
    RawDb holder(PathOf(kFile));
    holder.Run("BEGIN EXCLUSIVE");
    DACursor cursor;
    Preload(cursor);
    DASelectRequest request;
    request.SetPath(Dir().c_str(), kFile);
    request.SetTable("contacts");
    LogCapture log;
    EXPECT_EQ(5, m_db.Select(request, cursor));
    holder.Run("COMMIT");

    std::vector<std::string> expected = BusyWarnings("DADatabase.cpp", 15);
    expected.push_back(kLimit);
    expected.push_back(Line(6, "Select", "SELECT FAILED[5]: database is locked"));
    EXPECT_EQ(expected, Described(log));
    ExpectPreloaded(cursor);
}

TEST_F(DADatabaseTest, SelectDeliversValuesAsSqliteText)
{
    Seed("CREATE TABLE v(i, r, n, b, t);"
         "INSERT INTO v VALUES (42, 2.5, NULL, x'0102', 'txt'), (7, 0.5, 1, 'b', 'other');");
    DASelectRequest request;
    request.SetPath(Dir().c_str(), kFile);
    request.SetTable("v");
    request.SetWhere("t", "txt");
    DACursor cursor;
    LogCapture log;
    EXPECT_EQ(0, m_db.Select(request, cursor));
    EXPECT_EQ((std::vector<std::string>{"6 DADatabasePasrser.cpp:ParseDatabase > UNKNOWN TYPE"}), Described(log));

    std::vector<std::string> names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((std::vector<std::string>{"i", "r", "n", "b", "t"}), names);
    EXPECT_EQ(1, cursor.GetCount());
    EXPECT_EQ(std::vector<std::string>{"42"}, ColumnValues(cursor, "i"));
    EXPECT_EQ(std::vector<std::string>{"2.5"}, ColumnValues(cursor, "r"));
    EXPECT_EQ(std::vector<std::string>{""}, ColumnValues(cursor, "n"));
    EXPECT_EQ(std::vector<std::string>{""}, ColumnValues(cursor, "b"));
    EXPECT_EQ(std::vector<std::string>{"txt"}, ColumnValues(cursor, "t"));
}

TEST_F(DADatabaseTest, SelectWithoutMatchingRowEmptiesTheCursor)
{
    Seed(kContacts);
    DASelectRequest request;
    request.SetPath(Dir().c_str(), kFile);
    request.SetTable("contacts");
    request.SetWhere("name", "Nobody");
    DACursor cursor;
    Preload(cursor);
    LogCapture log;
    EXPECT_EQ(0, m_db.Select(request, cursor));
    EXPECT_TRUE(log.Lines().empty());
    std::vector<std::string> names{"stale"};
    EXPECT_EQ(1, cursor.GetColumn(names));
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ(-1, cursor.GetPosition());
}

TEST_F(DADatabaseTest, SelectFailuresLeaveTheCursorAsItWas)
{
    Seed(kContacts);
    DACursor cursor;
    Preload(cursor);
    LogCapture log;

    DASelectRequest missingTable;
    missingTable.SetPath(Dir().c_str(), kFile);
    missingTable.SetTable("x");
    EXPECT_EQ(1, m_db.Select(missingTable, cursor));
    EXPECT_EQ((std::vector<std::string>{Line(6, "Select", "SELECT FAILED[1]: no such table: x")}), Described(log));
    ExpectPreloaded(cursor);

    log.Clear();
    DASelectRequest missingDirectory;
    missingDirectory.SetPath(PathOf("missing").c_str(), kFile);
    missingDirectory.SetTable("contacts");
    EXPECT_EQ(14, m_db.Select(missingDirectory, cursor));
    EXPECT_EQ((std::vector<std::string>{kOpenFailed, Line(4, "Select", "OpenDB Error: 14")}), Described(log));
    ExpectPreloaded(cursor);
    EXPECT_FALSE(FileExists("missing"));
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
    EXPECT_TRUE(log.Lines().empty());
    std::vector<std::string> names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((std::vector<std::string>{"_ID", "name", "group_id", "_ID", "title"}), names);
    EXPECT_EQ(3, cursor.GetCount());
    EXPECT_EQ((std::vector<std::string>{"Kim", "Lee", "Park"}), ColumnValues(cursor, "name"));
    EXPECT_EQ((std::vector<std::string>{"Family", "Work", "Family"}), ColumnValues(cursor, "title"));
    // _ID's one list takes both values of each row (1,1 2,2 3,1); rows read its head.
    EXPECT_EQ((std::vector<std::string>{"1", "1", "2"}), ColumnValues(cursor, "_ID"));

    log.Clear();
    DAJoinRequest missing;
    missing.SetPath(Dir().c_str(), kFile);
    missing.SetLeftJoin("people", "group_id");
    missing.SetRightJoin("groups", "_ID");
    EXPECT_EQ(1, m_db.JoinSelect(missing, cursor));
    missing.SetPath(PathOf("missing").c_str(), kFile);
    EXPECT_EQ(14, m_db.JoinSelect(missing, cursor));
    EXPECT_EQ(
        (std::vector<std::string>{Line(6, "JoinSelect", "JoinSelect FAILED[1]: no such table: people"), kOpenFailed}),
        Described(log));
    EXPECT_EQ(3, cursor.GetCount());
}

TEST_F(DADatabaseTest, CheckExistTableMatchesTablesByExactName)
{
    Seed("CREATE TABLE Contacts(x); CREATE VIEW v AS SELECT 1;");
    DABasePath location;
    location.SetPath(Dir().c_str(), kFile);
    const std::pair<const char*, bool> cases[] = {
        {"Contacts", true}, {"contacts", false}, {"missing", false}, {"v", false}};
    LogCapture log;
    for (const auto& c : cases) {
        bool exists = !c.second;
        EXPECT_EQ(0, m_db.CheckExistTable(location, c.first, exists)) << c.first;
        EXPECT_EQ(c.second, exists) << c.first;
    }
    EXPECT_TRUE(log.Lines().empty());

    DABasePath fresh;
    fresh.SetPath(Dir().c_str(), "new.db");
    bool exists = true;
    EXPECT_EQ(0, m_db.CheckExistTable(fresh, "Contacts", exists));
    EXPECT_FALSE(exists);
    EXPECT_TRUE(FileExists("new.db"));

    DABasePath nowhere;
    nowhere.SetPath(PathOf("missing").c_str(), kFile);
    exists = true;
    EXPECT_EQ(14, m_db.CheckExistTable(nowhere, "Contacts", exists));
    EXPECT_TRUE(exists);
    EXPECT_EQ((std::vector<std::string>{kOpenFailed}), Described(log));
}

TEST_F(DADatabaseTest, CheckExistTableWithNullNameThrowsAndClosesTheFile)
{
    Seed(kContacts);
    DABasePath location;
    location.SetPath(Dir().c_str(), kFile);
    const int descriptors = OpenDescriptorCount();
    bool exists = true;
    EXPECT_THROW(m_db.CheckExistTable(location, nullptr, exists), std::logic_error);
    EXPECT_EQ(descriptors, OpenDescriptorCount());
    EXPECT_TRUE(exists);
}

class DADatabaseCliTest : public DADatabaseTest {
protected:
    void SetUp() override
    {
        DADatabaseTest::SetUp();
        if (access(kCli, X_OK) != 0) {
            GTEST_SKIP() << kCli << " is not installed";
        }
    }

    // Runs sql through the sqlite3 program on the test's file; its output.
    std::string Cli(const std::string& sql)
    {
        std::ofstream(PathOf("cli.sql")) << sql;
        const std::string command =
            std::string(kCli) + " -batch -separator '|' '" + PathOf(kFile) + "' < '" + PathOf("cli.sql") + "' 2>&1";
        std::string out;
        if (FILE* pipe = popen(command.c_str(), "r")) {
            char buffer[256];
            while (std::fgets(buffer, sizeof buffer, pipe) != nullptr) {
                out += buffer;
            }
            EXPECT_EQ(0, pclose(pipe)) << out;
        }
        return out;
    }

    static constexpr const char* kCli = "/usr/bin/sqlite3";
};

TEST_F(DADatabaseCliTest, FileWrittenByTheLibraryReadsBackInSqlite3)
{
    DACreateRequest create;
    create.SetPath(Dir().c_str(), kFile);
    create.SetTable("people");
    create.SetColumnKey("name", "TEXT");
    create.SetColumnKey("age", "INTEGER");
    create.SetColumnKey("height", "REAL");
    ASSERT_EQ(0, m_db.CreateTable(create));
    const struct {
        const char* name;
        int age;
        double height;
    } people[] = {{"Kim", 30, 1.75}, {"Lee", -4, 2.0}};
    for (const auto& person : people) {
        DAUpsertRequest row;
        row.SetPath(Dir().c_str(), kFile);
        row.SetTable("people");
        row.SetData("name", person.name);
        row.SetData("age", person.age);
        row.SetData("height", person.height);
        ASSERT_EQ(0, m_db.Upsert(row));
    }
    EXPECT_EQ("1|Kim|30|integer|1.75\n2|Lee|-4|integer|2.0\n",
              Cli("SELECT _ID, name, age, typeof(age), height FROM people ORDER BY _ID;"));
}

TEST_F(DADatabaseCliTest, FileWrittenBySqlite3ReadsBackInSelect)
{
    Cli("CREATE TABLE notes(id INTEGER PRIMARY KEY, body TEXT, score REAL);"
        "INSERT INTO notes VALUES (1, 'hello', 2.5), (2, 'world', NULL);");
    DASelectRequest request;
    request.SetPath(Dir().c_str(), kFile);
    request.SetTable("notes");
    DACursor cursor;
    ASSERT_EQ(0, m_db.Select(request, cursor));
    EXPECT_EQ(2, cursor.GetCount());
    EXPECT_EQ((std::vector<std::string>{"1", "2"}), ColumnValues(cursor, "id"));
    EXPECT_EQ((std::vector<std::string>{"hello", "world"}), ColumnValues(cursor, "body"));
    EXPECT_EQ((std::vector<std::string>{"2.5", ""}), ColumnValues(cursor, "score"));
    ASSERT_EQ(0, cursor.MoveToPosition(0));
    double score = 0;
    EXPECT_EQ(0, cursor.GetDouble("score", score));
    EXPECT_EQ(2.5, score);
}
