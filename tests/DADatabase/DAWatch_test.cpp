#include "DAWatch.h"

#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

const char* const kSeed = "CREATE TABLE contacts(_ID INTEGER PRIMARY KEY, name TEXT);"
                          "CREATE TABLE groups(_ID INTEGER PRIMARY KEY, title TEXT);"
                          "INSERT INTO contacts(name) VALUES ('Kim');";

// Runs write in a child process; its exit code.
int InChild(const std::function<int()>& write)
{
    return ExitOf(Spawn(write));
}

int Threads()
{
    return static_cast<int>(std::distance(std::filesystem::directory_iterator("/proc/self/task"), {}));
}

// A write of step 0 (insert), 1 (update) or 2 (delete) to table at dir,
// one way of writing.
using Writer = std::function<int(const std::string& dir, const char* table, int step)>;

// The rows of step 0 (insert), 1 (update) and 2 (delete).
struct Requests {
    Requests(const std::string& dir, const char* table)
    {
        At(insert, dir, table).SetData("_ID", 7);
        At(update, dir, table).SetWhere("_ID", 7);
        update.SetData("_ID", 8);
        At(remove, dir, table).SetWhere("_ID", 8);
    }
    template <typename Target>
    int Run(Target& target, int step)
    {
        return step == 0 ? target.Upsert(insert) : step == 1 ? target.Update(update) : target.Delete(remove);
    }
    DAUpsertRequest insert;
    DAUpdateRequest update;
    DADeleteRequest remove;
};

int PerCall(const std::string& dir, const char* table, int step)
{
    DADatabase db;
    return Requests(dir, table).Run(db, step);
}

const Writer kWriters[] = {
    PerCall,
    [](const std::string& dir, const char* table, int step) {
        DABatchRequest batch;
        DADeleteRequest nothing;  // changes nothing
        At(nothing, dir, table).SetWhere("_ID", 99);
        At(batch, dir).Add(nothing);
        Requests r(dir, table);
        step == 0 ? batch.Add(r.insert) : step == 1 ? batch.Add(r.update) : batch.Add(r.remove);
        return DADatabase().ExecuteBatch(batch);
    },
    [](const std::string& dir, const char* table, int step) {  // another program
        const std::string sql[] = {"INSERT INTO @(_ID) VALUES(NULL)", "UPDATE @ SET _ID = _ID", "DELETE FROM @"};
        return WEXITSTATUS(
            std::system(("sqlite3 " + dir + "/t.db \"" + Replaced(sql[step], "@", table) + "\"").c_str()));
    },
    [](const std::string& dir, const char* table, int step) {  // leaves the file in WAL mode
        DASession session;
        DABasePath location;
        const int rc = session.Open(At(location, dir));
        return rc != 0 ? rc : Requests(dir, table).Run(session, step);
    },
    PerCall,  // now in WAL mode
};

class WatchTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        RawDb(PathOf("t.db")).Run(kSeed);
    }
    int OpenWatch(DAWatch& watch) { return watch.Open(At(m_location, Dir())); }
    DABasePath m_location;
};

}  // namespace

// Every insert, update and delete of a watched table, made in another
// process by each way of writing, wakes Wait and is reported once; writes
// to a table not watched are not. No thread is started.
TEST_F(WatchTest, SeesEveryWriteOfAnotherProcessAndNothingElse)
{
    const int threads = Threads();
    DAWatch watch;
    const LogCapture quiet;
    ASSERT_EQ(0, OpenWatch(watch));
    ASSERT_EQ(0, watch.AddTable("contacts"));
    Strings changed{"stale"};
    for (std::size_t way = 0; way < std::size(kWriters); ++way) {
        for (int step = 0; step < 3; ++step) {
            ASSERT_EQ(0, InChild([&] { return kWriters[way](Dir(), "groups", step); })) << way;
            ASSERT_EQ(0, InChild([&] { return kWriters[way](Dir(), "contacts", step); })) << way;
            EXPECT_EQ(0, watch.Wait(5000, changed));
            EXPECT_EQ(Strings{"contacts"}, changed) << way << " " << step;
            EXPECT_EQ(0, watch.Check(changed) + watch.Wait(0, changed));
            EXPECT_EQ(Strings{}, changed) << way << " " << step;
        }
    }
    EXPECT_EQ(threads, Threads());
}

// A burst written while nobody waits is reported once by the next Check,
// and to a second watch too; triggers of an earlier release (counting every
// row) are replaced; a dropped and created table stays watched; Unwatch (by
// a session and per call) leaves the schema as before and ends the watch's
// interest.
TEST_F(WatchTest, BurstDropAndUnwatch)
{
    RawDb raw(PathOf("t.db"));
    const std::string schema = raw.Query("SELECT * FROM sqlite_master ORDER BY name");
    raw.Run(
        "CREATE TABLE \"ulo_db-watch\"(name TEXT PRIMARY KEY COLLATE NOCASE, changes INTEGER NOT NULL) WITHOUT "
        "ROWID; INSERT INTO \"ulo_db-watch\" VALUES('groups', 3); CREATE TRIGGER \"ulo_db-watch/groups/insert\" "
        "AFTER INSERT ON groups BEGIN UPDATE \"ulo_db-watch\" SET changes = changes + 1 WHERE name = 'groups'; END");
    DAWatch watch;
    DAWatch other;
    const LogCapture quiet;
    ASSERT_EQ(0, OpenWatch(watch) + watch.AddTable("contacts") + watch.AddTable("groups"));
    EXPECT_EQ("ulo_db-watch/contacts/delete;ulo_db-watch/contacts/insert;ulo_db-watch/contacts/update",
              raw.Query("SELECT name FROM sqlite_master WHERE type = 'trigger' AND tbl_name = 'contacts' ORDER BY 1"));
    EXPECT_EQ("6", raw.Query("SELECT count(*) FROM sqlite_master WHERE sql LIKE '%AND changes = seen; END'"));
    DASession session;
    session.SetSyncOnCommit(false);
    ASSERT_EQ(0, session.Open(m_location));
    ASSERT_EQ(0, OpenWatch(other) + other.AddTable("contacts"));  // with the session's log there
    for (int i = 0; i < 10000; ++i) {
        DAUpsertRequest row;
        At(row, Dir(), "contacts").SetData("name", i);
        ASSERT_EQ(0, session.Upsert(row));
    }
    Strings changed;
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{}, changed);
    EXPECT_EQ(0, other.Check(changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    DAUpsertRequest row;  // into the log the session keeps: made after one watch's Open, before the other's
    At(row, Dir(), "contacts").SetData("name", "Ann");
    ASSERT_EQ(0, session.Upsert(row));
    pollfd woken[] = {{watch.GetFd(), POLLIN, 0}, {other.GetFd(), POLLIN, 0}};
    EXPECT_EQ(2, poll(woken, 2, 5000));
    raw.Run("INSERT INTO contacts(name) VALUES('Lee')");
    EXPECT_EQ(0, other.Check(changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    raw.Run("DROP TABLE groups; CREATE TABLE groups(_ID INTEGER PRIMARY KEY, title TEXT)");
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{"groups"}, changed);
    raw.Run("INSERT INTO groups(title) VALUES('Gym')");
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{"groups"}, changed);
    EXPECT_EQ(0, session.Unwatch("contacts") + DADatabase().Unwatch(m_location, "groups"));
    EXPECT_EQ(schema, raw.Query("SELECT * FROM sqlite_master ORDER BY name"));
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ((Strings{"contacts", "groups"}), changed);
    raw.Run("INSERT INTO groups(title) VALUES('Club')");
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{}, changed);
    ASSERT_EQ(0, watch.AddTable("groups"));
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{}, changed);
    raw.Run("INSERT INTO groups(title) VALUES('Gym')");
    EXPECT_EQ(0, watch.Check(changed));
    EXPECT_EQ(Strings{"groups"}, changed);
    std::filesystem::remove(PathOf("t.db"));
    EXPECT_EQ(14, watch.Check(changed));
    EXPECT_EQ(Strings{"groups"}, changed);
    EXPECT_EQ(-1, watch.GetFd());
}

// Bad input: one line each, the codes stated in DAWatch.h, nothing created.
TEST_F(WatchTest, RefusesBadInput)
{
    DAWatch watch;
    Strings changed;
    LogCapture log;
    EXPECT_EQ(21, watch.Check(changed));
    EXPECT_EQ(21, watch.AddTable("contacts"));
    std::ofstream(PathOf("text.db")) << std::string(5000, 'x');
    DABasePath bad[2];
    bad[0].SetPath(PathOf("missing").c_str(), "t.db");
    bad[1].SetPath(Dir().c_str(), "text.db");
    EXPECT_EQ(14 * 100 + 26, watch.Open(bad[0]) * 100 + watch.Open(bad[1]));
    EXPECT_FALSE(FileExists("missing"));
    ASSERT_EQ(0, OpenWatch(watch));
    EXPECT_EQ(21, watch.AddTable(nullptr));
    EXPECT_EQ(21, watch.AddTable("contacts; DROP TABLE groups"));
    EXPECT_EQ(1, watch.AddTable("people"));
    const auto line = [](const char* function, const std::string& message) {
        return Logged(6, "DAWatch.cpp", function, message);
    };
    const std::string notPlain = "AddTable FAILED[21]: table name is not a plain name";
    EXPECT_EQ((Strings{line("Check", "WATCH NOT OPEN"), line("AddTable", "WATCH NOT OPEN"),
                       line("Open", "DB open failed. Error no(14): unable to open database file"),
                       line("Open", "DB open failed. Error no(26): file is not a database"), line("AddTable", notPlain),
                       line("AddTable", notPlain), line("AddTable", "AddTable FAILED[1]: no such table: main.people")}),
              Described(log));
    EXPECT_EQ("", RawDb(PathOf("t.db")).Query("SELECT name FROM sqlite_master WHERE name LIKE 'ulo%'"));
}

// A writer killed right after its commit: the change is still reported. No
// descriptor to be had: Open fails with 14 and holds nothing. The file
// replaced by another: 14, the watch closed. Opened on another file, a
// table watched before is watched there too (its three triggers).
TEST_F(WatchTest, KilledWriterNoDescriptorsAndAReplacedFile)
{
    DAWatch watch;
    Strings changed;
    const LogCapture quiet;
    ASSERT_EQ(0, OpenWatch(watch) + watch.AddTable("contacts"));
    InChild([&] { return PerCall(Dir(), "contacts", 0) + raise(SIGKILL); });
    EXPECT_EQ(0, watch.Wait(5000, changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    EXPECT_EQ(0, InChild([&] {
                  const int before = OpenDescriptorCount();
                  std::vector<int> taken;
                  for (int fd = dup(0); fd >= 0; fd = dup(0)) {
                      taken.push_back(fd);
                  }
                  close(taken.back());  // one left: the file opens, the watch's own descriptor does not
                  taken.pop_back();
                  DAWatch starved;
                  const int rc = starved.Open(m_location);
                  for (const int fd : taken) {
                      close(fd);
                  }
                  return rc == 14 && starved.GetFd() == -1 && OpenDescriptorCount() == before ? 0 : 1;
              }));
    RawDb(PathOf("other.db")).Run(kSeed);
    std::filesystem::rename(PathOf("other.db"), PathOf("t.db"));
    EXPECT_EQ(14, watch.Check(changed));
    EXPECT_EQ(Strings{"contacts"}, changed);
    EXPECT_EQ(-1, watch.GetFd());
    const std::string second = Dir() + "/second";
    std::filesystem::create_directory(second);
    RawDb(second + "/t.db").Run(kSeed);
    DABasePath there;
    ASSERT_EQ(
        0, OpenWatch(watch) + watch.AddTable("contacts") + watch.Open(At(there, second)) + watch.AddTable("contacts"));
    EXPECT_EQ("3", RawDb(second + "/t.db").Query("SELECT count(*) FROM sqlite_master WHERE type = 'trigger'"));
}
