// Schema: AddColumn (against rewriting the table), Migrate of an up-to-date file, Compact.

#include <filesystem>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench.h"

void bench::SchemaCases(const Location& at)
{
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
    const std::string rewrite = "BEGIN IMMEDIATE; CREATE TABLE w2 (" + std::string(bench::kRowColumns) +
        ", level INTEGER); INSERT INTO w2 SELECT id, qty, price, label, 0 FROM w; DROP TABLE w;";
    const bench::Op copy = [=] { return bench::RawExec(path, rewrite + "ALTER TABLE w2 RENAME TO w; COMMIT"); };
    bench::Add("schema/AddColumn100000" + prefix + "rewrite", copy)->Iterations(5);
    bench::RawExec(at.Path("version.db"), "CREATE TABLE e (k INTEGER); PRAGMA user_version = 1;");
    auto step = std::make_shared<DABatchRequest>();
    step->SetPath(at.dir.c_str(), "version.db");
    auto select = bench::Request<DASelectRequest>(at, "version.db", "e");
    DACreateRequest create;  // the step that made version 1
    create.SetTable("e");
    create.SetColumnKey("k", "INTEGER");
    step->Add(create);
    bench::Add("schema/MigrateUpToDate" + prefix + "lib", [=] { return DADatabase().Migrate(*step, 1); });
    const auto empty = [=](DACursor& cursor) { return DADatabase().Select(*select, cursor); };
    bench::AddQuery<DACursor>("schema/MigrateUpToDate" + prefix + "select", -1, empty);
    const std::string file = at.Path("compact.db");
    auto location = bench::Request<DASelectRequest>(at, "compact.db", "t");  // its location
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
