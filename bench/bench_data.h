#ifndef ULO_DB_BENCH_DATA_H
#define ULO_DB_BENCH_DATA_H

// Data and raw-SQLite helpers shared by the benchmark program and the
// memory probe: the same tables, filled the same way, read the same way.

#include <functional>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

namespace bench {

// A folder the cases run in, made with MakeTempDir and removed at the end.
struct Location {
    std::string name;  // "tmpfs" or "disk"
    std::string dir;
    std::string Path(const char* file) const { return dir + "/" + file; }
};

// Seconds per benchmark repetition, unless a case fixes its iterations.
constexpr double kMinTime = 0.3;

// Registers one case; every case measures wall-clock time (a commit to disk
// waits without using the CPU). iterations > 0 fixes the count instead of
// the minimum time.
benchmark::internal::Benchmark* Register(const std::string& name, std::function<void(benchmark::State&)> body,
                                         int iterations = 0);

// Ends a case with "<what> failed: <rc>".
void Fail(benchmark::State& state, const char* what, int rc);

// The read-only database of the query cases, in every location.
constexpr const char* kQueryFile = "query.db";

// Registers the paged-query cases (bench_query.cpp) for every location, and
// the column-name interning case once.
void RegisterPageQueries(const std::vector<Location>& locations);

// The batch cases at location (bench_batch.cpp).
void RegisterBatch(const Location& location);

// Row counts of the select tables ("sel_<N>").
extern const std::vector<int> kSelectSizes;
// Rows of the join's left table (every one has a partner on the right).
constexpr int kJoinRows = 100000;
// Rows of the join's right table.
constexpr int kJoinGroups = 1000;

// The table of N rows: four columns mixing integer, real and text values.
std::string SelectTable(int rows);

// A fresh directory made by mkdtemp under parent, or "" on failure.
std::string MakeTempDir(const std::string& parent, const std::string& prefix);
// Removes dir and everything in it.
void RemoveTree(const std::string& dir);

// Creates (or completes) the read-only database for the queries at path:
// the tables sel_<N> for the given sizes, and the join tables jl (kJoinRows)
// and jr (kJoinGroups). Returns false and prints why on failure.
bool CreateQueryDatabase(const std::string& path, const std::vector<int>& sizes, bool withJoin);

// Runs statements (separated by ';') on path with raw SQLite; false on error.
bool RawExecScript(const std::string& path, const std::string& sql);

// The raw baseline of a query: open path, sqlite3_prepare_v2 + sqlite3_step,
// every value copied as text into one vector per column, finalize, close.
// Returns SQLite's code of the prepare (0 on success).
using RawColumns = std::vector<std::vector<std::string>>;
int RawSelect(const std::string& path, const std::string& sql, RawColumns& columns);

// The same copy through SQLiteCpp. Returns 0, or 1 on an exception.
int SqliteCppSelect(const std::string& path, const std::string& sql, RawColumns& columns);

// Resident memory of this process in KiB: current (VmRSS) and peak (VmHWM).
long ReadStatusKiB(const char* field);

}  // namespace bench

#endif  // ULO_DB_BENCH_DATA_H
