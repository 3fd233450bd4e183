// Schema changes on real files: indexes, added columns, versions and the
// migrations that move them, and the space of a file.
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

const char* const kFile = "t.db";

std::string Line(int priority, const std::string& function, const std::string& message)
{
    return Logged(priority, "DADatabase.cpp", function, message);
}

class DASchemaTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        At(m_location, Dir());
    }
    void Seed(const std::string& sql) { RawDb(PathOf(kFile)).Run(sql); }
    std::string Query(const std::string& sql) { return RawDb(PathOf(kFile)).Query(sql); }

    // A step at the file: its requests are added in order.
    template <typename... Requests>
    DABatchRequest& Step(Requests&... requests)
    {
        At(m_step, Dir()).Clear();
        EXPECT_EQ(0, (0 + ... + m_step.Add(requests)));
        return m_step;
    }

    DADatabase m_db;
    DABasePath m_location;
    DABatchRequest m_step;
};

// An index: creating it again changes nothing, on a missing table it
// fails, a query the library writes uses it. An added column: rows already
// there read its default (with the column's affinity) or NULL; one that
// exists fails with SQLite's text.
TEST_F(DASchemaTest, CreateIndexAndAddColumn)
{
    Seed("CREATE TABLE events(ts INTEGER, type TEXT); INSERT INTO events VALUES (1, 'a');");
    DACreateIndexRequest index;
    At(index, Dir(), "events").SetName("events_ts");
    index.AddColumn("ts", true);
    index.AddColumn("type");
    DAAddColumnRequest level;
    At(level, Dir(), "events").SetColumn("level", "INTEGER");
    level.SetDefault("0");
    DAAddColumnRequest note;
    At(note, Dir(), "events").SetColumn("note", "TEXT");
    LogCapture log;
    EXPECT_EQ(0, m_db.CreateIndex(index));
    EXPECT_EQ(0, m_db.CreateIndex(index));
    EXPECT_EQ(0, m_db.AddColumn(level) + m_db.AddColumn(note));
    EXPECT_EQ(1, m_db.AddColumn(level));
    At(index, Dir(), "nope").SetName("nope_ts");
    EXPECT_EQ(1, m_db.CreateIndex(index));
    const std::string indexed = Line(4, "CreateIndex", "CreateIndex SUCCESS[0]");
    const std::string added = Line(4, "AddColumn", "AddColumn SUCCESS[0]");
    EXPECT_EQ((Strings{indexed, indexed, added, added,
                       Line(6, "AddColumn", "AddColumn FAILED[1]: duplicate column name: level"),
                       Line(6, "CreateIndex", "CreateIndex FAILED[1]: no such table: main.nope")}),
              Described(log));
    EXPECT_EQ("1|a|0|integer|NULL", Query("SELECT ts, type, level, typeof(level), note FROM events"));
    DASelectRequest select;
    At(select, Dir(), "events").SetWhere("ts", 5);
    std::string sql;
    DASqlGenerator().GetSelectSql(select, sql);
    EXPECT_EQ("3|0|0|SEARCH events USING INDEX events_ts (ts=?)", Query("EXPLAIN QUERY PLAN " + sql));
}

// One step after another, each once; a step too new for the file, a
// version below 1 and a failing step change nothing.
TEST_F(DASchemaTest, MigrateRunsEachStepOnceInVersionOrder)
{
    int version = -1;
    EXPECT_EQ(0, m_db.GetVersion(m_location, version));
    EXPECT_EQ(0, version);
    DACreateRequest create;
    At(create, Dir(), "events").SetColumnKey("ts", "INTEGER");
    DAAddColumnRequest level;
    At(level, Dir(), "events").SetColumn("level", "INTEGER");
    DAUpsertRequest marker;
    At(marker, Dir(), "events").SetData("ts", 1);
    DACreateIndexRequest broken;
    At(broken, Dir(), "nope").SetName("nope_x");
    broken.AddColumn("x");

    LogCapture log;
    EXPECT_EQ(21, m_db.Migrate(Step(level), 2));
    EXPECT_EQ(0, m_db.Migrate(Step(create, marker), 1));
    EXPECT_EQ(0, m_db.Migrate(Step(create, marker), 1));
    EXPECT_EQ(0, m_db.Migrate(Step(level), 2));
    EXPECT_EQ(1, m_db.Migrate(Step(marker, broken), 3));
    EXPECT_EQ(21, m_db.Migrate(Step(), 0));
    EXPECT_EQ(0, m_db.Migrate(Step(), 3));
    EXPECT_EQ((Strings{Line(6, "Migrate", "Migrate FAILED[21]: file at version 0, step for version 2"),
                       Line(4, "Migrate", "Migrate SUCCESS[0]: version 1"),
                       Line(4, "Migrate", "Migrate SKIPPED: file at version 1"),
                       Line(4, "Migrate", "Migrate SUCCESS[0]: version 2"),
                       Line(6, "Migrate", "Migrate FAILED[1] at 2/2: no such table: main.nope"),
                       Line(6, "Migrate", "Migrate FAILED[21]: step for version 0, versions start at 1"),
                       Line(4, "Migrate", "Migrate SUCCESS[0]: version 3")}),
              Described(log));
    EXPECT_EQ(0, m_db.GetVersion(m_location, version));
    EXPECT_EQ(3, version);
    EXPECT_EQ("3;_ID|ts|level;1|1|NULL",
              Query("PRAGMA user_version") + ";" +
                  Query("SELECT group_concat(name, '|') FROM pragma_table_info('events')") + ";" +
                  Query("SELECT * FROM events"));
}

// Half the rows deleted: their pages are free, and Compact gives them back
// to the file system with every other row kept. Reads of a file that is
// not a database leave their outputs alone.
TEST_F(DASchemaTest, CompactReturnsTheSpaceOfDeletedRows)
{
    Seed("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 "
         "FROM n WHERE i < 4000) INSERT INTO t SELECT i, printf('%0200d', i) FROM n; DELETE FROM t WHERE k > 2000;");
    const std::string rows = Query("SELECT count(*), sum(k), sum(length(v)) FROM t");
    std::int64_t fileBytes = -1;
    std::int64_t freeBytes = -1;
    EXPECT_EQ(0, m_db.GetSpace(m_location, fileBytes, freeBytes));
    const auto size = static_cast<std::int64_t>(std::filesystem::file_size(PathOf(kFile)));
    EXPECT_EQ(size, fileBytes);
    EXPECT_GT(freeBytes, size * 2 / 5);
    LogCapture log;
    EXPECT_EQ(0, m_db.Compact(m_location));
    std::int64_t freeAfter = -1;
    EXPECT_EQ(0, m_db.GetSpace(m_location, fileBytes, freeAfter));
    EXPECT_EQ(0, freeAfter);
    EXPECT_LE(fileBytes, size - freeBytes);
    EXPECT_EQ(static_cast<std::int64_t>(std::filesystem::file_size(PathOf(kFile))), fileBytes);
    EXPECT_EQ(rows, Query("SELECT count(*), sum(k), sum(length(v)) FROM t"));

    std::ofstream(PathOf("text.db")) << std::string(5000, 'x');
    m_location.SetPath(Dir().c_str(), "text.db");
    int version = -1;
    EXPECT_EQ(26, m_db.GetSpace(m_location, fileBytes, freeAfter));
    EXPECT_EQ(26, m_db.GetVersion(m_location, version));
    EXPECT_EQ(-1, version);
    EXPECT_EQ(0, freeAfter);
    EXPECT_EQ((Strings{Line(4, "Compact", "Compact SUCCESS[0]"),
                       Line(6, "GetSpace", "GetSpace FAILED[26]: file is not a database"),
                       Line(6, "GetVersion", "GetVersion FAILED[26]: file is not a database")}),
              Described(log));
}

}  // namespace
