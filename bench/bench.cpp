// [ULO_BENCH_LOCATIONS="tmpfs disk"] [ULO_BENCH_SIZES="1000 10000 100000 1000000"] ulo_db_bench [flags]
// Each location is a fresh folder, removed at the end.

#include <malloc.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <sstream>

#include <SQLiteCpp/SQLiteCpp.h>
#include <sqlite3.h>

#include "DACursor.h"
#include "bench.h"
#include "dlog.h"

namespace bench {

namespace {
bool CreateQueryDatabase(const std::string& path)
{
    const std::string label = "'item-' || ((i * 7919) % 1000003)";
    std::string sql = "BEGIN;";
    for (const int rows : selectSizes) {
        sql += TableSql("sel_" + std::to_string(rows), kRowColumns, rows,
                        "i + 1, (i * 37) % 100003, i * 0.25 + 0.125, " + label);
    }
    sql += TableSql("jr", "gkey INTEGER PRIMARY KEY, gname TEXT", 1000, "i, 'group-' || i");
    sql += TableSql("jl", "id INTEGER PRIMARY KEY, gid INTEGER, price REAL, label TEXT", kJoinRows,
                    "i + 1, (i * 13) % 1000, i * 0.5 + 0.25, " + label);
    return RawExec(path, sql + "COMMIT;") == SQLITE_OK;
}
}  // namespace

benchmark::internal::Benchmark* Add(const std::string& name, Op op, Counters counters, Op untimed)
{
    auto body = [=](benchmark::State& state) {
        for (auto _ : state) {
            if (untimed) {
                state.PauseTiming();
                untimed();
                state.ResumeTiming();
            }
            if (const int rc = op()) {
                state.SkipWithError((name + " failed: " + std::to_string(rc)).c_str());
                break;
            }
        }
        state.counters.insert(counters.begin(), counters.end());
    };
    return benchmark::RegisterBenchmark(name.c_str(), body)->UseRealTime()->Unit(benchmark::kMicrosecond);
}

template <typename Result>
benchmark::internal::Benchmark* AddQuery(const std::string& name, int rows, std::function<int(Result&)> fill, bool held,
                                         Counters counters)
{
    counters["rows"] = rows;
    Result probe;
    const double before = HeapInUse();
    if (held && fill(probe) == SQLITE_OK) {
        counters["result_bytes"] = HeapInUse() - before;
    }
    const auto op = [=] {
        Result result;
        const int rc = fill(result);
        if constexpr (std::is_same_v<Result, DACursor>) {
            return rc != SQLITE_OK ? rc : result.GetCount() == rows ? 0 : -1;
        } else {
            return rc != SQLITE_OK ? rc : (result.empty() ? 0 : static_cast<int>(result[0].size())) == rows ? 0 : -1;
        }
    };
    return Add(name, op, counters);
}
template benchmark::internal::Benchmark* AddQuery(const std::string&, int, std::function<int(DACursor&)>, bool,
                                                  Counters);
template benchmark::internal::Benchmark* AddQuery(const std::string&, int, std::function<int(Columns&)>, bool,
                                                  Counters);

std::function<int(Columns&)> Raw(const std::string& path, const std::string& sql)
{
    return [=](Columns& columns) { return OnFile(path, [&](sqlite3* db) { return RawSelectOn(db, sql, columns); }); };
}

std::function<int(Columns&)> SqliteCpp(const std::string& path, const std::string& sql)
{
    return [=](Columns& columns) {
        try {
            SQLite::Database db(path, SQLite::OPEN_READWRITE);
            SQLite::Statement query(db, sql);
            columns.assign(static_cast<std::size_t>(query.getColumnCount()), {});
            while (query.executeStep()) {
                for (std::size_t i = 0; i < columns.size(); ++i) {
                    columns[i].emplace_back(query.getColumn(static_cast<int>(i)).getText());
                }
            }
            return SQLITE_OK;
        } catch (const std::exception& error) {
            std::fprintf(stderr, "SQLiteCpp: %s\n", error.what());
            return SQLITE_ERROR;
        }
    };
}

int OnFile(const std::string& path, const std::function<int(sqlite3*)>& run)
{
    sqlite3* db = nullptr;
    const int rc = sqlite3_open(path.c_str(), &db);
    const int result = rc == SQLITE_OK ? run(db) : rc;
    sqlite3_close(db);
    return result;
}

int RawExec(const std::string& path, const std::string& sql)
{
    return OnFile(path, [&](sqlite3* db) { return sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr); });
}

int RawStepCopy(sqlite3_stmt* stmt, Columns& columns)
{
    const int count = sqlite3_column_count(stmt);
    columns.assign(static_cast<std::size_t>(count), {});
    while (sqlite3_step(stmt) == SQLITE_ROW) {
        for (int i = 0; i < count; ++i) {
            const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt, i));
            columns[static_cast<std::size_t>(i)].emplace_back(text != nullptr ? text : "");
        }
    }
    return sqlite3_reset(stmt);
}

int RawSelectOn(sqlite3* db, const std::string& sql, Columns& columns)
{
    sqlite3_stmt* stmt = nullptr;
    const int rc = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
    const int stepped = rc == SQLITE_OK ? RawStepCopy(stmt, columns) : rc;
    sqlite3_finalize(stmt);
    return stepped;
}

double HeapInUse()
{
    const struct mallinfo2 info = mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
}

std::string TableSql(const std::string& table, const std::string& columns, int rows, const std::string& values)
{
    return "CREATE TABLE " + table + " (" + columns + "); INSERT INTO " + table + " SELECT " + values +
        " FROM (WITH RECURSIVE c(i) AS (SELECT 0 UNION ALL SELECT i + 1 FROM c WHERE i < " + std::to_string(rows - 1) +
        ") SELECT i FROM c);";
}

std::string FreshTable(const std::string& table, int rows)
{
    return "DROP TABLE IF EXISTS " + table + ";" +
        TableSql(table, kRowColumns, rows, "i + 1, (i + 1) * 3, (i + 1) * 0.5, 'row-' || (i + 1)");
}

}  // namespace bench

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    dlog_set_sink(dlog_discard_sink, nullptr);
    // glibc raises its mmap threshold at the first free of a large mapped block: one now puts every case in
    // the regime of a long-running process, whichever runs first.
    void* block = std::malloc(16U << 20U);
    benchmark::DoNotOptimize(block);
    std::free(block);
    const auto env = [](const char* variable, const char* fallback) {
        return std::istringstream(std::getenv(variable) != nullptr ? std::getenv(variable) : fallback);
    };
    auto sizes = env("ULO_BENCH_SIZES", "1000 10000 100000 1000000"), names = env("ULO_BENCH_LOCATIONS", "tmpfs disk");
    bench::selectSizes = {std::istream_iterator<int>(sizes), {}};
    bench::selectSizes.insert(100000);  // the page and walk cases read it
    std::vector<bench::Location> locations;
    bool ready = true;
    for (std::istream_iterator<std::string> name(names), end; ready && name != end; ++name) {
        std::string dir = (*name == "tmpfs" ? "/dev/shm" : env("TMPDIR", "/tmp").str()) + "/ulo_db_bench.XXXXXX";
        // A folder made is removed at the end, whatever follows.
        ready = mkdtemp(dir.data()) != nullptr && (locations.push_back({*name, dir}), true) &&
            bench::CreateQueryDatabase(dir + "/" + bench::kQueryFile);
        if (!ready) {
            std::perror(dir.c_str());
        }
    }
    benchmark::AddCustomContext("sqlite_version", sqlite3_libversion());
    benchmark::AddCustomContext("compiler", __VERSION__);
    for (const bench::Location& location : ready ? locations : std::vector<bench::Location>{}) {
        for (const auto cases :
             {bench::ConditionCases, bench::QueryCases, bench::SafetyCases, bench::SchemaCases, bench::SearchCases,
              bench::SessionCases, bench::TypedCases, bench::WatchCases, bench::WriteCases}) {
            cases(location);
        }
    }
    if (ready) {
        bench::NameCases();
        benchmark::RunSpecifiedBenchmarks();
    }
    benchmark::Shutdown();
    for (const bench::Location& location : locations) {
        std::error_code ignored;
        std::filesystem::remove_all(location.dir, ignored);
    }
    return ready ? 0 : 1;
}
