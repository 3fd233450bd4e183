// Queries: a DACursor against raw SQLite and SQLiteCpp copying every value of the same text as text.

#include <sstream>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

using bench::Columns;
using bench::Location;
// prefix{lib,raw,sqlitecpp}: call against sql on the query file; held: result_bytes; iterations > 0 fixes the
// count, for calls of seconds.
void Compare(const std::string& prefix, const Location& at, const std::string& sql, int rows,
             std::function<int(DACursor&)> call, bool held = false, int iterations = 0)
{
    const std::string path = at.Path(bench::kQueryFile);
    for (auto* registered : {bench::AddQuery(prefix + "lib", rows, std::move(call), held),
                             bench::AddQuery(prefix + "raw", rows, bench::Raw(path, sql), held),
                             bench::AddQuery(prefix + "sqlitecpp", rows, bench::SqliteCpp(path, sql), held)}) {
        if (iterations > 0) {
            registered->Iterations(iterations);
        }
    }
}

// walk/100000: the raw reads convert as DACursor does (std::istringstream); loaded once from the tmpfs copy.
void Walk(const Location& at)
{
    auto cursor = std::make_shared<DACursor>();
    auto columns = std::make_shared<Columns>();
    DADatabase().Select(*bench::Request<DASelectRequest>(at, bench::kQueryFile, "sel_100000"), *cursor);
    bench::Raw(at.Path(bench::kQueryFile), "SELECT * FROM sel_100000")(*columns);
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
        const auto read = [](const std::string& text, auto& out) { return (std::istringstream(text) >> out).fail(); };
        const Columns& c = *columns;
        int failures = c.at(0).size() == 100000 ? 0 : 1, number = 0;
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

}  // namespace

void bench::QueryCases(const Location& at)
{
    std::string sql;
    for (const int rows : bench::selectSizes) {
        auto select = bench::Request<DASelectRequest>(at, bench::kQueryFile, "sel_" + std::to_string(rows));
        DASqlGenerator().GetSelectSql(*select, sql);
        Compare(
            "select/" + std::to_string(rows) + "/" + at.name + "/", at, sql, rows,
            [select](DACursor& c) { return DADatabase().Select(*select, c); }, rows == 1000000,
            rows >= 1000000 ? 2 : 0);
    }
    auto join = std::make_shared<DAJoinRequest>();
    join->SetPath(at.dir.c_str(), bench::kQueryFile);
    join->SetLeftJoin("jl", "gid");
    join->SetRightJoin("jr", "gkey");
    DASqlGenerator().GetJoinSql(*join, sql);
    Compare("join/" + std::to_string(bench::kJoinRows) + "/" + at.name + "/", at, sql, bench::kJoinRows,
            [join](DACursor& c) { return DADatabase().JoinSelect(*join, c); });
    // page/100000: rows 1,001-1,100 by the indexed key; selectall: what a caller did before Query.
    auto page = bench::Request<DAQueryRequest>(at, bench::kQueryFile, "sel_100000");
    page->SetOrderBy("id");
    page->SetLimit(100, 1000);
    DASqlGenerator().GetQuerySql(*page, sql);
    auto all = bench::Request<DASelectRequest>(at, bench::kQueryFile, "sel_100000");
    Compare(
        "page/100000/" + at.name + "/", at, sql, 100, [page](DACursor& c) { return DADatabase().Query(*page, c); },
        true);
    bench::AddQuery<DACursor>(
        "page/100000/" + at.name + "/selectall", 100000, [all](DACursor& c) { return DADatabase().Select(*all, c); },
        true);
    DASqlGenerator().GetCheckTableSql("sel_100000", sql);
    bench::Add("exist/CheckExistTable/" + at.name + "/lib", [all] {
        bool found = false;
        return DADatabase().CheckExistTable(*all, "sel_100000", found) == SQLITE_OK && found ? 0 : 1;
    });
    bench::AddQuery("exist/CheckExistTable/" + at.name + "/raw", 1, bench::Raw(at.Path(bench::kQueryFile), sql));
    if (at.name == "tmpfs") {
        Walk(at);
    }
}
