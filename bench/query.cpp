// Queries: a DACursor against raw SQLite and SQLiteCpp copying every value of the same text as text.

#include <sstream>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

using bench::Columns;
using bench::Location;
using LibCall = std::function<int(DACursor&)>;  // a library query into the cursor

// name: fill(result) on a fresh Result returns the rows it holds, which must be rows; held adds the heap
// one result holds (result_bytes); iterations > 0 fixes the count, for calls of seconds.
template <typename Result, typename Fill>
void Add(const std::string& name, int rows, const Fill& fill, bool held = false, int iterations = 0)
{
    bench::Counters counters{{"rows", rows}};
    Result probe;
    const double before = bench::HeapInUse();
    if (held && fill(probe) == rows) {
        counters["result_bytes"] = bench::HeapInUse() - before;
    }
    const auto op = [=] {
        Result result;
        return fill(result) == rows ? 0 : 1;
    };
    auto* registered = bench::Add(name, op, counters);
    if (iterations > 0) {
        registered->Iterations(iterations);
    }
}

auto Lib(const LibCall& call)
{
    return [call](DACursor& cursor) { return call(cursor) == SQLITE_OK ? cursor.GetCount() : -1; };
}

void Compare(const std::string& prefix, const Location& at, const std::string& sql, int rows, const LibCall& call,
             bool held = false, int iterations = 0)
{
    Add<DACursor>(prefix + "lib", rows, Lib(call), held, iterations);
    for (const auto& [name, select] :
         {std::pair{"raw", bench::RawSelect}, std::pair{"sqlitecpp", bench::SqliteCppSelect}}) {
        const auto copy = [path = at.Path(bench::kQueryFile), sql, select = select](Columns& columns) {
            return select(path, sql, columns) == SQLITE_OK && !columns.empty() ? static_cast<int>(columns[0].size())
                                                                               : -1;
        };
        Add<Columns>(prefix + name, rows, copy, held, iterations);
    }
}

void Queries(const Location& at)
{
    std::string sql;
    for (const int rows : bench::SelectSizes()) {
        auto select = bench::Request<DASelectRequest>(at, bench::kQueryFile, bench::SelectTable(rows));
        DASqlGenerator().GetSelectSql(*select, sql);
        const LibCall call = [select](DACursor& c) { return DADatabase().Select(*select, c); };
        const std::string prefix = "select/" + std::to_string(rows) + "/" + at.name + "/";
        Compare(prefix, at, sql, rows, call, rows == 1000000, rows >= 1000000 ? 2 : 0);
    }
    auto join = std::make_shared<DAJoinRequest>();
    join->SetPath(at.dir.c_str(), bench::kQueryFile);
    join->SetLeftJoin("jl", "gid");
    join->SetRightJoin("jr", "gkey");
    DASqlGenerator().GetJoinSql(*join, sql);
    const LibCall joined = [join](DACursor& c) { return DADatabase().JoinSelect(*join, c); };
    Compare("join/" + std::to_string(bench::kJoinRows) + "/" + at.name + "/", at, sql, bench::kJoinRows, joined);
    // page/100000: rows 1,001-1,100 by the indexed key; selectall: what a caller did before Query.
    auto page = bench::Request<DAQueryRequest>(at, bench::kQueryFile, bench::SelectTable(100000));
    page->SetOrderBy("id");
    page->SetLimit(100, 1000);
    DASqlGenerator().GetQuerySql(*page, sql);
    auto all = bench::Request<DASelectRequest>(at, bench::kQueryFile, bench::SelectTable(100000));
    const LibCall paged = [page](DACursor& c) { return DADatabase().Query(*page, c); };
    const LibCall whole = [all](DACursor& c) { return DADatabase().Select(*all, c); };
    Compare("page/100000/" + at.name + "/", at, sql, 100, paged, true);
    Add<DACursor>("page/100000/" + at.name + "/selectall", 100000, Lib(whole), true);
    auto where = std::make_shared<DABasePath>();
    where->SetPath(at.dir.c_str(), bench::kQueryFile);
    DASqlGenerator().GetCheckTableSql("sel_100000", sql);
    const auto exists = [where] {
        bool found = false;
        return DADatabase().CheckExistTable(*where, "sel_100000", found) == SQLITE_OK && found ? 0 : 1;
    };
    const auto raw = [path = at.Path(bench::kQueryFile), sql] {
        Columns columns;
        return bench::RawSelect(path, sql, columns) == SQLITE_OK && columns.at(0).at(0) != "0" ? 0 : 1;
    };
    bench::Add("exist/CheckExistTable/" + at.name + "/lib", exists);
    bench::Add("exist/CheckExistTable/" + at.name + "/raw", raw);
}

// walk/100000/memory/{lib,raw}: typed reads of every row of a loaded cursor against the same reads of the
// raw columns; loaded once from the tmpfs copy.
void Walk(const Location& at)
{
    auto cursor = std::make_shared<DACursor>();
    auto columns = std::make_shared<Columns>();
    const std::string table = bench::SelectTable(100000);
    DADatabase().Select(*bench::Request<DASelectRequest>(at, bench::kQueryFile, table), *cursor);
    bench::RawSelect(at.Path(bench::kQueryFile), "SELECT * FROM " + table, *columns);
    const auto lib = [cursor] {
        int failures = cursor->GetCount() == 100000 ? 0 : 1, number = 0;
        double real = 0;
        std::string text;
        for (cursor->MoveToFirst(); cursor->MoveToNext() == 0;) {
            failures += cursor->GetInt("id", number) + cursor->GetInt("qty", number) +
                cursor->GetDouble("price", real) + cursor->GetString("label", text);
        }
        return failures;
    };
    const auto raw = [columns] {
        const auto read = [](const std::string& text, auto& out) {  // the conversion DACursor's reads make
            std::istringstream stream(text);
            return (stream >> out).fail() ? 1 : 0;
        };
        const Columns& c = *columns;
        int failures = c[0].size() == 100000 ? 0 : 1, number = 0;
        double real = 0;
        std::string text;
        for (std::size_t row = 0; row < c[0].size(); ++row) {
            failures += read(c[0][row], number) + read(c[1][row], number) + read(c[2][row], real);
            text = c[3][row];
        }
        return failures;
    };
    bench::Add("walk/100000/memory/lib", lib, {{"rows", 100000}});
    bench::Add("walk/100000/memory/raw", raw, {{"rows", 100000}});
}

void QueryCases(const Location& at)
{
    if (!at.dir.empty()) {
        Queries(at);
    }
    if (at.name == "tmpfs") {
        Walk(at);
    }
}

}  // namespace

ULO_BENCH_CASES(QueryCases);
