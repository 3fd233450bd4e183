#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

int ModeOf(const std::string& path)
{
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? static_cast<int>(status.st_mode & 0777) : -1;
}

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

// New files give others nothing: per-call 0640 less the umask, a session's
// exactly SetFileMode's, -wal and -shm alike; an existing file keeps its
// mode and so do its logs.
TEST_F(Safety, CreatedFilesArePrivate)
{
    const LogCapture quiet;
    for (const mode_t mask : {022, 077}) {
        const mode_t old = umask(mask);
        DACreateRequest create;
        const std::string visit = "visit" + std::to_string(mask) + ".db";
        create.SetPath(Dir().c_str(), visit.c_str());
        create.SetTable("t");
        create.SetColumnKey("v", "TEXT");
        EXPECT_EQ(0, DADatabase().CreateTable(create));
        DACreateRequest table;  // no location: a session's file
        table.SetTable("t");
        table.SetColumnKey("v", "TEXT");
        for (const int mode : {-1, 0660}) {
            const std::string name = "s" + std::to_string(mask) + "_" + std::to_string(mode) + ".db";
            DASession session;
            session.SetFileMode(mode);
            DABasePath location;
            location.SetPath(Dir().c_str(), name.c_str());
            ASSERT_EQ(0, session.Open(location));
            DAUpsertRequest upsert;  // no location: the session's file
            upsert.SetTable("t");
            upsert.SetData("v", "x");
            ASSERT_EQ(0, session.CreateTable(table) + session.Upsert(upsert));
            const int expected = mode >= 0 ? mode : 0640 & ~static_cast<int>(mask);
            for (const char* suffix : {"", "-wal", "-shm"}) {
                EXPECT_EQ(expected, ModeOf(PathOf(name + suffix))) << name << suffix;
            }
        }
        umask(old);
        EXPECT_EQ(0640 & ~static_cast<int>(mask), ModeOf(PathOf(visit))) << mask;
    }
    RawDb(PathOf("old.db")).Run("CREATE TABLE t(v TEXT)");
    chmod(PathOf("old.db").c_str(), 0644);
    DASession session;
    session.SetFileMode(0600);
    DABasePath location;
    location.SetPath(Dir().c_str(), "old.db");
    ASSERT_EQ(0, session.Open(location));
    DAUpsertRequest upsert;
    upsert.SetTable("t");
    upsert.SetData("v", "x");
    ASSERT_EQ(0, session.Upsert(upsert));
    EXPECT_EQ(0644, ModeOf(PathOf("old.db")));
    EXPECT_EQ(0644, ModeOf(PathOf("old.db-wal")));
}

namespace {

// 2,000 rows of ~100 bytes in 4 KiB pages, an index on v.
const char* const kRows = "PRAGMA page_size = 4096; PRAGMA user_version = 7;"
                          "CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); CREATE INDEX t_v ON t(v);"
                          "CREATE VIEW odd AS SELECT * FROM t WHERE k % 2;"
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
    {"none", "", "0:0 0:0 | 0 t:2000:0 7|3|ok|2000 | 0 0:0"},
    {"table_page", "SELECT pageno FROM dbstat WHERE name = 't' AND pagetype = 'leaf' LIMIT 1 OFFSET 20",
     "0:1 0:1 | 0 t:1963:37 7|3|ok|1963 | 11 0:1"},
    {"index_page", "SELECT pageno FROM dbstat WHERE name = 't_v' AND pagetype = 'leaf' LIMIT 1 OFFSET 10",
     "0:1 0:1 | 0 t:2000:0 7|3|ok|2000 | 0 0:0"},
    // The schema is gone with the first page: nothing can be read, nothing is created.
    {"first_page", "SELECT 1", "26:1 26:1 | 26 | 26 26:1"},
    // SQLite refuses a file shorter than its header says; salvage reads what is there.
    {"truncated", nullptr, "11:1 11:1 | 0 t:999:-1 7|3|ok|999 | 11 11:1"},
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
        EXPECT_EQ(ModeOf(file) & ~07, ModeOf(PathOf("salvaged.db")));
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
