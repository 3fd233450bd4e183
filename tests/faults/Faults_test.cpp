// The fault classes: allocation failure (this program replaces SQLite's
// allocator and operator new, so it is a program of its own), files the
// library cannot write or read, a writer killed at random moments, and
// generated texts and cursor moves.
#include <grp.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <new>
#include <random>
#include <regex>
#include <tuple>
#include <utility>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "FaultFs.h"
#include "TempDirTest.h"
#include "dlog.h"

namespace {

enum Allocator { kSqlite, kNew };
int g_failAt = 0;  // the allocation to fail, counted from 1 while armed; 0: disarmed
int g_calls = 0;
Allocator g_armed = kSqlite;
sqlite3_mem_methods g_default;
// Files on tmpfs where there is one: the library syncs every commit, and
// these tests commit thousands of times.
[[maybe_unused]] const bool g_onTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

bool FailNow(Allocator allocator)
{
    return g_failAt > 0 && g_armed == allocator && ++g_calls == g_failAt;
}

// Installed before SQLite's first use; without lookaside, so that every
// allocation of a connection goes through xMalloc.
const bool g_installed = sqlite3_config(SQLITE_CONFIG_GETMALLOC, &g_default) == SQLITE_OK && [] {
    sqlite3_mem_methods methods = g_default;
    methods.xMalloc = [](int size) { return FailNow(kSqlite) ? nullptr : g_default.xMalloc(size); };
    methods.xRealloc = [](void* old, int size) { return FailNow(kSqlite) ? nullptr : g_default.xRealloc(old, size); };
    return sqlite3_config(SQLITE_CONFIG_MALLOC, &methods) == SQLITE_OK &&
        sqlite3_config(SQLITE_CONFIG_LOOKASIDE, 0, 0) == SQLITE_OK;
}();

}  // namespace

// The array forms are the standard library's, which call these (sanitizers
// bring array forms of their own, paired with each other). None is
// inlined: GCC would warn that free meets a new-expression.
[[gnu::noinline]] void* operator new(std::size_t size)
{
    void* block = FailNow(kNew) ? nullptr : std::malloc(size != 0 ? size : 1);
    return block != nullptr ? block : throw std::bad_alloc();
}
[[gnu::noinline]] void operator delete(void* block) noexcept
{
    std::free(block);
}
[[gnu::noinline]] void operator delete(void* block, std::size_t /*size*/) noexcept
{
    std::free(block);
}

namespace {

// "priority message" per line; the sink's own allocations never fail.
Strings g_lines;
void Sink(int /*logId*/, int prio, const char* /*tag*/, const char* text, void* /*user*/)
{
    const int armed = std::exchange(g_failAt, 0);
    g_lines.push_back(std::to_string(prio) + " " + (std::strstr(text, ") > ") + 4));
    g_failAt = armed;
}

// Through DADatabase, or through a session opened and closed around each
// operation (so that the session's open and close fail too).
class AllocFailure : public TempDirTest, public ::testing::WithParamInterface<std::tuple<Allocator, bool>> {};

int CheckExist(DADatabase& db, DABasePath& location, const char* table, bool& exists)
{
    return db.CheckExistTable(location, table, exists);
}
int CheckExist(DASession& session, DABasePath& /*location*/, const char* table, bool& exists)
{
    return session.CheckExistTable(table, exists);
}

TEST_P(AllocFailure, FailsCleanlyAtEveryAllocationAndStaysUsable)
{
    ASSERT_TRUE(g_installed);
    const Allocator allocator = std::get<0>(GetParam());
    const bool held = std::get<1>(GetParam());
    RawDb(PathOf("seed.db"))
        .Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT, n REAL); CREATE TABLE d(x);"
             "INSERT INTO t VALUES (1, 'a', 1.5), (2, 'b', 2.5);"
             "CREATE TABLE u(k INTEGER, w TEXT); INSERT INTO u VALUES (1, 'x'); CREATE TABLE p(x);");
    DADatabase db;
    DACreateRequest create;
    DADropRequest drop;
    DAUpdateRequest update;
    DADeleteRequest remove;
    DAUpsertRequest upsert;
    DASelectRequest select;
    DAJoinRequest join;
    DACursor cursor;
    bool exists = false;
    At(create, Dir(), "c").SetColumnKey("name", "TEXT");
    At(update, Dir(), "t").SetData("v", "z");
    update.SetWhere("k", 1);
    At(remove, Dir(), "t").SetWhere("k", 2);
    At(upsert, Dir(), "t").SetData("k", 3);
    At(select, Dir(), "t").SetWhere("v", "a");
    join.SetPath(Dir().c_str(), "t.db");
    join.SetLeftJoin("t", "k");
    join.SetRightJoin("u", "k");
    DABatchRequest batch;
    At(batch, Dir()).Add(upsert);
    batch.Add(remove);
    // op(db) or op(session), the session opened (its failure is the result)
    // and closed. However op ends, a throw included, the session then takes
    // a write that another connection sees.
    const auto via = [&](auto&& op) {
        if (!held) {
            return op(db);
        }
        DASession session;
        const int rc = session.Open(join);
        if (rc != SQLITE_OK) {
            return rc;
        }
        struct Probe {
            DASession& session;
            std::string path;
            ~Probe()
            {
                const int armed = std::exchange(g_failAt, 0);
                DAUpsertRequest row;
                row.SetTable("p");
                row.SetData("x", "probe");
                EXPECT_EQ(0, session.Upsert(row));
                EXPECT_EQ("1", RawDb(path).Query("SELECT count(*) FROM p"));
                g_failAt = armed;
            }
        } const probe{session, PathOf("t.db")};
        return op(session);
    };
    const std::map<std::string, std::function<int()>> ops{
        {"CreateTable", [&] { return via([&](auto& t) { return t.CreateTable(create); }); }},
        {"DropTable", [&] { return via([&](auto& t) { return t.DropTable(At(drop, Dir(), "d")); }); }},
        // Fails anyway: exec's error text is then copied, which can fail too.
        {"DropMissing", [&] { return via([&](auto& t) { return t.DropTable(At(drop, Dir(), "gone")); }); }},
        {"Update", [&] { return via([&](auto& t) { return t.Update(update); }); }},
        {"Delete", [&] { return via([&](auto& t) { return t.Delete(remove); }); }},
        {"Upsert", [&] { return via([&](auto& t) { return t.Upsert(upsert); }); }},
        {"ExecuteBatch", [&] { return via([&](auto& t) { return t.ExecuteBatch(batch); }); }},
        {"Migrate", [&] { return via([&](auto& t) { return t.Migrate(batch, 1); }); }},
        {"Select", [&] { return via([&](auto& t) { return t.Select(select, cursor); }); }},
        {"JoinSelect", [&] { return via([&](auto& t) { return t.JoinSelect(join, cursor); }); }},
        {"CheckExistTable", [&] { return via([&](auto& t) { return CheckExist(t, join, "u", exists) + !exists; }); }},
        {"Fill", [&] {  // a request and the cursor filled, the cursor read: 0 when all reads back
             int k = 0;
             double n = 0;
             upsert.SetWhere("n", 2.5), cursor.Initialize(), cursor.SetColumn("k"), cursor.SetData("k", "7");
             return cursor.MoveToNext() + cursor.GetInt("k", k) + cursor.GetDouble("k", n) + (k * n == 49 ? 0 : 1);
         }}};
    // The file as a fresh connection sees it, the seed copied there first if asked.
    const auto state = [&](bool reseed) {
        const auto overwrite = std::filesystem::copy_options::overwrite_existing;
        if (reseed) {  // a log a failed close left behind goes too
            std::filesystem::remove(PathOf("t.db-wal"));
            std::filesystem::copy_file(PathOf("seed.db"), PathOf("t.db"), overwrite);
        }
        RawDb raw(PathOf("t.db"));
        return raw.Query("SELECT name FROM sqlite_master") + "/" + raw.Query("SELECT * FROM t");
    };
    dlog_set_sink(&Sink, nullptr);
    for (const auto& [op, run] : ops) {
        const bool query = std::strstr("Select JoinSelect CheckExistTable", op.c_str()) != nullptr;
        const std::string before = state(true);
        const int expected = run();
        const Strings normal = std::exchange(g_lines, {});
        ASSERT_EQ(op == "DropMissing" ? 1 : 0, expected);
        const std::string after = state(false);
        const Strings rows = Dump(cursor);
        int fallbacks = 0;
        const std::regex kAllowed("[^6].*|.*out of memory|6 (SQLITE STEP|CONVERT TO INT|CONVERT TO DOUBLE) ERROR!!!");
        for (int n = 1; g_calls >= n - 1; ++n) {
            SCOPED_TRACE(op + ", allocation " + std::to_string(n));
            state(true);
            const int descriptors = OpenDescriptorCount();
            const sqlite3_int64 memory = sqlite3_memory_used();
            int rc = -1;  // std::bad_alloc
            std::tie(g_lines, g_calls, g_armed, g_failAt) = std::make_tuple(Strings(), 0, allocator, n);
            try {
                rc = run();
            } catch (const std::bad_alloc&) {
            }
            g_failAt = 0;
            EXPECT_EQ(descriptors, OpenDescriptorCount());
            EXPECT_EQ(memory, sqlite3_memory_used());
            const std::string now = state(false);
            EXPECT_TRUE(now == before || now == after) << now;
            // SQLite's text of a failed allocation (also where sqlite3_errstr
            // stands in for a missing exec text); a stream's extraction swallows
            // a failed allocation and fails the read.
            int errors = 0;
            for (const std::string& line : g_lines) {
                EXPECT_TRUE(std::regex_match(line, kAllowed) || std::count(normal.begin(), normal.end(), line) > 0)
                    << line;
                errors += line[0] == '6' ? 1 : 0;
            }
            if (g_calls < n || (rc == 0 && !query)) {
                EXPECT_EQ(expected, rc);  // ran through, or SQLite tolerated the failure
                EXPECT_EQ(after, now);
            } else if (rc != -1) {
                // A failed step is reported by its line alone, and the rows read
                // before it stay; a column text SQLite could not give is stored as
                // "". (A missing column name is not reachable: SQLite's names
                // need no allocation once the statement runs.)
                EXPECT_TRUE(rc == 0 ? query : errors > 0) << rc;
                const Strings got = Dump(cursor);
                for (std::size_t i = 0; rc == 0 && i < got.size(); ++i) {
                    EXPECT_TRUE(i < rows.size() && (got[i] == rows[i] || got[i].empty())) << i << ": " << got[i];
                    fallbacks += i < rows.size() && got[i] != rows[i] ? 1 : 0;
                }
            }
            state(true);
            EXPECT_EQ(expected, run());  // at once: no member lock is left held
            EXPECT_EQ(rows, Dump(cursor));
        }
        EXPECT_TRUE(fallbacks > 0 || allocator == kNew || !query || op == "CheckExistTable") << op;
    }
    dlog_set_sink(nullptr, nullptr);
}

INSTANTIATE_TEST_SUITE_P(Every, AllocFailure, ::testing::Combine(::testing::Values(kSqlite, kNew), ::testing::Bool()),
                         [](const auto& info) {
                             return std::string(std::get<0>(info.param) == kSqlite ? "sqlite_malloc" : "operator_new") +
                                 (std::get<1>(info.param) ? "_session" : "_per_call");
                         });

struct IoCase {
    const char* name;
    std::function<void(const std::string& dir, const std::string& file)> fault;
    const char* expected;  // "code|line" of a Select (when the line says so) or an Upsert
    friend void PrintTo(const IoCase& c, std::ostream* os) { *os << c.name; }
};

const IoCase kIoCases[] = {
    {"ReadOnlyFile", [](auto&, auto& file) { chmod(file.c_str(), 0444); },
     "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"ReadOnlyDirectory", [](auto& dir, auto&) { chmod(dir.c_str(), 0555); },
     "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"NotADatabase", [](auto&, auto& file) { std::ofstream(file) << std::string(5000, 'x'); },
     "26|6 DADatabase.cpp:Select > SELECT FAILED[26]: file is not a database"},
    {"Truncated", [](auto&, auto& file) { truncate(file.c_str(), 4096); },
     "11|6 DADatabase.cpp:Select > SELECT FAILED[11]: database disk image is malformed"},
    // The file may not grow: EFBIG, which SQLite reports as an I/O error
    // (ENOSPC would be SQLITE_FULL).
    {"FileSizeLimit", [](auto&, auto&) {}, "10|6 DADatabase.cpp:Upsert > Upsert FAILED[10]: disk I/O error"},
    // A full file system: no file may grow (ENOSPC), which is SQLITE_FULL,
    // while a migration step writes its row and while Compact rewrites the
    // file (its journal holds every page).
    {"MigrateDiskFull", [](auto&, auto&) {},
     "13|6 DADatabase.cpp:Migrate > Migrate FAILED[13] at 1/1: database or disk is full"},
    {"CompactDiskFull", [](auto&, auto&) {},
     "13|6 DADatabase.cpp:Compact > Compact FAILED[13]: database or disk is full"},
    // A backup or salvage (of the file into copy.db) leaves nothing behind.
    {"BackupDiskFull", [](auto&, auto&) {}, "13|6 DADatabase.cpp:Backup > Backup FAILED[13]: database or disk is full"},
    {"SalvageDiskFull", [](auto&, auto&) {},
     "13|6 DADatabase.cpp:Salvage > Salvage FAILED[13]: database or disk is full"},
};

// SQLite's pwrite64 on a full file system: a write that would make a file
// grow fails with ENOSPC.
sqlite3_syscall_ptr g_pwrite64 = nullptr;
ssize_t FullDiskPwrite64(int fd, const void* data, size_t size, off64_t offset)
{
    struct stat status {};
    if (fstat(fd, &status) != 0 || offset + static_cast<off64_t>(size) > status.st_size) {
        errno = ENOSPC;
        return -1;
    }
    return reinterpret_cast<ssize_t (*)(int, const void*, size_t, off64_t)>(g_pwrite64)(fd, data, size, offset);
}

class IoFaults : public TempDirTest, public ::testing::WithParamInterface<IoCase> {};

// Each in a child process, which under root becomes nobody first, so that
// file permissions apply.
TEST_P(IoFaults, FailWithOneLineAndLeaveTheFile)
{
    const IoCase& c = GetParam();
    const std::string dir = PathOf("db");
    const std::string file = dir + "/t.db";
    mkdir(dir.c_str(), 0700);
    RawDb(file).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL "
                    "SELECT i + 1 FROM n WHERE i < 50) INSERT INTO t SELECT i, printf('%0500d', i) FROM n;");
    for (const std::string& path : {Dir(), dir, file}) {
        ASSERT_EQ(0, getuid() == 0 ? chown(path.c_str(), 65534, 65534) : 0);
    }
    c.fault(dir, file);
    const std::string before = FileBytes(file);
    const auto files = std::distance(std::filesystem::directory_iterator(dir), {});
    const pid_t pid = fork();
    if (pid == 0) {
        const bool nobody = getuid() != 0 || (setgroups(0, nullptr) == 0 && setgid(65534) == 0 && setuid(65534) == 0);
        const rlimit limit{std::strstr(c.name, "SizeLimit") != nullptr ? before.size() : RLIM_INFINITY, RLIM_INFINITY};
        signal(SIGXFSZ, SIG_IGN);
        setrlimit(RLIMIT_FSIZE, &limit);
        if (std::strstr(c.name, "DiskFull") != nullptr) {
            sqlite3_vfs* vfs = sqlite3_vfs_find(nullptr);
            g_pwrite64 = vfs->xGetSystemCall(vfs, "pwrite64");
            vfs->xSetSystemCall(vfs, "pwrite64", reinterpret_cast<sqlite3_syscall_ptr>(&FullDiskPwrite64));
        }
        const LogCapture log;
        DACursor cursor;
        DASelectRequest select;
        DAUpsertRequest upsert;
        At(upsert, dir, "t").SetData("v", std::string(20000, 'v').c_str());
        std::ofstream out(PathOf("out"));
        DABatchRequest step;  // a migration to version 1 that writes the upsert's row
        step.SetPath(dir.c_str(), "t.db");
        step.Add(upsert);
        const auto named = [&](const char* word) { return std::strstr(c.expected, word) != nullptr; };
        DABasePath copy;
        copy.SetPath(dir.c_str(), "copy.db");
        DASalvageReport report;
        out << (!nobody || access(Dir().c_str(), W_OK) != 0 ? -1
                    : named("SELECT")                       ? DADatabase().Select(At(select, dir, "t"), cursor)
                    : named("Migrate")                      ? DADatabase().Migrate(step, 1)
                    : named("Compact")                      ? DADatabase().Compact(upsert)
                    : named("Backup")                       ? DADatabase().Backup(upsert, copy)
                    : named("Salvage")                      ? DADatabase().Salvage(upsert, copy, report)
                                                            : DADatabase().Upsert(upsert));
        for (const std::string& line : Described(log)) {
            out << "|" << line;
        }
        out.close();
        _exit(0);
    }
    ASSERT_EQ(pid, waitpid(pid, nullptr, 0));
    chmod(dir.c_str(), 0700);
    if (FileBytes(PathOf("out")) == "-1") {
        GTEST_SKIP() << "cannot run as nobody (65534) in " << Dir();
    }
    EXPECT_EQ(c.expected, FileBytes(PathOf("out")));
    EXPECT_EQ(before, FileBytes(file));
    EXPECT_EQ(files, std::distance(std::filesystem::directory_iterator(dir), {}));
}

INSTANTIATE_TEST_SUITE_P(Every, IoFaults, ::testing::ValuesIn(kIoCases),
                         [](const auto& info) { return std::string(info.param.name); });

using Faults = TempDirTest;

// A session on a disk that fills up: each write fails with 13 and one line
// (a delete too: its log needs room, which only a size budget keeps), Close
// works, and once there is room again the file holds every acknowledged row.
TEST_F(Faults, SessionOnAFullDiskFailsCleanlyAndKeepsTheFile)
{
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    DASession session;
    DABasePath location;
    ASSERT_EQ(0, session.Open(At(location, Dir())));
    const auto upsert = [&](int k) {
        DAUpsertRequest request;
        At(request, Dir(), "t").SetData("k", k);
        request.SetData("v", std::string(500, 'v').c_str());
        return session.Upsert(request);
    };
    dlog_set_sink(&dlog_discard_sink, nullptr);
    for (int k = 0; k < 20; ++k) {
        ASSERT_EQ(0, upsert(k));
    }
    sqlite3_vfs* vfs = sqlite3_vfs_find(nullptr);
    g_pwrite64 = vfs->xGetSystemCall(vfs, "pwrite64");
    vfs->xSetSystemCall(vfs, "pwrite64", reinterpret_cast<sqlite3_syscall_ptr>(&FullDiskPwrite64));
    LogCapture log;
    DADeleteRequest remove;
    At(remove, Dir(), "t").SetWhere("k", DACompare::Less, 10);
    EXPECT_EQ(13, upsert(20));
    EXPECT_EQ(13, session.Delete(remove));
    session.Close();
    vfs->xSetSystemCall(vfs, "pwrite64", g_pwrite64);
    EXPECT_EQ((Strings{Logged(6, "DASession.cpp", "Upsert", "Upsert FAILED[13]: database or disk is full"),
                       Logged(6, "DASession.cpp", "Delete", "delete FAILED[13]: database or disk is full")}),
              Described(log));
    EXPECT_EQ("20|ok", RawDb(PathOf("t.db")).Query("SELECT count(*), (SELECT * FROM pragma_integrity_check) FROM t"));
}

// Backups of a changing file in a process killed at random moments, on a
// file system that loses what was not synced: the backup is always a whole
// file holding one committed state.
TEST_F(Faults, PowerCutDuringBackupsLeavesAWholeBackup)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v BLOB); CREATE TABLE n(c INTEGER); "
             "INSERT INTO n VALUES (0);");
    std::mt19937 random(27);
    for (int round = 0; round < 5; ++round) {
        const pid_t pid = fork();
        if (pid == 0) {
            const faultfs::Installed fs;
            dlog_set_sink(&dlog_discard_sink, nullptr);
            RawDb db(PathOf("t.db"));
            DABasePath from;
            DABasePath to;
            At(from, Dir());
            to.SetPath(Dir().c_str(), "copy.db");
            for (;;) {  // until killed
                db.Run("BEGIN; INSERT INTO t(v) SELECT randomblob(3000) FROM t LIMIT 50; INSERT INTO t(v) VALUES "
                       "(randomblob(3000)); UPDATE n SET c = (SELECT count(*) FROM t); COMMIT");
                DADatabase().Backup(from, to);
            }
        }
        ASSERT_GT(pid, 0);
        usleep(std::uniform_int_distribution<useconds_t>(30000, 300000)(random));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        if (FileExists("copy.db")) {
            EXPECT_EQ("ok|1",
                      RawDb(PathOf("copy.db"))
                          .Query("SELECT (SELECT * FROM pragma_quick_check), (SELECT c FROM n) = count(*) "
                                 "FROM t"))
                << round;
        }
    }
    EXPECT_TRUE(FileExists("copy.db"));
}

TEST_F(Faults, KilledWriterLosesNoAcknowledgedRow)
{
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    std::mt19937 random(20261123);
    std::string acknowledged = "-1";  // the rows whose Upsert returned 0
    int count = 0;
    for (int round = 0; round < 6; ++round) {
        int fds[2];
        const pid_t pid = pipe(fds) == 0 ? fork() : -1;
        if (pid == 0) {  // the writer, until killed: reports each row whose Upsert returned 0
            dlog_set_sink(&dlog_discard_sink, nullptr);
            for (int k = round * 1000000;; ++k) {
                DAUpsertRequest request;
                At(request, Dir(), "t").SetData("k", k);
                request.SetData("v", std::string(k % 900, 'v').c_str());
                if (DADatabase().Upsert(request) == 0 && write(fds[1], &k, sizeof k) != sizeof k) {
                    _exit(1);
                }
            }
        }
        ASSERT_GT(pid, 0);
        close(fds[1]);
        usleep(std::uniform_int_distribution<useconds_t>(20000, 150000)(random));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        for (int k = 0; read(fds[0], &k, sizeof k) == sizeof k; ++count) {
            acknowledged += "," + std::to_string(k);
        }
        close(fds[0]);
        RawDb db(PathOf("t.db"));
        EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
        EXPECT_EQ(std::to_string(count), db.Query("SELECT count(*) FROM t WHERE k IN (" + acknowledged + ")"));
    }
    EXPECT_GT(count, 6) << "the writer must have got some rows in";
}

// A session writing rows 0, 1, 2, ... in a process killed at a random
// moment, on a file system that loses every write not yet synced (a power
// cut). The file is whole and holds a prefix of the rows; with the default
// sync every acknowledged row, without it maybe fewer, never a gap.
class PowerCut : public TempDirTest, public ::testing::WithParamInterface<bool> {};

TEST_P(PowerCut, LeavesAWholeFileWithAPrefixOfTheRows)
{
    const bool sync = GetParam();
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    std::mt19937 random(sync ? 11 : 12);
    int next = 0;  // rows 0..next-1 are in the file
    for (int round = 0; round < 6; ++round) {
        int fds[2];
        const pid_t pid = pipe(fds) == 0 ? fork() : -1;
        if (pid == 0) {
            const faultfs::Installed fs;
            dlog_set_sink(&dlog_discard_sink, nullptr);
            DASession session;
            session.SetSyncOnCommit(sync);
            // Never reached; unsynced, the log reaches the file at
            // checkpoints, here every 64 pages, so that some rows survive.
            session.SetSizeLimit(2 << 20);
            DABasePath location;
            if (session.Open(At(location, Dir())) != 0) {
                _exit(2);
            }
            for (int k = next;; ++k) {  // until killed
                DAUpsertRequest request;
                At(request, Dir(), "t").SetData("k", k);
                request.SetData("v", std::string(k % 30, 'v').c_str());
                if (session.Upsert(request) == 0 && write(fds[1], &k, sizeof k) != sizeof k) {
                    _exit(1);
                }
            }
        }
        ASSERT_GT(pid, 0);
        close(fds[1]);
        usleep(std::uniform_int_distribution<useconds_t>(50000, sync ? 200000 : 400000)(random));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        int last = next - 1;  // the last acknowledged row
        for (int k = 0; read(fds[0], &k, sizeof k) == sizeof k;) {
            last = k;
        }
        close(fds[0]);
        RawDb db(PathOf("t.db"));
        EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
        const int rows = std::stoi(db.Query("SELECT count(*) FROM t"));
        EXPECT_EQ(std::to_string(rows - 1), db.Query("SELECT coalesce(max(k), -1) FROM t"));  // no gap
        EXPECT_LE(rows, last + 2);  // at most the one in flight beyond the acknowledged
        if (sync) {
            EXPECT_GE(rows, last + 1);  // nothing acknowledged is lost
        }
        EXPECT_GE(rows, next);
        next = rows;
    }
    EXPECT_GT(next, sync ? 6 : 0) << "some rows must have survived";
}

INSTANTIATE_TEST_SUITE_P(Sessions, PowerCut, ::testing::Bool(),
                         [](const auto& info) { return std::string(info.param ? "synced" : "not_synced"); });

// An I/O error at each write and each sync, in turn, of a session's life:
// the failing operation returns its code, the session goes on, Close works;
// what was acknowledged is there (also after a power cut), a batch lands
// whole or not at all, the file is whole.
TEST_F(Faults, SessionSurvivesAnIoErrorAtEveryWriteAndSync)
{
    RawDb(PathOf("seed.db"))
        .Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); INSERT INTO t VALUES (1, 'a'), (2, 'b')");
    // Each operation's effect, as a query that gives "1" once it is there.
    const char* const effects[] = {"SELECT count(*) FROM t WHERE k = 100", "SELECT count(*) = 2 FROM t WHERE k > 100",
                                   "SELECT count(*) = 0 FROM t WHERE k = 1", "SELECT v = 'z' FROM t WHERE k = 2"};
    const auto check = [&](const int(&rc)[4]) {
        RawDb db(PathOf("t.db"));
        EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
        EXPECT_NE("1", db.Query("SELECT count(*) = 1 FROM t WHERE k > 100"));  // the batch is whole
        for (int i = 0; i < 4; ++i) {
            EXPECT_TRUE(rc[i] != 0 || db.Query(effects[i]) == "1") << i;
        }
    };
    bool reached = true;
    int n = 1;
    for (; reached; ++n) {
        SCOPED_TRACE("fault " + std::to_string(n));
        std::filesystem::copy_file(PathOf("seed.db"), PathOf("t.db"),
                                   std::filesystem::copy_options::overwrite_existing);
        int rc[4] = {-1, -1, -1, -1};
        {
            const faultfs::Installed fs;
            faultfs::g_state.failAt = n;
            const LogCapture log;
            DASession session;
            DABasePath location;
            const int opened = session.Open(At(location, Dir()));
            // Open succeeds only with the log in effect.
            EXPECT_EQ(opened == 0 ? "wal" : "delete", RawDb(PathOf("t.db")).Query("PRAGMA journal_mode")) << opened;
            DAUpsertRequest upserts[3];
            DABatchRequest batch;
            DADeleteRequest remove;
            DAUpdateRequest update;
            for (int i = 0; i < 3; ++i) {
                At(upserts[i], Dir(), "t").SetData("k", 100 + i);
            }
            At(remove, Dir(), "t").SetWhere("k", 1);
            At(update, Dir(), "t").SetData("v", "z");
            update.SetWhere("k", 2);
            At(batch, Dir()).Add(upserts[1]);
            batch.Add(upserts[2]);
            rc[0] = session.Upsert(upserts[0]);
            rc[1] = session.ExecuteBatch(batch);
            rc[2] = session.Delete(remove);
            rc[3] = session.Update(update);
            session.Close();
            reached = faultfs::g_state.calls >= n;
            int failures = 0;
            for (const int code : rc) {
                EXPECT_TRUE(code == 0 || code == SQLITE_IOERR || (opened != 0 && code == SQLITE_MISUSE)) << code;
                failures += code != 0 ? 1 : 0;
            }
            // The session goes on after the failed operation; one line each.
            EXPECT_LE(failures, opened == 0 ? 1 : 4);
            EXPECT_EQ(opened == 0 ? 4 : 5, static_cast<int>(log.Lines().size()));
            check(rc);  // as this process sees the files
        }
        check(rc);  // after a power cut
    }
    EXPECT_GT(n, 20) << "writes and syncs of the open, four operations and the close";
}

// The killed migration's pipe: its first busy warning (the commit waiting
// for a reader) is written there.
int g_busyPipe = -1;
void ReportBusy(int /*logId*/, int /*prio*/, const char* /*tag*/, const char* text, void* /*user*/)
{
    if (std::strstr(text, "SQLITE BUSY[1]") != nullptr && write(g_busyPipe, "b", 1) != 1) {
        _exit(1);
    }
}

// Killed while it commits (another connection still reads, so the commit
// waits): the file stays at the old version with none of the step's rows,
// and the next Migrate runs the step once.
TEST_F(Faults, KilledMigrationLeavesTheOldVersion)
{
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    DABatchRequest step;
    At(step, Dir());
    for (int k = 0; k < 200; ++k) {
        DAUpsertRequest row;
        At(row, Dir(), "t").SetData("k", k);
        row.SetData("v", std::string(1000, 'v').c_str());
        step.Add(row);
    }
    int fds[2];
    ASSERT_EQ(0, pipe(fds));
    RawDb reader(PathOf("t.db"));
    reader.Run("BEGIN; SELECT count(*) FROM t;");
    const pid_t pid = fork();
    if (pid == 0) {
        g_busyPipe = fds[1];
        dlog_set_sink(&ReportBusy, nullptr);
        _exit(DADatabase().Migrate(step, 1));
    }
    ASSERT_GT(pid, 0);
    char byte = 0;
    EXPECT_EQ(1, read(fds[0], &byte, 1));
    kill(pid, SIGKILL);
    EXPECT_EQ(pid, waitpid(pid, nullptr, 0));
    close(fds[0]);
    close(fds[1]);
    EXPECT_TRUE(FileExists("t.db-journal"));  // the step was written, not committed
    reader.Run("COMMIT");
    EXPECT_EQ("0|0|ok",
              reader.Query("SELECT (SELECT user_version FROM pragma_user_version), count(*), "
                           "(SELECT integrity_check FROM pragma_integrity_check) FROM t"));
    dlog_set_sink(&dlog_discard_sink, nullptr);
    EXPECT_EQ(0, DADatabase().Migrate(step, 1));
    dlog_set_sink(nullptr, nullptr);
    EXPECT_EQ("1|200", reader.Query("SELECT (SELECT user_version FROM pragma_user_version), count(*) FROM t"));
}

// A leaf page in the middle overwritten: Query returns the step's own code
// with its line, keeping the rows read before; Select keeps its rule (the
// step failure is logged, not returned).
TEST_F(Faults, QueryOverADamagedPageReturnsTheStepFailure)
{
    RawDb(PathOf("t.db"))
        .Run("PRAGMA page_size = 4096; CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); WITH RECURSIVE "
             "n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 200) INSERT INTO t "
             "SELECT i, printf('%0200d', i) FROM n;");
    std::fstream(PathOf("t.db"), std::ios::in | std::ios::out | std::ios::binary).seekp(4 * 4096)
        << std::string(4096, '\x7f');
    DAQueryRequest query;
    DASelectRequest select;
    DACursor cursor;
    LogCapture log;
    EXPECT_EQ(11, DADatabase().Query(At(query, Dir(), "t"), cursor));
    EXPECT_TRUE(cursor.GetCount() > 0 && cursor.GetCount() < 200) << cursor.GetCount();
    EXPECT_EQ(0, DADatabase().Select(At(select, Dir(), "t"), cursor));
    EXPECT_EQ((Strings{"6 DADatabasePasrser.cpp:ParseDatabase > SQLITE STEP ERROR!!! SQL logic error",
                       "6 DADatabase.cpp:Query > QUERY FAILED[11]: database disk image is malformed",
                       "6 DADatabasePasrser.cpp:ParseDatabase > SQLITE STEP ERROR!!! SQL logic error"}),
              Described(log));
}

// Quotes, format and comment characters, separators, UTF-8, control bytes
// (no NUL), SQL; sometimes empty, sometimes long.
std::string RandomText(std::mt19937& random)
{
    static const std::vector<std::string> pieces{"'",  "''",   "\"",   "%", "%s%n",  ";--", "/*",
                                                 "\\", "é",    "日本", "😀", "\x01",  "\t",  "\n",
                                                 "\r", "\x7f", " ",    "a", " AND ", ", ",  "DROP TABLE t;"};
    const auto pick = [&](std::size_t n) { return std::uniform_int_distribution<std::size_t>(0, n - 1)(random); };
    std::string text;
    for (const std::size_t length = pick(10) == 0 ? 3000 : pick(12); text.size() < length;) {
        text += pieces[pick(pieces.size())];
    }
    return text;
}

TEST_F(Faults, RandomTextsRoundTripAsValuesAndConditions)
{
    std::mt19937 random(1);
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k TEXT PRIMARY KEY, v TEXT)");
    DADatabase db;
    for (int i = 0; i < 60; ++i) {
        const std::string key = RandomText(random);
        const std::string first = RandomText(random);
        const std::string second = RandomText(random);
        // The rows whose key and value (if given) match.
        const auto find = [&](const std::string& value) {
            DASelectRequest select;
            DACursor cursor;
            At(select, Dir(), "t").SetWhere("k", key.c_str());
            select.SetWhere(value.empty() ? "k" : "v", value.c_str());  // k again: dropped
            EXPECT_EQ(0, db.Select(select, cursor));
            return Dump(cursor);
        };
        DAUpsertRequest upsert;
        At(upsert, Dir(), "t").SetData("k", key.c_str());
        upsert.SetData("v", first.c_str());
        ASSERT_EQ(0, db.Upsert(upsert));
        EXPECT_EQ((Strings{"k", "v", key, first}), find(first));
        DAUpdateRequest update;
        At(update, Dir(), "t").SetData("v", second.c_str());
        update.SetWhere("k", key.c_str());
        update.SetWhere("v", first.c_str());
        ASSERT_EQ(0, db.Update(update));
        EXPECT_EQ((Strings{"k", "v", key, second}), find(second));
        DADeleteRequest remove;
        At(remove, Dir(), "t").SetWhere("k", key.c_str());
        remove.SetWhere("v", second.c_str());
        ASSERT_EQ(0, db.Delete(remove));
        EXPECT_EQ(Strings(), find(""));
    }
}

TEST(CursorModel, RandomMovesAgreeWithIt)
{
    std::mt19937 random(2);
    const LogCapture log;
    std::size_t failures = 0;
    for (int round = 0; round < 100; ++round) {
        const auto draw = [&](int low, int high) { return std::uniform_int_distribution<int>(low, high)(random); };
        const int count = draw(-1, 4);  // -1: no column
        DACursor cursor;
        for (int r = -1; r < count; ++r) {
            r < 0 ? cursor.SetColumn("a"), cursor.SetColumn("b") : cursor.SetData("b", std::to_string(r).c_str());
        }
        int position = -1;
        int row = 0;
        std::string value;
        // Each operation with its model; every code but 0 logs one line.
        const std::pair<std::function<int()>, std::function<int()>> moves[] = {
            {[&] { return cursor.MoveToNext(); }, [&] { return ++position < count ? 0 : (position = count - 1, 3); }},
            {[&] { return cursor.MoveToPrev(); }, [&] { return --position >= 0 ? 0 : (position = 0, 2); }},
            {[&] { return cursor.MoveToPosition(row); },
             [&] { return row >= 0 && row < count ? (position = row, 0) : 1; }},
            {[&] { return cursor.MoveToFirst(), 0; }, [&] { return position = -1, 0; }},
            {[&] { return cursor.MoveToLast(), 0; }, [&] { return position = count, 0; }},
            {[&] { return cursor.GetString("b", value = "-"); },
             [&] { return position >= 0 && position < count && value == std::to_string(position) ? 0 : 1; }},
        };
        for (int step = 0; step < 60; ++step) {
            const int move = draw(0, 5);
            row = draw(-2, 5);
            const int got = moves[move].first();
            ASSERT_EQ(moves[move].second(), got) << "round " << round << " step " << step << " move " << move;
            ASSERT_EQ(position, cursor.GetPosition()) << "round " << round << " step " << step;
            failures += got != 0 ? 1 : 0;
        }
    }
    EXPECT_EQ(failures, log.Lines().size());
}

}  // namespace
