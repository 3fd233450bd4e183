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
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <new>
#include <optional>
#include <random>
#include <tuple>
#include <utility>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "FaultFs.h"
#include "Operations.h"
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

// The fault kinds; each is one loop over the table of operations, through
// a connection source (per call or a session).
enum Kind { kSqliteMalloc, kOperatorNew, kIoError, kKill, kPowerCut };
const char* const kKindNames[] = {"sqlite_malloc", "operator_new", "io_error", "kill", "power_cut"};

// What a row gives without a fault.
struct Outcome {
    int rc;
    Strings lines;
    std::string content;
    Strings cells;
    std::string bytes;  // of the file, which has the content when no journal or log is beside it
};

class FaultDriver : public TempDirTest, public ::testing::WithParamInterface<std::tuple<Kind, bool>> {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        m_seed = PathOf("seed.db");
        RawDb(m_seed).Run(kSeed);
        m_before = Content(Seeded(PathOf("before")));
        m_beforeBytes = FileBytes(m_seed);
        dlog_set_sink(&Sink, nullptr);
    }
    void TearDown() override
    {
        dlog_set_sink(nullptr, nullptr);
        TempDirTest::TearDown();
    }

    // Runs row at dir, through a session opened there first (its failure is
    // the result; it stays open) or per call.
    int Run(const Operation& row, const std::string& dir, DASession& session, DACursor& cursor) const
    {
        DADatabase db;
        Target target{&db, nullptr};
        if (std::get<1>(GetParam())) {
            DABasePath at;
            const int rc = session.Open(At(at, dir));
            if (rc != SQLITE_OK) {
                return rc;
            }
            target = {nullptr, &session};
        }
        return row.run(target, dir, cursor);
    }

    // The row without a fault, on a fresh copy of the seed at dir.
    Outcome Normal(const Operation& row, const std::string& dir) const
    {
        mkdir(dir.c_str(), 0700);
        Reseed(dir, m_seed);
        DASession session;
        DACursor cursor;
        g_lines.clear();
        const int rc = Run(row, dir, session, cursor);
        session.Close();
        return {rc, std::exchange(g_lines, {}), Content(dir), Cells(cursor), FileBytes(dir + "/t.db")};
    }

    // A write through the same source (the session if it is open) that
    // another connection sees: no fault leaves a transaction open.
    void ExpectWriteSeen(const std::string& dir, DASession& session) const
    {
        DACreateRequest mark;
        At(mark, dir, "mark").SetColumnKey("x", "TEXT");
        DABasePath at;
        const bool held = std::get<1>(GetParam());
        if (held && session.IsOpen()) {  // open only with the log in effect
            EXPECT_EQ("wal", RawDb(dir + "/t.db").Query("PRAGMA journal_mode"));
        }
        EXPECT_EQ(0,
                  !held ? DADatabase().CreateTable(mark)
                        : (session.IsOpen() ? 0 : session.Open(At(at, dir))) + session.CreateTable(mark));
        if (held) {
            EXPECT_EQ("1", RawDb(dir + "/t.db").Query("SELECT count(*) FROM sqlite_master WHERE name = 'mark'"));
        }
        session.Close();
    }

    // What must hold once a fault met row (the fault disarmed): a code, the
    // normal one only when the row ran through; each line one the row
    // writes anyway or one error line of the fault; the file as before the
    // row or as after it, as after it once the row gave its code; when it
    // also wrote its lines, the rows read a prefix of the normal ones (a
    // text SQLite could not give read as ""); the source usable. Returns the
    // cells read as "".
    int Check(const Operation& row, const Outcome& normal, int rc, const Strings& lines, const Strings& cells,
              const std::string& dir, DASession& session) const
    {
        // An error line a fault may add: SQLite's text of the fault (of 19
        // without its detail, which was not allocated), a failed step or
        // conversion, a watch that could not open.
        const auto faultLine = [](const std::string& line) {
            const auto ends = [&](const std::string& end) {
                return line.size() >= end.size() && line.compare(line.size() - end.size(), end.size(), end) == 0;
            };
            return line[0] != '6' || ends("out of memory") || ends("disk I/O error") ||
                ends("unable to open database file") || ends("FAILED[19]: constraint failed") ||
                line == "6 WATCH NOT OPEN" || line.rfind("6 SQLITE STEP ERROR!!!", 0) == 0 ||
                line.rfind("6 CONVERT TO INT ERROR!!!", 0) == 0 || line.rfind("6 CONVERT TO DOUBLE ERROR!!!", 0) == 0;
        };
        for (const std::string& line : lines) {
            EXPECT_TRUE(faultLine(line) || std::count(normal.lines.begin(), normal.lines.end(), line)) << line;
        }
        const std::string bytes = FileBytes(dir + "/t.db");
        const bool alone =
            !std::filesystem::exists(dir + "/t.db-journal") && !std::filesystem::exists(dir + "/t.db-wal");
        const std::string now = alone && bytes == m_beforeBytes ? m_before
            : alone && bytes == normal.bytes                    ? normal.content
                                                                : Content(dir);
        EXPECT_TRUE(now == m_before || now == normal.content || Whole(row, now)) << now;
        EXPECT_TRUE(rc != normal.rc || now == normal.content) << now;
        int fallbacks = 0;
        // A read whose step failed gives 0 and its line: what a row noted
        // from it may differ.
        const bool ranThrough =
            rc == normal.rc && (lines == normal.lines || normal.cells.empty() || normal.cells[0] != "noted");
        EXPECT_TRUE(!ranThrough || cells.size() <= normal.cells.size());
        for (std::size_t i = 0; ranThrough && i < cells.size() && i < normal.cells.size(); ++i) {
            EXPECT_TRUE(cells[i] == normal.cells[i] || cells[i].empty()) << i << ": " << cells[i];
            fallbacks += cells[i] != normal.cells[i] ? 1 : 0;
        }
        if (std::get<1>(GetParam())) {  // a per-call visit leaves nothing behind that the descriptors do not show
            ExpectWriteSeen(dir, session);
        }
        return fallbacks;
    }

    // A file a row of many steps may leave: whole, at one of its steps.
    static bool Whole(const Operation& row, const std::string& content)
    {
        return (row.flags & kSteps) != 0 && content.rfind("ok|", 0) == 0;
    }

    // Kills a process running every row in turn (each in its own directory,
    // reporting each row once it returned) at a random moment, on a file
    // system that loses what was not synced when power is cut: the rows
    // reported are in their files, the one in flight is there whole or not
    // at all, the others untouched.
    void Crash(bool powerCut)
    {
        std::vector<Outcome> normal;
        const auto start = std::chrono::steady_clock::now();
        for (const Operation& row : kOperations) {
            normal.push_back(Normal(row, PathOf(row.name)));
        }
        const auto pass =
            std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() - start);
        std::mt19937 random(powerCut ? 3 : 4);
        for (int round = 0; round < 6; ++round) {
            for (const Operation& row : kOperations) {
                Reseed(PathOf(row.name), m_seed);
            }
            int fds[2];
            const pid_t pid = pipe(fds) == 0 ? fork() : -1;
            if (pid == 0) {
                std::optional<faultfs::Installed> fs;
                if (powerCut) {
                    fs.emplace();
                }
                for (const Operation& row : kOperations) {
                    DASession& session = *new DASession;  // never closed: what a row returned is already synced
                    DACursor cursor;
                    Run(row, PathOf(row.name), session, cursor);
                    if (write(fds[1], "x", 1) != 1) {
                        _exit(1);
                    }
                }
                _exit(0);
            }
            ASSERT_GT(pid, 0);
            close(fds[1]);
            usleep(std::uniform_int_distribution<useconds_t>(0, pass.count())(random));
            kill(pid, SIGKILL);
            waitpid(pid, nullptr, 0);
            std::size_t done = 0;
            for (char byte = 0; read(fds[0], &byte, 1) == 1;) {
                ++done;
            }
            close(fds[0]);
            for (std::size_t i = 0; i < normal.size(); ++i) {
                SCOPED_TRACE(std::string(kOperations[i].name) + ", " + std::to_string(done) + " done");
                const std::string dir = PathOf(kOperations[i].name);
                const std::string now = Content(dir);
                EXPECT_TRUE(i < done ? now == normal[i].content
                                     : now == m_before ||
                                    (i == done && (now == normal[i].content || Whole(kOperations[i], now))))
                    << now;
            }
            DASession session;
            ExpectWriteSeen(PathOf(kOperations[std::min(done, normal.size() - 1)].name), session);
        }
    }

    std::string m_seed;
    std::string m_before;
    std::string m_beforeBytes;
};

}  // namespace

// Allocation failure (SQLite's allocator or operator new) and an I/O error
// (a write, truncation or sync failing), each at every point of every row
// in turn, then the power cut; no descriptor or memory is left behind.
TEST_P(FaultDriver, EveryRowSurvivesTheFault)
{
    ASSERT_TRUE(g_installed);
    const Kind kind = std::get<0>(GetParam());
    if (kind == kKill || kind == kPowerCut) {
        Crash(kind == kPowerCut);
        return;
    }
    int fallbacks = 0;
    for (const Operation& row : kOperations) {
        if ((row.flags & kHeavy) != 0 && kind == kSqliteMalloc) {
            continue;
        }
        const std::string dir = PathOf(row.name);
        const Outcome normal = Normal(row, dir);
        bool reached = true;
        for (int n = 1; reached; ++n) {
            SCOPED_TRACE(std::string(row.name) + ", fault " + std::to_string(n));
            Reseed(dir, m_seed);
            const int descriptors = OpenDescriptorCount();
            const sqlite3_int64 memory = sqlite3_memory_used();
            DASession session;
            DACursor cursor;
            int rc = -1;  // std::bad_alloc
            if (kind == kIoError) {
                std::string seen;
                {
                    const faultfs::Installed fs;
                    faultfs::g_state.failAt = n;
                    rc = Run(row, dir, session, cursor);
                    reached = faultfs::g_state.calls >= n;
                    faultfs::g_state.failAt = 0;
                    const Strings lines = std::exchange(g_lines, {});
                    fallbacks += Check(row, normal, rc, lines, Cells(cursor), dir, session);
                    seen = Content(dir);
                }
                EXPECT_EQ(seen, Content(dir)) << "after a power cut";
            } else {
                std::tie(g_lines, g_calls, g_armed, g_failAt) =
                    std::make_tuple(Strings(), 0, kind == kSqliteMalloc ? kSqlite : kNew, n);
                try {
                    rc = Run(row, dir, session, cursor);
                } catch (const std::bad_alloc&) {
                }
                g_failAt = 0;
                reached = g_calls >= n;
                const Strings lines = std::exchange(g_lines, {});
                fallbacks += Check(row, normal, rc, lines, Cells(cursor), dir, session);
            }
            EXPECT_EQ(descriptors, OpenDescriptorCount());
            EXPECT_EQ(memory, sqlite3_memory_used());
        }
    }
    EXPECT_TRUE(fallbacks > 0 || kind != kSqliteMalloc);
}

INSTANTIATE_TEST_SUITE_P(Every, FaultDriver,
                         ::testing::Combine(::testing::Values(kSqliteMalloc, kOperatorNew, kIoError, kKill, kPowerCut),
                                            ::testing::Bool()),
                         [](const auto& info) {
                             return std::string(kKindNames[std::get<0>(info.param)]) +
                                 (std::get<1>(info.param) ? "_session" : "_per_call");
                         });

namespace {

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
    ExitOf(Spawn([&] {
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
        return 0;
    }));
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

// Random moves and reads of cursors of -1 (no column) to 4 rows against a
// model of them: each code, position and failure line.
TEST(CursorModel, RandomMovesAgreeWithIt)
{
    std::mt19937 random(2);
    const LogCapture log;
    Strings expected;  // the line of each failure
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
            {[&] { return cursor.GetString("b", value = "-"); },  // a failed read leaves the output alone
             [&] {
                 return position >= 0 && position < count ? (value == std::to_string(position) ? 0 : 9)
                                                          : (value == "-" ? 1 : 9);
             }},
        };
        const std::string lines[] = {"4 DACursor.cpp:MoveToNext > Last Row",
                                     "4 DACursor.cpp:MoveToPrev > First Row",
                                     "6 DACursor.cpp:MoveToPosition > Invalid Position",
                                     "",
                                     "",
                                     count < 0 ? "6 DACursor.cpp:GetString > NO MATCHED ERROR!!!"
                                               : "6 DACursor.cpp:GetString > CURSOR RANGE ERROR!!!"};
        for (int step = 0; step < 60; ++step) {
            const int move = draw(0, 5);
            row = draw(-2, 5);
            const int got = moves[move].first();
            ASSERT_EQ(moves[move].second(), got) << "round " << round << " step " << step << " move " << move;
            ASSERT_EQ(position, cursor.GetPosition()) << "round " << round << " step " << step;
            if (got != 0) {
                expected.push_back(lines[move]);
            }
        }
        cursor.Initialize();  // as if new
        Strings names;
        EXPECT_EQ((std::vector<int>{-1, -1, 1}),
                  (std::vector<int>{cursor.GetCount(), cursor.GetPosition(), cursor.GetColumn(names)}));
    }
    EXPECT_EQ(expected, Described(log));
}

}  // namespace
