// Schema: a column added to 100,000 rows (rewrite: every row copied into a new table, the way before), Migrate
// of an up-to-date file against an empty Select, Compact after deleting the older half of 100,000 rows.

#include <filesystem>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

void SchemaCases(const bench::Location& at)
{
    if (at.dir.empty()) {
        return;
    }
    const std::string prefix = "/" + at.name + "/";
    for (const std::string impl : {"lib", "raw"}) {  // columns c0..c99 in turn, the table made again before c0
        const std::string file = impl + ".db", path = at.Path(file.c_str());
        std::vector<std::shared_ptr<DAAddColumnRequest>> adds;
        std::vector<std::string> texts(100);
        for (std::string& text : texts) {
            adds.push_back(bench::Request<DAAddColumnRequest>(at, file.c_str(), "a"));
            adds.back()->SetColumn(("c" + std::to_string(adds.size() - 1)).c_str(), "INTEGER");
            adds.back()->SetDefault("0");
            DASqlGenerator().GetAddColumnSql(*adds.back(), text);
        }
        auto turn = std::make_shared<std::size_t>(0);
        bench::Add(
            "schema/AddColumn100000" + prefix + impl,
            [=] {
                const std::size_t i = (*turn)++ % adds.size();
                return impl == "lib" ? DADatabase().AddColumn(*adds[i]) : bench::RawExec(path, texts[i]);
            },
            {}, [=] { return *turn % adds.size() == 0 ? bench::RawExec(path, bench::FreshTable("a", 100000)) : 0; });
    }
    const std::string path = at.Path("rewrite.db");
    bench::RawExec(path, bench::FreshTable("w", 100000));
    bench::Add("schema/AddColumn100000" + prefix + "rewrite", [=] {
        return bench::RawExec(path,
                              "BEGIN IMMEDIATE; CREATE TABLE w2 (id INTEGER PRIMARY KEY, qty INTEGER, price "
                              "REAL, label TEXT, level INTEGER DEFAULT '0'); INSERT INTO w2 SELECT id, qty, "
                              "price, label, 0 FROM w; DROP TABLE w; ALTER TABLE w2 RENAME TO w; COMMIT;");
    })->Iterations(5);
    bench::RawExec(at.Path("version.db"), "CREATE TABLE e (k INTEGER); PRAGMA user_version = 1;");
    auto step = std::make_shared<DABatchRequest>();
    step->SetPath(at.dir.c_str(), "version.db");
    auto select = bench::Request<DASelectRequest>(at, "version.db", "e");
    DACreateRequest create;  // the step that made version 1
    create.SetTable("e");
    create.SetColumnKey("k", "INTEGER");
    step->Add(create);
    bench::Add("schema/MigrateUpToDate" + prefix + "lib", [=] { return DADatabase().Migrate(*step, 1); });
    bench::Add("schema/MigrateUpToDate" + prefix + "select", [=] {
        DACursor cursor;
        return DADatabase().Select(*select, cursor);
    });
    const std::string file = at.Path("compact.db");
    auto location = std::make_shared<DABasePath>();
    location->SetPath(at.dir.c_str(), "compact.db");
    const auto refill = [=] {
        return bench::RawExec(file, bench::FreshTable("t", 100000) + "DELETE FROM t WHERE id <= 50000;");
    };
    const double before = (refill(), static_cast<double>(std::filesystem::file_size(file)));
    const double after = (DADatabase().Compact(*location), static_cast<double>(std::filesystem::file_size(file)));
    bench::Add(
        "schema/Compact100000" + prefix + "lib", [=] { return DADatabase().Compact(*location); },
        {{"before_bytes", before}, {"after_bytes", after}}, refill)
        ->Iterations(3);
}

}  // namespace

ULO_BENCH_CASES(SchemaCases);
