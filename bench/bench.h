#ifndef ULO_DB_BENCH_H
#define ULO_DB_BENCH_H

// The harness every case uses; README.md here says how to add a case, a target or a report section.

#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

class DACursor;
struct sqlite3;
struct sqlite3_stmt;

namespace bench {

// A data folder: "tmpfs" (under /dev/shm), "disk" (under $TMPDIR) or "memory" (dir empty).
struct Location {
    std::string name;
    std::string dir;
    std::string Path(const char* file) const { return dir + "/" + file; }
};

// One timed call: 0 on success; anything else ends the case with "<name> failed: <code>".
using Op = std::function<int()>;
using Counters = std::map<std::string, double>;
// Registers op as the case name in wall-clock time (a commit waits without using the CPU); untimed, if
// given, runs before every call with the clock stopped. Returns the benchmark for Iterations and the like.
benchmark::internal::Benchmark* Add(const std::string& name, Op op, Counters counters = {}, Op untimed = nullptr);
// ULO_BENCH_CASES(fn) has main call fn for each file location and once for "memory".
using CaseFn = void (*)(const Location&);
int Cases(CaseFn fn);
#define ULO_BENCH_CASES(fn) [[maybe_unused]] static const int fn##_registered = bench::Cases(fn)

// The query database every location holds: sel_<N> (id, qty, price, label) for every N of SelectSizes(),
// the join tables jl (kJoinRows rows, gid) and jr (kJoinGroups rows, gkey).
constexpr const char* kQueryFile = "query.db";
std::set<int>& SelectSizes();
inline std::string SelectTable(int rows)
{
    return "sel_" + std::to_string(rows);
}
constexpr int kJoinRows = 100000;
constexpr int kJoinGroups = 1000;

// "CREATE TABLE table (columns); INSERT INTO table ...": values (a select list over i) for i = 0..rows-1.
std::string TableSql(const std::string& table, const std::string& columns, int rows, const std::string& values);
// table dropped and made again with kRowColumns, rows rows: id, id * 3, id * 0.5, 'row-<id>' for id 1..rows.
constexpr const char* kRowColumns = "id INTEGER PRIMARY KEY, qty INTEGER, price REAL, label TEXT";
std::string FreshTable(const std::string& table, int rows);

// A request of type R on table of file in at's folder.
template <typename R>
std::shared_ptr<R> Request(const Location& at, const char* file, const std::string& table)
{
    auto request = std::make_shared<R>();
    request->SetPath(at.dir.c_str(), file);
    request->SetTable(table.c_str());
    return request;
}

// Raw baselines (open path, run, close); the selects copy every value as text, one vector per column.
using Columns = std::vector<std::vector<std::string>>;
int RawExec(const std::string& path, const std::string& sql);
int RawSelect(const std::string& path, const std::string& sql, Columns& columns);
int RawSelectOn(sqlite3* db, const std::string& sql, Columns& columns);
// Steps a prepared stmt to its end, copying every value, then resets it; returns the reset's code.
int RawStepCopy(sqlite3_stmt* stmt, Columns& columns);
int SqliteCppSelect(const std::string& path, const std::string& sql, Columns& columns);
// Ops checking a select: 0, its error code, or -1 when it does not hold rows rows (select into a fresh
// cursor; sql on path through RawSelect).
Op Rows(std::function<int(DACursor&)> select, int rows);
Op RawRows(const std::string& path, const std::string& sql, int rows);
// Heap bytes in use (mallinfo2).
double HeapInUse();

}  // namespace bench

#endif  // ULO_DB_BENCH_H
