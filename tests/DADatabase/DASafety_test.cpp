#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DAFiles.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "FaultFs.h"
#include "TempDirTest.h"

namespace {

// Files on tmpfs where there is one: some cases commit many times.
[[maybe_unused]] const bool g_onTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

// The names in dir, sorted: what an operation left behind.
Strings Listing(const std::string& dir)
{
    Strings names;
    for (const auto& entry : std::filesystem::directory_iterator(dir)) {
        names.push_back(entry.path().filename().string());
    }
    std::sort(names.begin(), names.end());
    return names;
}

using Safety = TempDirTest;

}  // namespace

// New files give others nothing: 0640 less the umask, or exactly a
// session's SetFileMode, -wal and -shm alike; an existing file keeps its
// mode and so do its logs.
TEST_F(Safety, CreatedFilesArePrivate)
{
    const LogCapture quiet;
    DACreateRequest table;  // no location: runs at the session's file
    table.SetTable("t");
    table.SetColumnKey("v", "TEXT");
    RawDb(PathOf("old.db")).Run("CREATE TABLE t0(v TEXT)");
    chmod(PathOf("old.db").c_str(), 0644);
    for (const mode_t mask : {022, 077}) {
        const mode_t old = umask(mask);
        for (const int mode : {-2, -1, 0660, 0600}) {  // -2: a per-call visit; 0600 on the 0644 file
            const std::string name = mode == 0600 ? "old.db" : std::to_string(mask) + std::to_string(mode) + ".db";
            DABasePath location;
            location.SetPath(Dir().c_str(), name.c_str());
            DASession session;
            mode == -1 ? void() : session.SetFileMode(mode);  // -1: the default
            int version = 0;
            ASSERT_EQ(0,
                      mode == -2 ? DADatabase().GetVersion(location, version)
                                 : session.Open(location) + session.CreateTable(table));
            const int expected = mode == 0600 ? 0644 : mode >= 0 ? mode : 0640 & ~static_cast<int>(mask);
            for (const char* suffix : {"", "-wal", "-shm"}) {
                EXPECT_EQ(mode == -2 && *suffix != '\0' ? -1 : expected, DAFileModeOf(PathOf(name + suffix)))
                    << name << suffix;
            }
            RawDb(PathOf("old.db")).Run("DROP TABLE IF EXISTS t");
        }
        umask(old);
    }
    DASession held;  // a copy takes its source's mode less others' bits: 0000 stays 0000
    DABasePath copy;
    ASSERT_EQ(0, held.Open(At(copy, Dir())));
    chmod(PathOf("t.db").c_str(), 0);
    copy.SetPath(Dir().c_str(), "copy.db");
    EXPECT_EQ(0, held.Backup(copy) + DAFileModeOf(PathOf("copy.db")));
}

namespace {

// 2,000 rows of ~100 bytes in 4 KiB pages, an index on v; a view; a small
// table without rowids.
const char* const kRows =
    "PRAGMA page_size = 4096; PRAGMA user_version = 7;"
    "CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); CREATE INDEX t_v ON t(v);"
    "CREATE VIEW odd AS SELECT * FROM t WHERE k % 2;"
    "CREATE TABLE w(k TEXT PRIMARY KEY, v) WITHOUT ROWID; INSERT INTO w VALUES ('a', 1), ('b', 2);"
    "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 2000) "
    "INSERT INTO t SELECT i, printf('%0100d', i) FROM n;";

// One kind of damage to t.db at dir, and what each operation then gives.
struct Damage {
    const char* name;
    const char* pages;  // dbstat query for the page to overwrite; null: truncate to half
    // "rc:problems" of the quick and the full check; Salvage's code, tables
    // and salvaged file; RebuildIndexes' code and the full check after it.
    const char* expected;
};

const Damage kDamages[] = {
    {"none", "", "0:0 0:0 | 0 t:2000:0 w:2:0 7|4|ok|2000 | 0 0:0"},
    {"table_page", "SELECT pageno FROM dbstat WHERE name = 't' AND pagetype = 'leaf' LIMIT 1 OFFSET 20",
     "0:1 0:1 | 0 t:1963:37 w:2:0 7|4|ok|1963 | 11 0:1"},
    {"index_page", "SELECT pageno FROM dbstat WHERE name = 't_v' AND pagetype = 'leaf' LIMIT 1 OFFSET 10",
     "0:1 0:1 | 0 t:2000:0 w:2:0 7|4|ok|2000 | 0 0:0"},
    // The schema is gone with the first page: nothing can be read, nothing is created.
    {"first_page", "SELECT 1", "26:1 26:1 | 26 | 26 26:1"},
    // SQLite refuses a file shorter than its header says; salvage reads what is there.
    {"truncated", nullptr, "11:1 11:1 | 0 t:999:-1 w:2:0 7|4|ok|999 | 11 11:1"},
};

class Damaged : public TempDirTest, public ::testing::WithParamInterface<Damage> {};

}  // namespace

TEST_P(Damaged, CheckRebuildAndSalvageGiveTheirResults)
{
    const Damage& damage = GetParam();
    const std::string file = PathOf("t.db");
    RawDb(file).Run(kRows);
    if (damage.pages == nullptr) {
        truncate(file.c_str(), static_cast<off_t>(std::filesystem::file_size(file) / 2));
    } else if (*damage.pages != '\0') {
        const int page = std::stoi(RawDb(file).Query(damage.pages));
        std::fstream(file, std::ios::in | std::ios::out | std::ios::binary).seekp((page - 1) * 4096)
            << std::string(4096, '\x7f');
    }
    DABasePath location;
    DABasePath copy;
    At(location, Dir());
    copy.SetPath(Dir().c_str(), "salvaged.db");
    DADatabase db;
    LogCapture log;
    std::string results;
    for (const bool full : {false, true}) {
        std::vector<std::string> problems;
        const int rc = db.CheckIntegrity(location, full, problems);
        results += std::to_string(rc) + ":" + std::to_string(problems.size()) + " ";
    }
    const std::string before = FileBytes(file);
    DASalvageReport report;
    results += "| " + std::to_string(db.Salvage(location, copy, report));
    for (const auto& table : report.tables) {
        results += " " + table.name + ":" + std::to_string(table.rows) + ":" + std::to_string(table.lost);
    }
    if (FileExists("salvaged.db")) {
        EXPECT_EQ(DAFileModeOf(file) & ~07, DAFileModeOf(PathOf("salvaged.db")));
        results += " " +
            RawDb(PathOf("salvaged.db"))
                .Query("SELECT (SELECT user_version FROM pragma_user_version), (SELECT count(*) FROM "
                       "sqlite_master), (SELECT * FROM pragma_integrity_check), count(*) FROM t "
                       "WHERE v = printf('%0100d', k)");
    }
    EXPECT_EQ(before, FileBytes(file));  // never written
    results += " | " + std::to_string(db.RebuildIndexes(location));
    std::vector<std::string> problems;
    const int rc = db.CheckIntegrity(location, true, problems);
    results += " " + std::to_string(rc) + ":" + std::to_string(problems.size());
    EXPECT_EQ(damage.expected, results);
    EXPECT_EQ(5U, log.Lines().size());  // one line per operation
    EXPECT_EQ(report.tables.empty() ? Strings{"t.db"} : (Strings{"salvaged.db", "t.db"}), Listing(Dir()));
}

INSTANTIATE_TEST_SUITE_P(Every, Damaged, ::testing::ValuesIn(kDamages),
                         [](const auto& info) { return std::string(info.param.name); });

namespace {

// A table t of rows and n holding their count, changed together.
const char* const kCounted = "CREATE TABLE t(k INTEGER PRIMARY KEY, v BLOB); CREATE TABLE n(c INTEGER);"
                             "INSERT INTO n VALUES (0);";
const char* const kOneMore = "BEGIN IMMEDIATE; INSERT INTO t(v) VALUES (randomblob(1000)); UPDATE n SET c = c + 1;"
                             "COMMIT";
std::string RowsOf(int count)
{
    return "WITH RECURSIVE i(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM i WHERE x < " + std::to_string(count) +
        ") INSERT INTO t(v) SELECT randomblob(1000) FROM i; UPDATE n SET c = " + std::to_string(count) + ";";
}
// "ok|1" for a sound file whose count matches its rows: one committed state.
const char* const kWholeState = "SELECT (SELECT * FROM pragma_quick_check), (SELECT c FROM n) = count(*) FROM t";

// sql's first value on db, or "error <rc>".
std::string RawQuery(sqlite3* db, const char* sql)
{
    char** cells = nullptr;
    const int rc = sqlite3_get_table(db, sql, &cells, nullptr, nullptr, nullptr);
    const std::string value = rc == SQLITE_OK ? cells[1] : "error " + std::to_string(rc);
    sqlite3_free_table(cells);
    return value;
}

// Runs body in a child process with its own connection to path (busy
// time-out 5 s) until the parent ends it; returns its pid.
template <typename Body>
pid_t Child(const std::string& path, Body body)
{
    return Spawn([&] {
        sqlite3* db = nullptr;
        sqlite3_open(path.c_str(), &db);
        sqlite3_busy_timeout(db, 5000);
        return body(db), 0;
    });
}

}  // namespace

// Backups while another process commits every millisecond (WAL): each
// holds one committed state, and the writer goes on meanwhile. Backups in
// processes killed at random moments, on a file system that loses what was
// not synced, leave the previous backup or the whole new one.
TEST_F(Safety, BackupsBesideAWriterHoldOneCommittedStateThroughPowerCuts)
{
    const std::string file = PathOf("t.db");
    RawDb(file).Run(std::string("PRAGMA journal_mode = WAL;") + kCounted + RowsOf(2000));  // 2 MB: several steps
    const pid_t writer = Child(file, [](sqlite3* db) {
        for (;;) {
            sqlite3_exec(db, kOneMore, nullptr, nullptr, nullptr);
            usleep(1000);
        }
    });
    DABasePath from;
    DABasePath to;
    At(from, Dir());
    to.SetPath(Dir().c_str(), "copy.db");
    const LogCapture quiet;
    std::mt19937 random(27);
    int counts[2] = {};
    for (int round = 0; round < 7; ++round) {
        const pid_t pid = round % 6 == 0 ? 0 : fork();  // the first and last here, whole
        if (pid == 0 && round % 6 != 0) {
            const faultfs::Installed fs;
            for (;;) {  // until killed
                DADatabase().Backup(from, to);
            }
        }
        if (pid == 0) {
            ASSERT_EQ(0, DADatabase().Backup(from, to));
            counts[round / 6] = std::stoi(RawDb(PathOf("copy.db")).Query("SELECT c FROM n"));
        } else {
            usleep(std::uniform_int_distribution<useconds_t>(30000, 300000)(random));
            kill(pid, SIGKILL);
            waitpid(pid, nullptr, 0);
        }
        EXPECT_EQ("ok|1", RawDb(PathOf("copy.db")).Query(kWholeState)) << round;
    }
    kill(writer, SIGKILL);
    waitpid(writer, nullptr, 0);
    EXPECT_LT(counts[0], counts[1]);
}

// Restores alternate between two backups while another process reads: it
// sees one of them whole, never a mix, and a session holding the file reads
// the restored rows at once.
TEST_F(Safety, RestoreWhileAnotherProcessReadsShowsOldOrNew)
{
    for (const char* name : {"a.db", "b.db"}) {
        RawDb backup(PathOf(name));
        backup.Run(kCounted + RowsOf(name[0] == 'a' ? 100 : 300));
    }
    DASession session;
    DABasePath location;
    ASSERT_EQ(0, session.Open(At(location, Dir())));
    int fds[2];
    ASSERT_EQ(0, pipe(fds));
    DABasePath backups[2];
    backups[0].SetPath(Dir().c_str(), "a.db");
    backups[1].SetPath(Dir().c_str(), "b.db");
    const LogCapture quiet;
    ASSERT_EQ(0, session.Restore(backups[0]));
    const pid_t reader = Child(PathOf("t.db"), [&](sqlite3* db) {
        std::string seen;  // each distinct answer once; both, however slowly the restores come
        for (int i = 0; i < 1500 || (std::count(seen.begin(), seen.end(), ' ') < 2 && i < 1000000); ++i) {
            const std::string row = RawQuery(db, "SELECT count(*) || '/' || (SELECT c FROM n) FROM t");
            seen += seen.find(row) == std::string::npos ? row + " " : "";
        }
        (void)!write(fds[1], seen.data(), seen.size());
    });
    close(fds[1]);
    DASelectRequest select;
    select.SetTable("t");
    DACursor cursor;
    int restores = 0;
    for (; waitpid(reader, nullptr, WNOHANG) == 0; ++restores) {
        const int which = restores % 2;
        ASSERT_EQ(0,
                  restores % 3 == 0 ? DADatabase().Restore(backups[which], location) : session.Restore(backups[which]));
        ASSERT_EQ(0, session.Select(select, cursor));
        EXPECT_EQ(which == 0 ? 100 : 300, cursor.GetCount());
    }
    std::string seen(64, '\0');
    seen.resize(static_cast<std::size_t>(std::max<ssize_t>(read(fds[0], &seen[0], seen.size()), 0)));
    close(fds[0]);
    EXPECT_TRUE(seen == "100/100 300/300 " || seen == "300/300 100/100 ") << seen;
}

// Refusals: each its code and one line; every file stays as it was and
// nothing is left behind.
TEST_F(Safety, RefusesBadInputWithOneLine)
{
    RawDb(PathOf("t.db")).Run(kCounted + RowsOf(10));
    std::ofstream(PathOf("empty.db")).close();
    std::ofstream(PathOf("text.db")) << std::string(5000, 'x');
    std::ofstream(PathOf("noise.db")) << std::string(4096, '\x93') + std::string(4096, '\x11');
    std::ofstream(PathOf("cut.db")) << FileBytes(PathOf("t.db")).substr(0, 4096);
    std::ofstream(PathOf("held.db-wal")).close();  // a log its next opener would apply
    const Strings files = Listing(Dir());
    const std::string before = FileBytes(PathOf("t.db"));
    DABasePath t;
    DABasePath missing;
    At(t, Dir());
    missing.SetPath(PathOf("missing").c_str(), "x.db");
    DABasePath held;
    held.SetPath(Dir().c_str(), "held.db");
    DADatabase db;
    DASalvageReport report;
    LogCapture log;
    std::vector<int> codes = {db.Backup(t, missing), db.Backup(t, t), db.Salvage(t, missing, report),
                              db.Salvage(t, t, report), db.Backup(t, held)};  // a braced list runs in order
    for (const char* name : {"empty.db", "text.db", "noise.db", "cut.db", "gone.db", "t.db"}) {
        DABasePath from;
        from.SetPath(Dir().c_str(), name);
        codes.push_back(db.Restore(from, t));
    }
    EXPECT_EQ((std::vector<int>{14, 21, 14, 21, 5, 26, 26, 26, 11, 14, 21}), codes);
    const std::string beside = "cannot create a file beside " + Dir() + "/missing/x.db: No such file or directory";
    const std::string itself = " would replace its own source " + Dir() + "/t.db";
    const auto line = [](const char* function, const std::string& message) {
        return Logged(6, "DADatabase.cpp", function, message);
    };
    EXPECT_EQ(
        (Strings{line("Backup", "Backup FAILED[14]: " + beside), line("Backup", "Backup FAILED[21]: the copy" + itself),
                 line("Salvage", "Salvage FAILED[14]: " + beside),
                 line("Salvage", "Salvage FAILED[21]: the salvage" + itself),
                 line("Backup", "Backup FAILED[5]: " + Dir() + "/held.db is in use: " + Dir() + "/held.db-wal exists"),
                 line("Restore", "Restore FAILED[26]: file is not a database"),
                 line("Restore", "Restore FAILED[26]: file is not a database"),
                 line("Restore", "Restore FAILED[26]: file is not a database"),
                 line("Restore", "Restore FAILED[11]: database disk image is malformed"),
                 line("Restore", "Restore FAILED[14]: unable to open database file"),
                 line("Restore", "Restore FAILED[21]: restore of a file from itself: " + Dir() + "/t.db")}),
        Described(log));
    EXPECT_EQ(before, FileBytes(PathOf("t.db")));
    EXPECT_EQ(files, Listing(Dir()));
    EXPECT_TRUE(report.tables.empty());
}
