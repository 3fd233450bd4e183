// Paged queries and column-name interning.
//
// page/<rows>/<location>/<impl>: rows 1,001-1,100 of the 100,000-row table,
// by its indexed key (ORDER BY id LIMIT 100 OFFSET 1000):
//   lib        DADatabase::Query into a DACursor
//   raw        the same statement text through sqlite3_prepare_v2/step,
//              every value copied as text (bench::RawSelect)
//   selectall  DADatabase::Select of the whole table, what a caller had to
//              do before Query existed
// Each reports the heap its result holds (counter result_bytes).
//
// intern/existing/memory/<threads>: DAColumnName::Intern of a name interned
// before, from one thread and from two at once.

#include <malloc.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <sqlite3.h>

#include "DAColumnName.h"
#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench_data.h"

namespace bench {

namespace {

constexpr int kPageTableRows = 100000;
constexpr int kPageSize = 100;
constexpr int kPageOffset = 1000;

// Heap bytes in use, small blocks and mmap-ed ones alike.
double HeapInUse()
{
    const struct mallinfo2 info = mallinfo2();
    return static_cast<double>(info.uordblks + info.hblkhd);
}

// Times run(), which fills a fresh result and returns 0 when it holds the
// page's first key; result_bytes is what one result holds while alive.
template <typename Result>
void TimeResult(benchmark::State& state, const std::function<int(Result&)>& run)
{
    double held = 0;
    {
        Result probe;
        const double before = HeapInUse();
        if (run(probe) != 0) {
            state.SkipWithError("wrong result");
            return;
        }
        held = HeapInUse() - before;
    }
    for (auto _ : state) {
        Result result;
        if (run(result) != 0) {
            state.SkipWithError("wrong result");
            break;
        }
    }
    state.counters["result_bytes"] = held;
}

void Register(const std::string& name, const std::function<void(benchmark::State&)>& body)
{
    benchmark::RegisterBenchmark(name.c_str(), [body](benchmark::State& state) { body(state); })
        ->UseRealTime()
        ->Unit(benchmark::kMicrosecond)
        ->MinTime(0.3);
}

void RegisterPages(const Location& location)
{
    const std::string table = SelectTable(kPageTableRows);
    const std::string prefix = "page/" + std::to_string(kPageTableRows) + "/" + location.name + "/";
    auto page = std::make_shared<DAQueryRequest>();
    page->SetPath(location.dir.c_str(), kQueryFile);
    page->SetTable(table.c_str());
    page->SetOrderBy("id");
    page->SetLimit(kPageSize, kPageOffset);
    auto all = std::make_shared<DASelectRequest>();
    all->SetPath(location.dir.c_str(), kQueryFile);
    all->SetTable(table.c_str());
    std::string sql;
    DASqlGenerator().GetQuerySql(*page, sql);
    const std::string path = location.Path(kQueryFile);

    // The page holds ids 1001..1100; the whole table starts at id 1.
    const auto firstId = [](DACursor& cursor, int rows, const char* id) {
        std::string value;
        return cursor.GetCount() == rows && cursor.MoveToNext() == 0 && cursor.GetString("id", value) == 0 &&
                value == id
            ? 0
            : 1;
    };
    Register(prefix + "lib", [page, firstId](benchmark::State& state) {
        TimeResult<DACursor>(state, [&](DACursor& cursor) {
            return DADatabase().Query(*page, cursor) != SQLITE_OK ? 1 : firstId(cursor, kPageSize, "1001");
        });
    });
    Register(prefix + "raw", [path, sql](benchmark::State& state) {
        TimeResult<RawColumns>(state, [&](RawColumns& columns) {
            return RawSelect(path, sql, columns) != SQLITE_OK || columns.size() != 4 ||
                    columns[0].size() != static_cast<std::size_t>(kPageSize) || columns[0][0] != "1001"
                ? 1
                : 0;
        });
    });
    Register(prefix + "selectall", [all, firstId](benchmark::State& state) {
        TimeResult<DACursor>(state, [&](DACursor& cursor) {
            return DADatabase().Select(*all, cursor) != SQLITE_OK ? 1 : firstId(cursor, kPageTableRows, "1");
        });
    });
}

}  // namespace

void RegisterPageQueries(const std::vector<Location>& locations)
{
    for (const Location& location : locations) {
        RegisterPages(location);
    }
    // A run-time name, interned once before timing: every timed call finds it.
    const std::string name = std::string("column_") + "timestamp_ms";
    const char* interned = DAColumnName::Intern(name.c_str());
    for (const int threads : {1, 2}) {
        benchmark::RegisterBenchmark(("intern/existing/memory/" + std::to_string(threads)).c_str(),
                                     [name, interned](benchmark::State& state) {
                                         for (auto _ : state) {
                                             const char* found = DAColumnName::Intern(name.c_str());
                                             if (found != interned) {
                                                 state.SkipWithError("another pointer");
                                                 break;
                                             }
                                             benchmark::DoNotOptimize(found);
                                         }
                                         state.SetItemsProcessed(state.iterations());
                                     })
            ->Threads(threads)
            ->UseRealTime()
            ->Unit(benchmark::kNanosecond);
    }
}

}  // namespace bench
