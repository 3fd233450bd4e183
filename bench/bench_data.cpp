#include "bench_data.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <system_error>

#include <SQLiteCpp/SQLiteCpp.h>
#include <sqlite3.h>

namespace bench {

const std::vector<int> kSelectSizes = {1000, 10000, 100000, 1000000};

benchmark::internal::Benchmark* Register(const std::string& name, std::function<void(benchmark::State&)> body,
                                         int iterations)
{
    auto* registered = benchmark::RegisterBenchmark(name.c_str(), [body](benchmark::State& state) { body(state); })
                           ->UseRealTime()
                           ->Unit(benchmark::kMicrosecond);
    if (iterations > 0) {
        registered->Iterations(iterations);  // a fixed count excludes a minimum time
    } else {
        registered->MinTime(kMinTime);
    }
    return registered;
}

void Fail(benchmark::State& state, const char* what, int rc)
{
    const std::string message = std::string(what) + " failed: " + std::to_string(rc);
    state.SkipWithError(message.c_str());
}

std::string SelectTable(int rows)
{
    return "sel_" + std::to_string(rows);
}

std::string MakeTempDir(const std::string& parent, const std::string& prefix)
{
    std::string pattern = parent + "/" + prefix + ".XXXXXX";
    std::vector<char> buffer(pattern.begin(), pattern.end());
    buffer.push_back('\0');
    if (mkdtemp(buffer.data()) == nullptr) {
        std::perror(pattern.c_str());
        return "";
    }
    return buffer.data();
}

void RemoveTree(const std::string& dir)
{
    if (!dir.empty()) {
        std::error_code ignored;
        std::filesystem::remove_all(dir, ignored);
    }
}

bool RawExecScript(const std::string& path, const std::string& sql)
{
    sqlite3* db = nullptr;
    int rc = sqlite3_open(path.c_str(), &db);
    char* error = nullptr;
    if (rc == SQLITE_OK) {
        rc = sqlite3_exec(db, sql.c_str(), nullptr, nullptr, &error);
    }
    if (rc != SQLITE_OK) {
        std::fprintf(stderr, "%s: %s (%s)\n", path.c_str(), error != nullptr ? error : sqlite3_errmsg(db), sql.c_str());
    }
    sqlite3_free(error);
    sqlite3_close(db);
    return rc == SQLITE_OK;
}

namespace {

bool TableExists(sqlite3* db, const std::string& table)
{
    sqlite3_stmt* stmt = nullptr;
    const std::string sql = "SELECT COUNT(*) FROM sqlite_master WHERE type='table' AND name='" + table + "'";
    bool exists = false;
    if (sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr) == SQLITE_OK && sqlite3_step(stmt) == SQLITE_ROW) {
        exists = sqlite3_column_int(stmt, 0) > 0;
    }
    sqlite3_finalize(stmt);
    return exists;
}

// Fills one table with rows made by bind(stmt, i), in one transaction.
template <typename Bind>
bool Fill(sqlite3* db, const std::string& create, const std::string& insert, int rows, Bind bind)
{
    if (sqlite3_exec(db, ("BEGIN;" + create).c_str(), nullptr, nullptr, nullptr) != SQLITE_OK) {
        return false;
    }
    sqlite3_stmt* stmt = nullptr;
    if (sqlite3_prepare_v2(db, insert.c_str(), -1, &stmt, nullptr) != SQLITE_OK) {
        return false;
    }
    bool ok = true;
    for (int i = 0; i < rows && ok; ++i) {
        bind(stmt, i);
        ok = sqlite3_step(stmt) == SQLITE_DONE;
        sqlite3_reset(stmt);
    }
    sqlite3_finalize(stmt);
    return ok && sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr) == SQLITE_OK;
}

std::string Label(int i)
{
    return "item-" + std::to_string((i * 7919) % 1000003);
}

}  // namespace

bool CreateQueryDatabase(const std::string& path, const std::vector<int>& sizes, bool withJoin)
{
    sqlite3* db = nullptr;
    if (sqlite3_open(path.c_str(), &db) != SQLITE_OK) {
        std::fprintf(stderr, "cannot open %s\n", path.c_str());
        sqlite3_close(db);
        return false;
    }
    bool ok = true;
    for (const int rows : sizes) {
        const std::string table = SelectTable(rows);
        if (!ok || TableExists(db, table)) {
            continue;
        }
        ok = Fill(db, "CREATE TABLE " + table + " (id INTEGER PRIMARY KEY, qty INTEGER, price REAL, label TEXT)",
                  "INSERT INTO " + table + " VALUES (?, ?, ?, ?)", rows, [](sqlite3_stmt* stmt, int i) {
                      const std::string label = Label(i);
                      sqlite3_bind_int(stmt, 1, i + 1);
                      sqlite3_bind_int(stmt, 2, (i * 37) % 100003);
                      sqlite3_bind_double(stmt, 3, i * 0.25 + 0.125);
                      sqlite3_bind_text(stmt, 4, label.c_str(), -1, SQLITE_TRANSIENT);
                  });
    }
    if (ok && withJoin && !TableExists(db, "jl")) {
        ok = Fill(db, "CREATE TABLE jr (gkey INTEGER PRIMARY KEY, gname TEXT)", "INSERT INTO jr VALUES (?, ?)",
                  kJoinGroups, [](sqlite3_stmt* stmt, int i) {
                      const std::string name = "group-" + std::to_string(i);
                      sqlite3_bind_int(stmt, 1, i);
                      sqlite3_bind_text(stmt, 2, name.c_str(), -1, SQLITE_TRANSIENT);
                  });
        ok = ok &&
            Fill(db, "CREATE TABLE jl (id INTEGER PRIMARY KEY, gid INTEGER, price REAL, label TEXT)",
                 "INSERT INTO jl VALUES (?, ?, ?, ?)", kJoinRows, [](sqlite3_stmt* stmt, int i) {
                     const std::string label = Label(i);
                     sqlite3_bind_int(stmt, 1, i + 1);
                     sqlite3_bind_int(stmt, 2, (i * 13) % kJoinGroups);
                     sqlite3_bind_double(stmt, 3, i * 0.5 + 0.25);
                     sqlite3_bind_text(stmt, 4, label.c_str(), -1, SQLITE_TRANSIENT);
                 });
    }
    if (!ok) {
        std::fprintf(stderr, "cannot fill %s: %s\n", path.c_str(), sqlite3_errmsg(db));
    }
    sqlite3_close(db);
    return ok;
}

int RawSelect(const std::string& path, const std::string& sql, RawColumns& columns)
{
    sqlite3* db = nullptr;
    int rc = sqlite3_open(path.c_str(), &db);
    if (rc != SQLITE_OK) {
        sqlite3_close(db);
        return rc;
    }
    sqlite3_stmt* stmt = nullptr;
    rc = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
    if (rc == SQLITE_OK) {
        const int count = sqlite3_column_count(stmt);
        columns.assign(static_cast<std::size_t>(count), {});
        while (sqlite3_step(stmt) == SQLITE_ROW) {
            for (int i = 0; i < count; ++i) {
                const unsigned char* text = sqlite3_column_text(stmt, i);
                columns[static_cast<std::size_t>(i)].emplace_back(text != nullptr ? reinterpret_cast<const char*>(text)
                                                                                  : "");
            }
        }
    }
    sqlite3_finalize(stmt);
    sqlite3_close(db);
    return rc;
}

int SqliteCppSelect(const std::string& path, const std::string& sql, RawColumns& columns)
{
    try {
        SQLite::Database db(path, SQLite::OPEN_READWRITE | SQLite::OPEN_CREATE);
        SQLite::Statement query(db, sql);
        const int count = query.getColumnCount();
        columns.assign(static_cast<std::size_t>(count), {});
        while (query.executeStep()) {
            for (int i = 0; i < count; ++i) {
                columns[static_cast<std::size_t>(i)].emplace_back(query.getColumn(i).getText());
            }
        }
    } catch (const std::exception& error) {
        std::fprintf(stderr, "SQLiteCpp: %s\n", error.what());
        return 1;
    }
    return 0;
}

long ReadStatusKiB(const char* field)
{
    std::ifstream status("/proc/self/status");
    std::string line;
    const std::size_t length = std::strlen(field);
    while (std::getline(status, line)) {
        if (line.compare(0, length, field) == 0 && line.size() > length && line[length] == ':') {
            return std::strtol(line.c_str() + length + 1, nullptr, 10);
        }
    }
    return -1;
}

}  // namespace bench
