// Every operation with its Nth allocation failing, for N = 1, 2, ... until it
// runs through: once in SQLite's allocator, once in operator new. This
// program replaces both, so it is an executable of its own.
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <map>
#include <new>
#include <string>
#include <tuple>
#include <utility>

#include <gtest/gtest.h>
#include <sqlite3.h>

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
// this program commits thousands of times.
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

class AllocFailure : public TempDirTest, public ::testing::WithParamInterface<std::tuple<const char*, Allocator>> {
protected:
    template <typename Request>
    Request& At(Request& request, const char* table)
    {
        request.SetPath(Dir().c_str(), "t.db");
        request.SetTable(table);
        return request;
    }
    void SetUp() override
    {
        TempDirTest::SetUp();
        RawDb(PathOf("seed.db"))
            .Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT, n REAL);"
                 "INSERT INTO t VALUES (1, 'a', 1.5), (2, 'b', 2.5);"
                 "CREATE TABLE u(k INTEGER, w TEXT); INSERT INTO u VALUES (1, 'x'); CREATE TABLE d(x);");
        At(m_create, "c").SetColumnKey("name", "TEXT");
        At(m_update, "t").SetData("v", "z");
        m_update.SetWhere("k", 1);
        At(m_delete, "t").SetWhere("k", 2);
        At(m_upsert, "t").SetData("k", 3);
        At(m_select, "t").SetWhere("v", "a");
        m_join.SetPath(Dir().c_str(), "t.db");
        m_join.SetLeftJoin("t", "k");
        m_join.SetRightJoin("u", "k");
        m_ops = {{"CreateTable", [&] { return m_db.CreateTable(m_create); }},
                 {"DropTable", [&] { return m_db.DropTable(At(m_drop, "d")); }},
                 // Fails anyway: exec's error text is then copied, which can fail too.
                 {"DropMissing", [&] { return m_db.DropTable(At(m_drop, "gone")); }},
                 {"Update", [&] { return m_db.Update(m_update); }},
                 {"Delete", [&] { return m_db.Delete(m_delete); }},
                 {"Upsert", [&] { return m_db.Upsert(m_upsert); }},
                 {"Select", [&] { return m_db.Select(m_select, m_cursor); }},
                 {"JoinSelect", [&] { return m_db.JoinSelect(m_join, m_cursor); }},
                 {"CheckExistTable", [&] { return m_db.CheckExistTable(m_join, "u", m_exists) + !m_exists; }},
                 {"Fill", [&] { return Fill(); }}};
    }
    // Fills a request and the cursor and reads the cursor: 0 when all reads back.
    int Fill()
    {
        m_upsert.SetWhere("n", 2.5);
        m_cursor.Initialize();
        m_cursor.SetColumn("k");
        m_cursor.SetData("k", "7");
        int k = 0;
        double n = 0;
        return m_cursor.MoveToNext() + m_cursor.GetInt("k", k) + m_cursor.GetDouble("k", n) + (k * n == 49 ? 0 : 1);
    }
    // The file as a fresh connection sees it, after copying the seed there first if asked.
    std::string State(bool reseed = false)
    {
        const auto overwrite = std::filesystem::copy_options::overwrite_existing;
        reseed&& std::filesystem::copy_file(PathOf("seed.db"), PathOf("t.db"), overwrite);
        return RawDb(PathOf("t.db")).Query("SELECT name FROM sqlite_master; SELECT * FROM t");
    }

    DADatabase m_db;
    DACreateRequest m_create;
    DADropRequest m_drop;
    DAUpdateRequest m_update;
    DADeleteRequest m_delete;
    DAUpsertRequest m_upsert;
    DASelectRequest m_select;
    DAJoinRequest m_join;
    DACursor m_cursor;
    bool m_exists = false;
    std::map<std::string, std::function<int()>> m_ops;
};

TEST_P(AllocFailure, FailsCleanlyAtEveryAllocationAndStaysUsable)
{
    ASSERT_TRUE(g_installed);
    const auto [op, allocator] = GetParam();
    const bool query = std::strstr("Select JoinSelect CheckExistTable", op) != nullptr;
    const std::function<int()> run = m_ops.at(op);
    dlog_set_sink(&Sink, nullptr);
    const std::string before = State(true);
    const int expected = run();
    const Strings normal = std::exchange(g_lines, {});
    ASSERT_EQ(std::string(op) == "DropMissing" ? 1 : 0, expected);
    const std::string after = State();
    const Strings rows = Dump(m_cursor);
    int fallbacks = 0;
    for (int n = 1; g_calls >= n - 1; ++n) {
        SCOPED_TRACE("allocation " + std::to_string(n));
        State(true);
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
        const std::string state = State();
        EXPECT_TRUE(state == before || state == after) << state;
        // SQLite's text of a failed allocation (also where sqlite3_errstr
        // stands in for a missing exec text); a stream's extraction swallows
        // a failed allocation and fails the read.
        const auto expectedLine = [&](const std::string& line) {
            return line[0] != '6' || line.find("out of memory") != std::string::npos ||
                line == "6 SQLITE STEP ERROR!!!" || line == "6 CONVERT TO DOUBLE ERROR!!!" ||
                line == "6 CONVERT TO INT ERROR!!!" || std::count(normal.begin(), normal.end(), line) > 0;
        };
        const auto errors = std::count_if(g_lines.begin(), g_lines.end(), [](auto& l) { return l[0] == '6'; });
        EXPECT_TRUE(std::all_of(g_lines.begin(), g_lines.end(), expectedLine)) << ::testing::PrintToString(g_lines);
        if (g_calls < n || (rc == 0 && !query)) {
            EXPECT_EQ(expected, rc);  // ran through, or SQLite tolerated the failure
            EXPECT_EQ(after, state);
        } else if (rc != -1) {
            // A failed step is reported by its line alone, and the rows read
            // before it stay; a column text SQLite could not give is stored as
            // "". (A missing column name is not reachable: SQLite's names
            // need no allocation once the statement runs.)
            EXPECT_TRUE(rc == 0 ? query : errors > 0) << rc;
            const Strings got = Dump(m_cursor);
            for (std::size_t i = 0; rc == 0 && i < got.size(); ++i) {
                EXPECT_TRUE(i < rows.size() && (got[i] == rows[i] || got[i].empty())) << i << ": " << got[i];
                fallbacks += i < rows.size() && got[i] != rows[i] ? 1 : 0;
            }
        }
        State(true);
        EXPECT_EQ(expected, run());  // at once: no member lock is left held
        EXPECT_EQ(rows, Dump(m_cursor));
    }
    EXPECT_TRUE(fallbacks > 0 || allocator == kNew || !query || std::string(op) == "CheckExistTable");
    dlog_set_sink(nullptr, nullptr);
}

INSTANTIATE_TEST_SUITE_P(Every, AllocFailure,
                         ::testing::Combine(::testing::Values("CreateTable", "DropTable", "DropMissing", "Update",
                                                              "Delete", "Upsert", "Select", "JoinSelect",
                                                              "CheckExistTable", "Fill"),
                                            ::testing::Values(kSqlite, kNew)));

}  // namespace
