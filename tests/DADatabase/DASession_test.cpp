#include "DASession.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <tuple>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DAWatch.h"
#include "DatabaseTestUtil.h"
#include "FaultFs.h"
#include "Operations.h"
#include "TempDirTest.h"

namespace {

// Files on tmpfs where there is one: some cases commit many times.
[[maybe_unused]] const bool g_onTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

// Reads after their table is dropped, by the source itself and then by
// another connection: a session-only row, as its second change is not the
// source's.
const Operation kDroppedUnderneath = {
    "reads_after_their_table_is_dropped", [](Target& t, const std::string& dir, DACursor& cursor) {
        DASelectRequest select;
        DAQueryRequest query;
        DADropRequest drop;
        Make(select, dir, "contacts");
        At(query, dir, "groups");
        int rc = RUN(t, Select, select, cursor) + RUN(t, Query, query, cursor);
        rc = rc * 10 + RUN(t, DropTable, At(drop, dir, "contacts"));
        RawDb(dir + "/t.db").Run("DROP TABLE groups");
        rc = rc * 10 + RUN(t, Select, select, cursor);
        return rc * 10 + RUN(t, Query, query, cursor) + RUN(t, Select, select, cursor);
    }};

// A text the session cannot keep by shape (a '$' in the table name) is
// prepared as written on a reader that keeps the schema it read: after the
// session's own schema changes, to any table (an index, a column), it reads
// the new one at once.
const Operation kReadAsWritten = {
    "read_as_written_after_schema_changes", [](Target& t, const std::string& dir, DACursor& cursor) {
        DACreateRequest create;
        At(create, dir, "price$list").SetColumnKey("a", "TEXT");
        DAUpsertRequest row;
        At(row, dir, "price$list").SetData("a", "x");
        DASelectRequest select;
        At(select, dir, "price$list");
        DACreateIndexRequest index;
        At(index, dir, "contacts").SetName("by_phone");
        index.AddColumn("phone");
        DAAddColumnRequest column;
        At(column, dir, "contacts").SetColumn("email", "TEXT");
        int rc = RUN(t, CreateTable, create) + RUN(t, Upsert, row) + RUN(t, Select, select, cursor);
        rc = rc * 10 + RUN(t, CreateIndex, index) + RUN(t, Select, select, cursor);
        return rc * 10 + RUN(t, AddColumn, column) + RUN(t, Select, select, cursor);
    }};

std::vector<Operation> Rows()
{
    std::vector<Operation> rows(std::begin(kOperations), std::end(kOperations));
    rows.push_back(kDroppedUnderneath);
    rows.push_back(kReadAsWritten);
    return rows;
}

std::string Line(int priority, const char* function, const std::string& message)
{
    return Logged(priority, "DASession.cpp", function, message);
}

class SessionTest : public TempDirTest {
protected:
    // A fresh directory under Dir() with the seeded t.db.
    std::string Seeded(const std::string& name) { return ::Seeded(PathOf(name)); }

    int OpenAt(DASession& session, const std::string& dir)
    {
        DABasePath location;
        return session.Open(At(location, dir));
    }
};

// A row, and whether the session runs without the log (the rollback
// journal, every operation on its one connection).
class SessionOperation : public SessionTest, public ::testing::WithParamInterface<std::tuple<Operation, bool>> {};

}  // namespace

// The same rows, codes and lines as a per-call DADatabase gives, its file
// name aside, and the same file, read while the session holds it and after
// Close, which leaves no log beside it and the journal mode it set.
TEST_P(SessionOperation, MatchesDatabase)
{
    const std::string perCall = Seeded("per_call");
    const std::string held = Seeded("held");
    const Operation& row = std::get<0>(GetParam());
    DADatabase db;
    DASession session;
    session.SetWal(!std::get<1>(GetParam()));
    ASSERT_EQ(0, OpenAt(session, held));
    Target viaDb{&db, nullptr};
    Target viaSession{nullptr, &session};
    DACursor expectedRows;
    DACursor rows;
    LogCapture log;
    const int expected = row.run(viaDb, perCall, expectedRows);
    Strings expectedLines = Described(log);
    if (row.expected != nullptr) {
        EXPECT_EQ(row.expected, Summary(expected, expectedRows, perCall, expectedLines));
    }
    for (std::string& line : expectedLines) {
        line = Replaced(Replaced(line, "DADatabase.cpp", "DASession.cpp"), perCall, held);
    }
    log.Clear();
    EXPECT_EQ(expected, row.run(viaSession, held, rows));
    EXPECT_EQ(expectedLines, Described(log));
    EXPECT_EQ(Dump(expectedRows), Dump(rows));
    EXPECT_EQ(Content(perCall), Content(held));  // read while the session holds the file
    session.Close();
    session.Close();  // again: nothing
    EXPECT_EQ(Content(perCall), Content(held));
    EXPECT_FALSE(FileExists("held/t.db-wal"));  // one file left
    EXPECT_EQ(std::get<1>(GetParam()) ? "delete" : "wal", RawDb(held + "/t.db").Query("PRAGMA journal_mode"));
}

INSTANTIATE_TEST_SUITE_P(Every, SessionOperation, ::testing::Combine(::testing::ValuesIn(Rows()), ::testing::Bool()),
                         [](const auto& info) {
                             return std::string(std::get<0>(info.param).name) +
                                 (std::get<1>(info.param) ? "_without_log" : "");
                         });

// Refusals: a closed session, a missing directory, a file that is not a
// database, a request for another file (a batch's location is checked the
// same way); each with one line, nothing created.
TEST_F(SessionTest, RefusesWithOneLine)
{
    const std::string dir = Seeded("db");
    DASession session;
    DAUpsertRequest upsert;
    DACursor cursor;
    LogCapture log;
    EXPECT_EQ(21, session.Upsert(At(upsert, dir, "contacts")));
    EXPECT_EQ(14, OpenAt(session, PathOf("missing")));
    EXPECT_FALSE(FileExists("missing"));
    session.SetCreate(false);  // a file that does not exist is not made
    EXPECT_EQ(14, OpenAt(session, Dir()));
    EXPECT_FALSE(FileExists("t.db"));
    session.SetCreate(true);
    EXPECT_FALSE(session.IsOpen());
    std::ofstream(PathOf("text.db")) << std::string(5000, 'x');
    DABasePath text;
    text.SetPath(Dir().c_str(), "text.db");
    EXPECT_EQ(26, session.Open(text));
    ASSERT_EQ(0, OpenAt(session, dir));
    EXPECT_TRUE(session.IsOpen());
    DASelectRequest other;
    EXPECT_EQ(21, session.Select(At(other, Dir(), "contacts"), cursor));
    EXPECT_EQ(
        (Strings{Line(6, "Upsert", "SESSION NOT OPEN"),
                 Line(6, "Open", "DB open failed. Error no(14): unable to open database file"),
                 Line(6, "Open", "DB open failed. Error no(14): unable to open database file"),
                 Line(6, "Open", "DB open failed. Error no(26): file is not a database"),
                 Line(6, "Select",
                      "Select FAILED[21]: request location " + Dir() + "/t.db is not the session's " + dir + "/t.db"),
                 Line(4, "Select", "OpenDB Error: 21")}),
        Described(log));
    EXPECT_EQ(std::string(5000, 'x'), FileBytes(PathOf("text.db")));
}

// Connections are kept: one writer and one reader are opened however many
// operations run. A read is one read
// transaction on the reader (it takes no more shared-memory locks than a
// plain connection's read): after a write that changes no schema it
// reloads none.
TEST_F(SessionTest, KeepsItsConnectionsAndReadsInOneTransaction)
{
    const std::string dir = Seeded("db");
    const faultfs::Installed fs;
    DASession session;
    ASSERT_EQ(0, OpenAt(session, dir));
    RawDb raw(dir + "/t.db");
    raw.Run("CREATE TABLE price$list(a)");
    const LogCapture quiet;
    DAUpsertRequest upsert;  // prepared anew each time (a '$' in the name): its authorizer runs
    At(upsert, dir, "price$list").SetData("a", "x");
    DASelectRequest select;
    At(select, dir, "groups").SetWhere("_ID", 1);
    DACursor cursor;
    ASSERT_EQ(0, session.Upsert(upsert) + session.Select(select, cursor));
    raw.Query("SELECT * FROM groups WHERE _ID='1'");
    for (int i = 0; i < 200; ++i) {
        ASSERT_EQ(0, session.Upsert(upsert));
        int locks = faultfs::g_state.shmLocks;
        raw.Query("SELECT * FROM groups WHERE _ID='1'");
        const int plain = faultfs::g_state.shmLocks - locks;
        ASSERT_EQ(0, session.Upsert(upsert));
        locks = faultfs::g_state.shmLocks;
        ASSERT_EQ(0, session.Select(select, cursor));
        ASSERT_LE(faultfs::g_state.shmLocks - locks, plain) << i;
    }
    EXPECT_EQ(3, faultfs::g_state.opened);  // the writer, one reader, raw
}

// Another connection's write lock: the session's write goes on within 25 ms
// of its release with one warning; held past 1.5 s, the write gives up with
// 5 and the limit line.
TEST_F(SessionTest, WaitsForAnotherConnectionInShortSteps)
{
    const std::string dir = Seeded("db");
    DASession session;
    ASSERT_EQ(0, OpenAt(session, dir));
    RawDb holder(dir + "/t.db");
    DAUpsertRequest upsert;
    At(upsert, dir, "groups").SetData("title", "Club");
    // Held 230 ms: a session stepping 100 ms at a time would write 70 ms
    // after the release; short steps write within a few (the bound leaves
    // room for an emulated or loaded machine).
    for (const int holdMs : {230, 1700}) {
        holder.Run("BEGIN EXCLUSIVE");
        std::chrono::steady_clock::time_point released;
        std::thread release([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(holdMs));
            holder.Run("COMMIT");
            released = std::chrono::steady_clock::now();
        });
        LogCapture log;
        const int rc = session.Upsert(upsert);
        const auto done = std::chrono::steady_clock::now();
        release.join();
        const bool inTime = holdMs < 1000;
        EXPECT_EQ(inTime ? 0 : 5, rc);
        EXPECT_TRUE(!inTime || done - released < std::chrono::milliseconds(50));
        EXPECT_EQ((inTime ? Strings{Line(5, "IsRetryLimit", "SQLITE BUSY[1]"), Line(4, "Upsert", "Upsert SUCCESS[0]")}
                          : Strings{Line(5, "IsRetryLimit", "SQLITE BUSY[1]"),
                                    Line(6, "IsRetryLimit", "RETRY COUNT is reached LIMIT, SQLITE_BUSY"),
                                    Line(6, "Upsert", "Upsert FAILED[5]: database is locked")}),
                  Described(log));
    }
}

// The size budget (64 pages): the log is checkpointed from 16 frames (an
// eighth, at least 16) and truncated once it holds 32 (twice that), which a
// reader of an old snapshot puts off. Writes until the budget is full fail
// with 13, a delete goes through and makes room again; file and log stay
// within the budget and the stated margin.
TEST_F(SessionTest, SizeLimitTruncatesTheLogAtTwiceItsCheckpointSizeAndRefusesGrowthButNotDeletes)
{
    constexpr std::int64_t kLimit = 64 * 4096;
    const std::string dir = Seeded("db");
    DASession session;
    session.SetSizeLimit(kLimit);
    ASSERT_EQ(0, OpenAt(session, dir));
    RawDb reader(dir + "/t.db");
    LogCapture log;
    for (int i = 1; i <= 32; ++i) {  // each commit one page: one frame
        DAUpdateRequest update;
        At(update, dir, "groups").SetWhere("_ID", 1);
        update.SetData("title", i);
        ASSERT_EQ(0, session.Update(update));
        reader.Run(i == 1 ? "BEGIN; SELECT count(*) FROM groups;" : i == 31 ? "COMMIT" : "");
        EXPECT_EQ(i < 32 ? 32 + i * (4096 + 24) : 0, std::filesystem::file_size(dir + "/t.db-wal")) << i;
    }
    const std::string value(3000, 'v');
    int rc = 0;
    int rows = 0;
    while (rc == 0 && rows < 1000) {
        DAUpsertRequest upsert;
        At(upsert, dir, "groups").SetData("title", value.c_str());
        rc = session.Upsert(upsert);
        rows += rc == 0 ? 1 : 0;
        ASSERT_LE(std::filesystem::file_size(dir + "/t.db"), kLimit);
        ASSERT_LE(std::filesystem::file_size(dir + "/t.db-wal"), kLimit / 4 + 8 * (4096 + 24));
    }
    EXPECT_EQ(13, rc);
    EXPECT_GT(rows, 30);
    EXPECT_EQ(Line(6, "Upsert", "Upsert FAILED[13]: database or disk is full"), Described(log).back());
    DADeleteRequest remove;
    At(remove, dir, "groups").SetWhere("_ID", 10);
    EXPECT_EQ(0, session.Delete(remove));
    DAUpsertRequest again;
    At(again, dir, "groups").SetData("title", value.c_str());
    EXPECT_EQ(0, session.Upsert(again));
    session.Close();
    EXPECT_EQ("ok|" + std::to_string(rows + 2),
              RawDb(dir + "/t.db").Query("SELECT * FROM pragma_integrity_check, (SELECT count(*) FROM groups)"));
}
