#ifndef ULO_DB_BENCH_H
#define ULO_DB_BENCH_H

// The harness every case uses; docs/benchmarks.md says how a case, a target or a report section is added.

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

// A fresh data folder: "tmpfs" (under /dev/shm) or "disk" (under $TMPDIR).
struct Location {
    std::string name;
    std::string dir;
    std::string Path(const char* file) const { return dir + "/" + file; }
};

// One timed call: 0 on success; anything else ends the case with "<name> failed: <code>".
using Op = std::function<int()>;
using Counters = std::map<std::string, double>;
// Registers op as case name, timed in wall-clock time (a commit waits without using the CPU); untimed, if
// given, runs before every call with the clock stopped.
benchmark::internal::Benchmark* Add(const std::string& name, Op op, Counters counters = {}, Op untimed = nullptr);
// Each section's cases (a source file each), registered by main for each location; names touch no file.
void ConditionCases(const Location& at);
void NameCases();
void QueryCases(const Location& at);
void SafetyCases(const Location& at);
void SchemaCases(const Location& at);
void SearchCases(const Location& at);
void SessionCases(const Location& at);
void TypedCases(const Location& at);
void WatchCases(const Location& at);
void WriteCases(const Location& at);

// A query case: fill(result) into a fresh cursor, or copying every value as text into one vector per column,
// must return 0 with rows rows. counters gets rows; held adds result_bytes, the heap one result holds.
using Columns = std::vector<std::vector<std::string>>;
template <typename Result>
benchmark::internal::Benchmark* AddQuery(const std::string& name, int rows, std::function<int(Result&)> fill,
                                         bool held = false, Counters counters = {});
// Fills with sql on path through raw SQLite or SQLiteCpp.
std::function<int(Columns&)> Raw(const std::string& path, const std::string& sql);
std::function<int(Columns&)> SqliteCpp(const std::string& path, const std::string& sql);

// Raw SQLite: run on path opened (closed again after); sql run on path; sql stepped on db, its values copied;
// a prepared stmt stepped to its end, its values copied, then reset (returns the reset's code).
int OnFile(const std::string& path, const std::function<int(sqlite3*)>& run);
int RawExec(const std::string& path, const std::string& sql);
int RawSelectOn(sqlite3* db, const std::string& sql, Columns& columns);
int RawStepCopy(sqlite3_stmt* stmt, Columns& columns);

// Every file location holds kQueryFile: sel_<N> (kRowColumns) for N in selectSizes, and the join tables
// jl (kJoinRows rows, gid) and jr (1000 rows, gkey).
constexpr const char* kQueryFile = "query.db";
constexpr const char* kRowColumns = "id INTEGER PRIMARY KEY, qty INTEGER, price REAL, label TEXT";
constexpr int kJoinRows = 100000;
inline std::set<int> selectSizes;  // from ULO_BENCH_SIZES
// "CREATE TABLE table (columns); INSERT INTO table ...": values (a select list over i) for i = 0..rows-1.
std::string TableSql(const std::string& table, const std::string& columns, int rows, const std::string& values);
// table dropped and made again: rows rows of kRowColumns, id, id * 3, id * 0.5, 'row-<id>' for id 1..rows.
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

double HeapInUse();  // heap bytes in use (mallinfo2)

}  // namespace bench

#endif  // ULO_DB_BENCH_H
