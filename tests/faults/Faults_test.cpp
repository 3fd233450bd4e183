// Faults from outside the library: files it cannot write or read, a writer
// killed at random moments, and generated texts and cursor moves.
#include <grp.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <random>
#include <set>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "LogCapture.h"
#include "TempDirTest.h"
#include "dlog.h"

namespace {

// Files on tmpfs where there is one: the library syncs every commit.
[[maybe_unused]] const bool g_onTmpfs = access("/dev/shm", W_OK) == 0 && setenv("TMPDIR", "/dev/shm", 1) == 0;

std::string FileBytes(const std::string& path)
{
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();
    return bytes.str();
}

// Runs body in a forked child and returns what it returned (or "skip: why").
// Under root the child gives dir to nobody and becomes nobody first, so that
// file permissions apply.
std::string InChild(const std::string& dir, const std::function<std::string()>& body)
{
    int fds[2];
    const pid_t pid = pipe(fds) == 0 ? fork() : -1;
    if (pid == 0) {
        constexpr uid_t kNobody = 65534;
        std::error_code ignored;
        for (const auto& entry : std::filesystem::recursive_directory_iterator(dir, ignored)) {
            ignored.assign(chown(entry.path().c_str(), kNobody, kNobody), std::generic_category());
        }
        const bool dropped = getuid() != 0 ||
            (chown(dir.c_str(), kNobody, kNobody) == 0 && setgroups(0, nullptr) == 0 && setgid(kNobody) == 0 &&
             setuid(kNobody) == 0);
        const std::string out =
            dropped && access(dir.c_str(), W_OK) == 0 ? body() : "skip: cannot run as nobody in " + dir;
        _exit(write(fds[1], out.data(), out.size()) == static_cast<ssize_t>(out.size()) ? 0 : 1);
    }
    close(fds[1]);
    std::string out;
    char buffer[4096];
    for (ssize_t n; (n = read(fds[0], buffer, sizeof buffer)) > 0;) {
        out.append(buffer, static_cast<std::size_t>(n));
    }
    close(fds[0]);
    int status = 0;
    return waitpid(pid, &status, 0) == pid && status == 0 ? out : "child failed: " + out;
}

template <typename Request>
Request& At(Request& request, const std::string& dir, const char* table)
{
    request.SetPath(dir.c_str(), "t.db");
    request.SetTable(table);
    return request;
}

struct IoCase {
    const char* name;
    std::function<void(const std::string& dir, const std::string& file)> fault;
    rlim_t fileSizeLimit;  // 0: the file's size
    const char* expected;  // "code|line" of a Select (when the line says so) or an Upsert
};

void PrintTo(const IoCase& c, std::ostream* os)
{
    *os << c.name;
}

const IoCase kIoCases[] = {
    {"ReadOnlyFile", [](auto&, auto& file) { chmod(file.c_str(), 0444); }, RLIM_INFINITY,
     "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"ReadOnlyDirectory", [](auto& dir, auto&) { chmod(dir.c_str(), 0555); }, RLIM_INFINITY,
     "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"NotADatabase", [](auto&, auto& file) { std::ofstream(file) << std::string(5000, 'x'); }, RLIM_INFINITY,
     "26|6 DADatabase.cpp:Select > SELECT FAILED[26]: file is not a database"},
    {"Truncated", [](auto&, auto& file) { truncate(file.c_str(), 4096); }, RLIM_INFINITY,
     "11|6 DADatabase.cpp:Select > SELECT FAILED[11]: database disk image is malformed"},
    // The file may not grow: EFBIG, which SQLite reports as an I/O error
    // (ENOSPC would be SQLITE_FULL).
    {"FileSizeLimit", [](auto&, auto&) {}, 0, "10|6 DADatabase.cpp:Upsert > Upsert FAILED[10]: disk I/O error"},
};

class IoFaults : public TempDirTest, public ::testing::WithParamInterface<IoCase> {};

TEST_P(IoFaults, FailWithOneLineAndLeaveTheFile)
{
    const IoCase& c = GetParam();
    const std::string dir = PathOf("db");
    const std::string file = dir + "/t.db";
    mkdir(dir.c_str(), 0700);
    RawDb(file).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL "
                    "SELECT i + 1 FROM n WHERE i < 50) INSERT INTO t SELECT i, printf('%0500d', i) FROM n;");
    c.fault(dir, file);
    const std::string before = FileBytes(file);
    const std::string got = InChild(Dir(), [&] {
        const rlimit limit{c.fileSizeLimit == 0 ? before.size() : c.fileSizeLimit, RLIM_INFINITY};
        signal(SIGXFSZ, SIG_IGN);
        setrlimit(RLIMIT_FSIZE, &limit);
        const LogCapture log;
        DADatabase db;
        DACursor cursor;
        DASelectRequest select;
        DAUpsertRequest upsert;
        At(upsert, dir, "t").SetData("v", std::string(20000, 'v').c_str());
        const bool query = std::string(c.expected).find("SELECT") != std::string::npos;
        std::string out = std::to_string(query ? db.Select(At(select, dir, "t"), cursor) : db.Upsert(upsert));
        for (const std::string& line : Described(log)) {
            out += "|" + line;
        }
        return out;
    });
    chmod(dir.c_str(), 0700);
    if (got.rfind("skip:", 0) == 0) {
        GTEST_SKIP() << got;
    }
    EXPECT_EQ(c.expected, got);
    EXPECT_EQ(before, FileBytes(file));
}

INSTANTIATE_TEST_SUITE_P(Every, IoFaults, ::testing::ValuesIn(kIoCases),
                         [](const auto& info) { return std::string(info.param.name); });

using Faults = TempDirTest;

TEST_F(Faults, KilledWriterLosesNoAcknowledgedRow)
{
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    std::mt19937 random(20261123);
    std::set<int> acknowledged;
    for (int round = 0; round < 6; ++round) {
        int fds[2];
        const pid_t pid = pipe(fds) == 0 ? fork() : -1;
        for (int k = round * 1000000; pid == 0; ++k) {  // the writer: reports each row whose Upsert returned 0
            dlog_set_sink(&dlog_discard_sink, nullptr);
            DAUpsertRequest request;
            At(request, Dir(), "t").SetData("k", k);
            request.SetData("v", std::string(static_cast<std::size_t>(k % 900), 'v').c_str());
            if (DADatabase().Upsert(request) == 0 && write(fds[1], &k, sizeof k) != sizeof k) {
                _exit(1);
            }
        }
        ASSERT_GT(pid, 0);
        close(fds[1]);
        usleep(std::uniform_int_distribution<useconds_t>(20000, 150000)(random));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        for (int k = 0; read(fds[0], &k, sizeof k) == sizeof k;) {
            acknowledged.insert(k);
        }
        close(fds[0]);
        RawDb db(PathOf("t.db"));
        EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
        std::istringstream stored(db.Query("SELECT group_concat(k, ' ') FROM t"));
        std::set<int> rows{std::istream_iterator<int>(stored), std::istream_iterator<int>()};
        for (const int k : acknowledged) {
            ASSERT_EQ(1U, rows.count(k)) << "row " << k << " acknowledged but lost in round " << round;
        }
    }
    EXPECT_GT(acknowledged.size(), 6U);
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
        SCOPED_TRACE("texts [" + key + "] [" + first + "] [" + second + "]");
        // "k=v#rows" of the rows whose key and value (if given) match.
        const auto find = [&](const std::string& value) {
            DASelectRequest select;
            At(select, Dir(), "t").SetWhere("k", key.c_str());
            select.SetWhere(value.empty() ? "k" : "v", value.c_str());  // k again: dropped
            DACursor cursor;
            EXPECT_EQ(0, db.Select(select, cursor));
            const Strings keys = ColumnValues(cursor, "k");
            const Strings values = ColumnValues(cursor, "v");
            return keys.empty() ? std::string() : keys[0] + "=" + values[0] + "#" + std::to_string(keys.size());
        };
        DAUpsertRequest upsert;
        At(upsert, Dir(), "t").SetData("k", key.c_str());
        upsert.SetData("v", first.c_str());
        ASSERT_EQ(0, db.Upsert(upsert));
        EXPECT_EQ(key + "=" + first + "#1", find(first));
        DAUpdateRequest update;
        At(update, Dir(), "t").SetData("v", second.c_str());
        update.SetWhere("k", key.c_str());
        update.SetWhere("v", first.c_str());
        ASSERT_EQ(0, db.Update(update));
        EXPECT_EQ(key + "=" + second + "#1", find(second));
        DADeleteRequest remove;
        At(remove, Dir(), "t").SetWhere("k", key.c_str());
        remove.SetWhere("v", second.c_str());
        ASSERT_EQ(0, db.Delete(remove));
        EXPECT_EQ("", find(""));
        EXPECT_EQ("0", RawDb(PathOf("t.db")).Query("SELECT count(*) FROM t"));
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
        for (int step = 0; step < 60; ++step) {
            const int move = draw(0, 5);
            const int row = draw(-2, 5);
            std::string value = "untouched";
            const int got = move == 0 ? cursor.MoveToNext()
                : move == 1           ? cursor.MoveToPrev()
                : move == 2           ? cursor.MoveToPosition(row)
                : move == 3           ? (cursor.MoveToFirst(), 0)
                : move == 4           ? (cursor.MoveToLast(), 0)
                                      : cursor.GetString("b", value);
            // The model; every code but 0 logs one line.
            const bool valid = position >= 0 && position < count;
            const int expected = move == 0 ? (++position < count ? 0 : (position = count - 1, 3))
                : move == 1                ? (--position >= 0 ? 0 : (position = 0, 2))
                : move == 2                ? (row >= 0 && row < count ? (position = row, 0) : 1)
                : move == 3                ? (position = -1, 0)
                : move == 4                ? (position = count, 0)
                                           : (valid ? 0 : 1);
            ASSERT_EQ(expected, got) << "round " << round << " step " << step << " move " << move;
            ASSERT_EQ(position, cursor.GetPosition()) << "round " << round << " step " << step;
            EXPECT_EQ(move == 5 && valid ? std::to_string(position) : "untouched", value);
            failures += expected != 0 ? 1 : 0;
        }
    }
    EXPECT_EQ(failures, log.Lines().size());
}

}  // namespace
