// Bulk writes: N upserts through one ExecuteBatch, against raw SQLite
// running the same statements in one BEGIN IMMEDIATE/COMMIT, and against N
// single Upsert calls (each its own open and commit).
//
// Names: batch/Upsert<N>/<location>/<impl>, impl being lib, raw or single.
// Every case reports the counter "statements" it ran per iteration; the
// single calls on disk run fewer than N (one commit each is slow), so the
// report scales by it. lib also reports the memory its filled batch holds
// ("held_bytes", measured with mallinfo2 around the fill) against the
// statements' own bytes ("text_bytes").

#include <malloc.h>

#include <cstdio>
#include <memory>
#include <string>

#include <benchmark/benchmark.h>
#include <sqlite3.h>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench_data.h"

namespace bench {
namespace {

constexpr const char* kBatchFile = "batch.db";
constexpr int kStatements = 10000;
constexpr int kSingleCallsOnDisk = 500;  // ~10 ms a commit: 5 s an iteration

// The row i the cases write, as the library is asked for it.
void FillUpsert(DAUpsertRequest& request, const Location& location, int i)
{
    request.SetPath(location.dir.c_str(), kBatchFile);
    request.SetTable("b");
    request.SetData("id", i);
    request.SetData("qty", i * 3);
    request.SetData("price", i * 0.5);
    request.SetData("label", ("row-" + std::to_string(i)).c_str());
}

// A batch of rows 1..count filled as a user would.
void FillBatch(DABatchRequest& batch, const Location& location, int count)
{
    batch.SetPath(location.dir.c_str(), kBatchFile);
    for (int i = 1; i <= count; ++i) {
        DAUpsertRequest request;
        FillUpsert(request, location, i);
        batch.Add(request);
    }
}

// The same statement text the raw case builds for row i (numbers as the
// library's streams write them).
std::string RawUpsertText(int i)
{
    char price[32];
    std::snprintf(price, sizeof price, "%g", i * 0.5);
    return "INSERT OR REPLACE INTO b (id, qty, price, label) VALUES ('" + std::to_string(i) + "', '" +
        std::to_string(i * 3) + "', '" + price + "', 'row-" + std::to_string(i) + "')";
}

// Raw SQLite: open, BEGIN IMMEDIATE, every text built and executed, COMMIT.
int RawBatch(const std::string& path, int count)
{
    sqlite3* db = nullptr;
    int rc = sqlite3_open(path.c_str(), &db);
    if (rc == SQLITE_OK) {
        rc = sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
    }
    for (int i = 1; rc == SQLITE_OK && i <= count; ++i) {
        rc = sqlite3_exec(db, RawUpsertText(i).c_str(), nullptr, nullptr, nullptr);
    }
    if (rc == SQLITE_OK) {
        rc = sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
    }
    sqlite3_close(db);
    return rc;
}

std::size_t HeapInUse()
{
    const struct mallinfo2 info = mallinfo2();
    return info.uordblks + info.hblkhd;
}

// Bytes a filled batch holds on the heap, and its statements' own bytes.
void CountBatchMemory(benchmark::State& state, const Location& location)
{
    const std::size_t before = HeapInUse();
    auto batch = std::make_unique<DABatchRequest>();
    FillBatch(*batch, location, kStatements);
    const std::size_t held = HeapInUse() - before;
    std::size_t text = 0;
    for (int i = 1; i <= kStatements; ++i) {
        DAUpsertRequest request;
        FillUpsert(request, location, i);
        std::string sql;
        DASqlGenerator().GetUpsertSql(request, sql);
        text += sql.size();
    }
    state.counters["held_bytes"] = static_cast<double>(held);
    state.counters["text_bytes"] = static_cast<double>(text);
    state.counters["held_per_text"] = static_cast<double>(held) / static_cast<double>(text);
}

}  // namespace

void RegisterBatch(const Location& location)
{
    const std::string path = location.Path(kBatchFile);
    if (!RawExecScript(path,
                       "CREATE TABLE IF NOT EXISTS b (id INTEGER PRIMARY KEY, qty INTEGER, price REAL, label TEXT)")) {
        return;
    }
    const std::string prefix = "batch/Upsert" + std::to_string(kStatements) + "/" + location.name + "/";
    Register(prefix + "lib", [location](benchmark::State& state) {
        CountBatchMemory(state, location);
        DADatabase db;
        for (auto _ : state) {
            DABatchRequest batch;
            FillBatch(batch, location, kStatements);
            const int rc = db.ExecuteBatch(batch);
            if (rc != SQLITE_OK) {
                Fail(state, "ExecuteBatch", rc);
                break;
            }
        }
        state.counters["statements"] = kStatements;
    });
    Register(prefix + "raw", [path](benchmark::State& state) {
        for (auto _ : state) {
            const int rc = RawBatch(path, kStatements);
            if (rc != SQLITE_OK) {
                Fail(state, "raw batch", rc);
                break;
            }
        }
        state.counters["statements"] = kStatements;
    });
    const int calls = location.name == "disk" ? kSingleCallsOnDisk : kStatements;
    Register(
        prefix + "single",
        [location, calls](benchmark::State& state) {
            DADatabase db;
            for (auto _ : state) {
                for (int i = 1; i <= calls; ++i) {
                    DAUpsertRequest request;
                    FillUpsert(request, location, i);
                    const int rc = db.Upsert(request);
                    if (rc != SQLITE_OK) {
                        Fail(state, "Upsert", rc);
                        break;
                    }
                }
            }
            state.counters["statements"] = calls;
        },
        1);
}

}  // namespace bench
