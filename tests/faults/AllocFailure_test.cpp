// Every operation with its Nth allocation failing, for N = 1, 2, ... until it
// runs through: once in SQLite's allocator, once in operator new. This
// program replaces both, so it is an executable of its own.
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <map>
#include <new>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sqlite3.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "FaultTestUtil.h"
#include "TempDirTest.h"
#include "dlog.h"

namespace {

enum Allocator { kSqlite, kNew };
int g_failAt = 0;  // the allocation to fail, counted from 1 while armed; 0: disarmed
int g_calls = 0;
Allocator g_armed = kSqlite;

bool FailNow(Allocator allocator)
{
    return g_failAt > 0 && g_armed == allocator && ++g_calls == g_failAt;
}

sqlite3_mem_methods g_default;
void* Malloc(int size)
{
    return FailNow(kSqlite) ? nullptr : g_default.xMalloc(size);
}
void* Realloc(void* old, int size)
{
    return FailNow(kSqlite) ? nullptr : g_default.xRealloc(old, size);
}
// Installed before SQLite's first use; no lookaside, so that every
// allocation of a connection goes through Malloc.
const bool g_installed = [] {
    sqlite3_mem_methods methods{};
    const bool got = sqlite3_config(SQLITE_CONFIG_GETMALLOC, &g_default) == SQLITE_OK;
    methods = g_default;
    methods.xMalloc = Malloc;
    methods.xRealloc = Realloc;
    return got && sqlite3_config(SQLITE_CONFIG_MALLOC, &methods) == SQLITE_OK &&
        sqlite3_config(SQLITE_CONFIG_LOOKASIDE, 0, 0) == SQLITE_OK;
}();

void* Allocate(std::size_t size)
{
    void* block = FailNow(kNew) ? nullptr : std::malloc(size != 0 ? size : 1);
    if (block == nullptr) {
        throw std::bad_alloc();
    }
    return block;
}

}  // namespace

void* operator new(std::size_t size)
{
    return Allocate(size);
}
void* operator new[](std::size_t size)
{
    return Allocate(size);
}
void operator delete(void* block) noexcept
{
    std::free(block);
}
void operator delete[](void* block) noexcept
{
    std::free(block);
}
void operator delete(void* block, std::size_t /*size*/) noexcept
{
    std::free(block);
}
void operator delete[](void* block, std::size_t /*size*/) noexcept
{
    std::free(block);
}

namespace {

// "priority message" per line; the sink's own allocations are never failed.
Strings g_lines;
void Sink(int /*logId*/, int prio, const char* /*tag*/, const char* text, void* /*user*/)
{
    const int armed = g_failAt;
    g_failAt = 0;
    const char* message = std::strstr(text, ") > ");
    g_lines.push_back(std::to_string(prio) + " " + (message != nullptr ? message + 4 : text));
    g_failAt = armed;
}

// The cursor's names, then its rows, as a flat list.
Strings Dump(DACursor& cursor)
{
    Strings out;
    cursor.GetColumn(out);
    std::vector<std::string> names = out;
    cursor.MoveToFirst();
    while (cursor.MoveToNext() == 0) {
        for (const std::string& name : names) {
            std::string value;
            cursor.GetString(name.c_str(), value);
            out.push_back(value);
        }
    }
    return out;
}

const char* const kSeed = "CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT, n REAL);"
                          "INSERT INTO t VALUES (1, 'a', 1.5), (2, 'b', 2.5);"
                          "CREATE TABLE u(k INTEGER, w TEXT); INSERT INTO u VALUES (1, 'x'); CREATE TABLE d(x);";

class AllocFailure : public TempDirTest, public ::testing::WithParamInterface<std::tuple<const char*, Allocator>> {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        ASSERT_TRUE(g_installed);
        const std::string dir = Dir();
        RawDb(PathOf("seed.db")).Run(kSeed);
        std::ifstream in(PathOf("seed.db"), std::ios::binary);
        m_seed.assign(std::istreambuf_iterator<char>(in), {});
        for (DABasePath* request : std::initializer_list<DABasePath*>{
                 &m_create, &m_drop, &m_missing, &m_update, &m_delete, &m_upsert, &m_select, &m_join, &m_location}) {
            request->SetPath(dir.c_str(), "t.db");
        }
        m_create.SetTable("c");
        m_create.SetPrimaryKey("id", "INTEGER");
        m_create.SetColumnKey("name", "TEXT");
        m_drop.SetTable("d");
        m_missing.SetTable("gone");
        m_update.SetTable("t");
        m_update.SetData("v", "z");
        m_update.SetWhere("k", 1);
        m_delete.SetTable("t");
        m_delete.SetWhere("k", 2);
        m_upsert.SetTable("t");
        m_upsert.SetData("k", 3);
        m_upsert.SetData("v", "c");
        m_select.SetTable("t");
        m_select.SetWhere("v", "a");
        m_join.SetLeftJoin("t", "k");
        m_join.SetRightJoin("u", "k");
        m_fill.SetPath(dir.c_str(), "t.db");
    }
    // The file as a fresh connection sees it.
    std::string State() { return RawDb(PathOf("t.db")).Query("SELECT name FROM sqlite_master; SELECT * FROM t"); }
    void Reseed() { std::ofstream(PathOf("t.db"), std::ios::binary | std::ios::trunc) << m_seed; }
    // Filling a request and a cursor, then reading the cursor: 0 when all reads back.
    int Fill()
    {
        m_fill.SetTable("t");
        m_fill.SetData("k", 7);
        m_fill.SetData("n", 2.5);
        m_fill.SetWhere("v", "text");
        m_cursor.Initialize();
        m_cursor.SetColumn("k");
        m_cursor.SetColumn("n");
        m_cursor.SetData("k", "7");
        m_cursor.SetData("n", "2.5");
        DAValueMap data;
        m_fill.GetDataMap(data);
        int k = 0;
        double n = 0;
        std::string text;
        const bool read = m_cursor.MoveToNext() == 0 && m_cursor.GetInt("k", k) == 0 &&
            m_cursor.GetDouble("n", n) == 0 && m_cursor.GetString("n", text) == 0;
        return read && k == 7 && n == 2.5 && text == "2.5" && data.size() == 2 ? 0 : 1;
    }
    // The operation of the test's parameter, made before anything is armed.
    std::function<int()> Operation(const std::string& name)
    {
        const std::map<std::string, std::function<int()>> ops{
            {"CreateTable", [&] { return m_db.CreateTable(m_create); }},
            {"DropTable", [&] { return m_db.DropTable(m_drop); }},
            // Fails anyway: exec's text is then copied, which can fail too.
            {"DropMissing", [&] { return m_db.DropTable(m_missing); }},
            {"Update", [&] { return m_db.Update(m_update); }},
            {"Delete", [&] { return m_db.Delete(m_delete); }},
            {"Upsert", [&] { return m_db.Upsert(m_upsert); }},
            {"Select", [&] { return m_db.Select(m_select, m_cursor); }},
            {"JoinSelect", [&] { return m_db.JoinSelect(m_join, m_cursor); }},
            {"CheckExistTable",
             [&] {
                 m_exists = false;
                 return m_db.CheckExistTable(m_location, "u", m_exists) + (m_exists ? 0 : 100);
             }},
            {"Fill", [&] { return Fill(); }}};
        return ops.at(name);
    }

    std::string m_seed;
    DADatabase m_db;
    DACreateRequest m_create;
    DADropRequest m_drop;
    DADropRequest m_missing;
    DAUpdateRequest m_update;
    DADeleteRequest m_delete;
    DAUpsertRequest m_upsert;
    DASelectRequest m_select;
    DAJoinRequest m_join;
    DABasePath m_location;
    DAUpsertRequest m_fill;
    DACursor m_cursor;
    bool m_exists = false;
};

TEST_P(AllocFailure, FailsCleanlyAtEveryAllocationAndStaysUsable)
{
    const std::string op = std::get<0>(GetParam());
    const bool query = op == "Select" || op == "JoinSelect" || op == "CheckExistTable";
    const std::function<int()> run = Operation(op);
    dlog_set_sink(&Sink, nullptr);
    Reseed();
    const std::string before = State();
    g_lines.clear();
    const int expected = run();
    const Strings normal = g_lines;
    ASSERT_EQ(op == "DropMissing" ? 1 : 0, expected);
    const std::string after = State();
    const Strings rows = Dump(m_cursor);
    int fallbacks = 0;
    for (int n = 1;; ++n) {
        SCOPED_TRACE("allocation " + std::to_string(n));
        Reseed();
        g_lines.clear();
        const int descriptors = OpenDescriptorCount();
        const sqlite3_int64 memory = sqlite3_memory_used();
        int rc = -1;
        bool threw = false;
        g_calls = 0;
        g_armed = std::get<1>(GetParam());
        g_failAt = n;
        try {
            rc = run();
        } catch (const std::bad_alloc&) {
            threw = true;
        }
        g_failAt = 0;
        EXPECT_EQ(descriptors, OpenDescriptorCount());
        EXPECT_EQ(memory, sqlite3_memory_used());
        const std::string state = State();
        EXPECT_TRUE(state == before || state == after) << state;
        if (g_calls < n) {
            EXPECT_EQ(expected, rc);
            EXPECT_EQ(after, state);
            std::printf("%s ran through after %d allocations, %d fallbacks\n", op.c_str(), n - 1, fallbacks);
            break;
        }
        bool errorLogged = false;
        for (const std::string& line : g_lines) {
            // SQLite's text of a failed allocation (also where the library
            // puts sqlite3_errstr for a missing exec text); a stream's
            // extraction swallows a failed allocation and fails the read.
            errorLogged = errorLogged || line.rfind("6 ", 0) == 0;
            EXPECT_TRUE(line.rfind("6 ", 0) != 0 || line.find("out of memory") != std::string::npos ||
                        line == "6 SQLITE STEP ERROR!!!" || line == "6 CONVERT TO DOUBLE ERROR!!!" ||
                        line == "6 CONVERT TO INT ERROR!!!" || std::count(normal.begin(), normal.end(), line) > 0)
                << line;
        }
        if (!threw && rc != 0) {
            EXPECT_TRUE(errorLogged) << rc;
        } else if (!threw && !query) {
            EXPECT_FALSE(errorLogged);
            EXPECT_EQ(after, state) << "SQLite tolerated the failure";
        } else if (!threw) {
            // A failed step is reported by its line alone; the rows read
            // before it stay, and a column text SQLite could not give is
            // stored as "". (A missing column name is not reachable:
            // SQLite's names need no allocation once the statement runs.)
            const Strings got = Dump(m_cursor);
            ASSERT_LE(got.size(), rows.size());
            for (std::size_t i = 0; i < got.size(); ++i) {
                EXPECT_TRUE(got[i] == rows[i] || got[i].empty()) << i << ": " << got[i];
                fallbacks += got[i] != rows[i] ? 1 : 0;
            }
        }
        Reseed();
        EXPECT_EQ(expected, run());
        EXPECT_EQ(rows, Dump(m_cursor));
    }
    if ((op == "Select" || op == "JoinSelect") && std::get<1>(GetParam()) == kSqlite) {
        EXPECT_GT(fallbacks, 0);
    }
    dlog_set_sink(nullptr, nullptr);
}

INSTANTIATE_TEST_SUITE_P(Every, AllocFailure,
                         ::testing::Combine(::testing::Values("CreateTable", "DropTable", "DropMissing", "Update",
                                                              "Delete", "Upsert", "Select", "JoinSelect",
                                                              "CheckExistTable", "Fill"),
                                            ::testing::Values(kSqlite, kNew)),
                         [](const auto& info) {
                             return std::string(std::get<0>(info.param)) +
                                 (std::get<1>(info.param) == kSqlite ? "_Sqlite" : "_New");
                         });

}  // namespace
