// Files the library cannot write or read: each operation returns SQLite's
// code, logs exactly one error line and leaves the file's bytes as they were.
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <functional>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "FaultTestUtil.h"
#include "LogCapture.h"
#include "TempDirTest.h"

namespace {

struct IoCase {
    const char* name;
    bool query;  // Select instead of Upsert
    std::function<void(const std::string& dir, const std::string& file)> fault;
    rlim_t fileSizeLimit;
    const char* expected;  // "code|line"
};

const IoCase kCases[] = {
    {"ReadOnlyFile", false, [](const std::string&, const std::string& file) { chmod(file.c_str(), 0444); },
     RLIM_INFINITY, "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"ReadOnlyDirectory", false, [](const std::string& dir, const std::string&) { chmod(dir.c_str(), 0555); },
     RLIM_INFINITY, "8|6 DADatabase.cpp:Upsert > Upsert FAILED[8]: attempt to write a readonly database"},
    {"NotADatabase", true,
     [](const std::string&, const std::string& file) { std::ofstream(file) << std::string(5000, 'x'); }, RLIM_INFINITY,
     "26|6 DADatabase.cpp:Select > SELECT FAILED[26]: file is not a database"},
    {"Truncated", true, [](const std::string&, const std::string& file) { truncate(file.c_str(), 4096); },
     RLIM_INFINITY, "11|6 DADatabase.cpp:Select > SELECT FAILED[11]: database disk image is malformed"},
    // The file may not grow: EFBIG, which SQLite reports as an I/O error
    // (ENOSPC would be SQLITE_FULL).
    {"FileSizeLimit", false, [](const std::string&, const std::string&) {}, 0,
     "10|6 DADatabase.cpp:Upsert > Upsert FAILED[10]: disk I/O error"},
};

void PrintTo(const IoCase& c, std::ostream* os)
{
    *os << c.name;
}

class IoFaults : public TempDirTest, public ::testing::WithParamInterface<IoCase> {};

TEST_P(IoFaults, FailsWithOneLineAndLeavesTheFile)
{
    const IoCase& c = GetParam();
    const std::string dir = PathOf("db");
    const std::string file = dir + "/t.db";
    mkdir(dir.c_str(), 0700);
    RawDb(file).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT);"
                    "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 50)"
                    "INSERT INTO t SELECT i, printf('%0500d', i) FROM n;");
    c.fault(dir, file);
    const std::string before = FileBytes(file);
    const std::string got = InChild(Dir(), [&] {
        rlimit limit{c.fileSizeLimit == 0 ? before.size() : c.fileSizeLimit, RLIM_INFINITY};
        signal(SIGXFSZ, SIG_IGN);
        setrlimit(RLIMIT_FSIZE, &limit);
        const LogCapture log;
        DADatabase db;
        DACursor cursor;
        DASelectRequest select;
        DAUpsertRequest upsert;
        select.SetPath(dir.c_str(), "t.db");
        select.SetTable("t");
        upsert.SetPath(dir.c_str(), "t.db");
        upsert.SetTable("t");
        upsert.SetData("v", std::string(20000, 'v').c_str());
        const int rc = c.query ? db.Select(select, cursor) : db.Upsert(upsert);
        std::string out = std::to_string(rc);
        for (const std::string& line : Described(log)) {
            out += "|" + line;
        }
        return out;
    });
    if (got.rfind("skip:", 0) == 0) {
        GTEST_SKIP() << got;
    }
    EXPECT_EQ(c.expected, got);
    EXPECT_EQ(before, FileBytes(file));
    chmod(dir.c_str(), 0700);
}

INSTANTIATE_TEST_SUITE_P(Every, IoFaults, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
