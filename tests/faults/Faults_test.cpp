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
#include "DatabaseTestUtil.h"
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
// bring array forms of their own, paired with each other). The deletes are
// not inlined: GCC would warn that free meets a new-expression.
void* operator new(std::size_t size)
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

// The cursor's names, then its values column by column.
Strings Dump(DACursor& cursor)
{
    Strings out;
    cursor.GetColumn(out);
    for (const std::string& name : Strings(out)) {
        const Strings values = ColumnValues(cursor, name.c_str());
        out.insert(out.end(), values.begin(), values.end());
    }
    return out;
}

class AllocFailure : public TempDirTest, public ::testing::WithParamInterface<Allocator> {};

TEST_P(AllocFailure, FailsCleanlyAtEveryAllocationAndStaysUsable)
{
    ASSERT_TRUE(g_installed);
    const Allocator allocator = GetParam();
    RawDb(PathOf("seed.db"))
        .Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT, n REAL); CREATE TABLE d(x);"
             "INSERT INTO t VALUES (1, 'a', 1.5), (2, 'b', 2.5);"
             "CREATE TABLE u(k INTEGER, w TEXT); INSERT INTO u VALUES (1, 'x');");
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
    const std::map<std::string, std::function<int()>> ops{
        {"CreateTable", [&] { return db.CreateTable(create); }},
        {"DropTable", [&] { return db.DropTable(At(drop, Dir(), "d")); }},
        // Fails anyway: exec's error text is then copied, which can fail too.
        {"DropMissing", [&] { return db.DropTable(At(drop, Dir(), "gone")); }},
        {"Update", [&] { return db.Update(update); }},
        {"Delete", [&] { return db.Delete(remove); }},
        {"Upsert", [&] { return db.Upsert(upsert); }},
        {"Select", [&] { return db.Select(select, cursor); }},
        {"JoinSelect", [&] { return db.JoinSelect(join, cursor); }},
        {"CheckExistTable", [&] { return db.CheckExistTable(join, "u", exists) + !exists; }},
        {"Fill", [&] {  // a request and the cursor filled, the cursor read: 0 when all reads back
             int k = 0;
             double n = 0;
             upsert.SetWhere("n", 2.5), cursor.Initialize(), cursor.SetColumn("k"), cursor.SetData("k", "7");
             return cursor.MoveToNext() + cursor.GetInt("k", k) + cursor.GetDouble("k", n) + (k * n == 49 ? 0 : 1);
         }}};
    // The file as a fresh connection sees it, the seed copied there first if asked.
    const auto state = [&](bool reseed) {
        const auto overwrite = std::filesystem::copy_options::overwrite_existing;
        reseed&& std::filesystem::copy_file(PathOf("seed.db"), PathOf("t.db"), overwrite);
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

INSTANTIATE_TEST_SUITE_P(Every, AllocFailure, ::testing::Values(kSqlite, kNew));

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
};

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
    const pid_t pid = fork();
    if (pid == 0) {
        const bool nobody = getuid() != 0 || (setgroups(0, nullptr) == 0 && setgid(65534) == 0 && setuid(65534) == 0);
        const rlimit limit{std::strcmp(c.name, "FileSizeLimit") == 0 ? before.size() : RLIM_INFINITY, RLIM_INFINITY};
        signal(SIGXFSZ, SIG_IGN);
        setrlimit(RLIMIT_FSIZE, &limit);
        const LogCapture log;
        DACursor cursor;
        DASelectRequest select;
        DAUpsertRequest upsert;
        At(upsert, dir, "t").SetData("v", std::string(20000, 'v').c_str());
        std::ofstream out(PathOf("out"));
        out << (!nobody || access(Dir().c_str(), W_OK) != 0        ? -1
                    : std::strstr(c.expected, "SELECT") != nullptr ? DADatabase().Select(At(select, dir, "t"), cursor)
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
}

INSTANTIATE_TEST_SUITE_P(Every, IoFaults, ::testing::ValuesIn(kIoCases),
                         [](const auto& info) { return std::string(info.param.name); });

using Faults = TempDirTest;

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
