// Writes: each operation against raw SQLite running its generator's text (open, exec, close); batches.

#include <cstdio>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

using bench::Location;
constexpr int kDeletePool = 1000;  // rows of d, refilled (untimed) when all are deleted

// write/<name>: the requests in turn, as SQLite writes nothing for an update that changes nothing or a delete
// matching nothing. 9 repetitions: calls near 100 us vary by several per cent.
template <typename R>
void LibAndRaw(const Location& at, const std::string& name, std::vector<std::shared_ptr<R>> requests,
               int (DADatabase::*run)(R&), void (DASqlGenerator::*generate)(R&, std::string&),
               bench::Op untimed = nullptr)
{
    std::vector<std::string> texts(requests.size());
    for (std::size_t i = 0; i < requests.size(); ++i) {
        (DASqlGenerator().*generate)(*requests[i], texts[i]);
    }
    auto turn = std::make_shared<std::size_t>(0);
    const std::string prefix = "write/" + name + "/" + at.name + "/";
    const auto lib = [=] { return (DADatabase().*run)(*requests[(*turn)++ % requests.size()]); };
    const auto raw = [=, path = at.Path("write.db")] { return bench::RawExec(path, texts[(*turn)++ % texts.size()]); };
    bench::Add(prefix + "lib", lib, {}, untimed)->Repetitions(9);
    bench::Add(prefix + "raw", raw, {}, untimed)->Repetitions(9);
}

// batch/Upsert10000: raw builds the same texts in the loop too and runs them one by one, as the batch does.
constexpr int kStatements = 10000;

// use of the upserts of rows 1..count of b in turn, up to the first that does not return 0.
int EachUpsert(const Location& at, int count, const std::function<int(DAUpsertRequest&)>& use)
{
    int rc = 0;
    for (int i = 1; i <= count && rc == 0; ++i) {
        DAUpsertRequest request;
        request.SetPath(at.dir.c_str(), "batch.db");
        request.SetTable("b");
        request.SetData("id", i);
        request.SetData("qty", i * 3);
        request.SetData("price", i * 0.5);
        request.SetData("label", ("row-" + std::to_string(i)).c_str());
        rc = use(request);
    }
    return rc;
}

void Batches(const Location& at)
{
    const std::string path = at.Path("batch.db"), prefix = "batch/Upsert10000/" + at.name + "/";
    bench::RawExec(path, std::string("CREATE TABLE b (") + bench::kRowColumns + ")");
    const auto fill = [at](DABatchRequest& batch) {
        batch.SetPath(at.dir.c_str(), "batch.db");
        return EachUpsert(at, kStatements, [&](DAUpsertRequest& request) { return batch.Add(request); });
    };
    double text = 0;
    EachUpsert(at, kStatements, [&](DAUpsertRequest& request) {
        std::string sql;
        DASqlGenerator().GetUpsertSql(request, sql);
        return text += static_cast<double>(sql.size()), 0;
    });
    const double before = bench::HeapInUse();
    DABatchRequest probe;
    const double held = (fill(probe), bench::HeapInUse() - before);
    const auto lib = [fill] {
        DABatchRequest batch;
        const int rc = fill(batch);
        return rc != 0 ? rc : DADatabase().ExecuteBatch(batch);
    };
    const auto raw = [path] {
        return bench::OnFile(path, [](sqlite3* db) {
            int rc = sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
            for (int i = 1; rc == SQLITE_OK && i <= kStatements; ++i) {
                char price[32];
                std::snprintf(price, sizeof price, "%g", i * 0.5);
                const std::string sql = "INSERT OR REPLACE INTO b (id, qty, price, label) VALUES ('" +
                    std::to_string(i) + "', '" + std::to_string(i * 3) + "', '" + price + "', 'row-" +
                    std::to_string(i) + "')";
                rc = sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr);
            }
            return rc != SQLITE_OK ? rc : sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
        });
    };
    const int calls = at.name == "disk" ? 500 : kStatements;
    const auto single = [at, calls] {
        return EachUpsert(at, calls, [](DAUpsertRequest& request) { return DADatabase().Upsert(request); });
    };
    bench::Add(prefix + "lib", lib, {{"statements", kStatements}, {"held_bytes", held}, {"text_bytes", text}});
    bench::Add(prefix + "raw", raw, {{"statements", kStatements}});
    bench::Add(prefix + "single", single, {{"statements", calls}})->Iterations(1);
}

}  // namespace

void bench::WriteCases(const Location& at)
{
    const std::string path = at.Path("write.db");
    bench::RawExec(path, bench::FreshTable("w", 100));  // d: made by the first refill
    auto upsert = bench::Request<DAUpsertRequest>(at, "write.db", "w");
    upsert->SetData("id", 7);
    upsert->SetData("qty", 42);
    upsert->SetData("price", 2.5);
    upsert->SetData("label", "upserted");
    LibAndRaw(at, "Upsert", {upsert}, &DADatabase::Upsert, &DASqlGenerator::GetUpsertSql);
    std::vector<std::shared_ptr<DAUpdateRequest>> updates;
    for (const int qty : {43, 44}) {
        updates.push_back(bench::Request<DAUpdateRequest>(at, "write.db", "w"));
        updates.back()->SetData("qty", qty);
        updates.back()->SetData("label", "updated");
        updates.back()->SetWhere("id", 8);
    }
    LibAndRaw(at, "Update", updates, &DADatabase::Update, &DASqlGenerator::GetUpdateSql);
    std::vector<std::shared_ptr<DADeleteRequest>> deletes;
    for (int id = 1; id <= kDeletePool; ++id) {
        deletes.push_back(bench::Request<DADeleteRequest>(at, "write.db", "d"));
        deletes.back()->SetWhere("id", id);
    }
    auto calls = std::make_shared<int>(0);
    LibAndRaw(at, "Delete", deletes, &DADatabase::Delete, &DASqlGenerator::GetDeleteSql, [=] {
        return (*calls)++ % kDeletePool == 0 ? bench::RawExec(path, bench::FreshTable("d", kDeletePool)) : 0;
    });
    auto create = bench::Request<DACreateRequest>(at, "write.db", "w");
    create->SetPrimaryKey("id", "INTEGER");
    create->SetColumnKey("qty", "INTEGER");
    create->SetColumnKey("price", "REAL");
    create->SetColumnKey("label", "TEXT");
    LibAndRaw(at, "CreateTable", {create}, &DADatabase::CreateTable, &DASqlGenerator::GetCreateTableSql);
    LibAndRaw(at, "DropTable", {bench::Request<DADropRequest>(at, "write.db", "tmp_drop")}, &DADatabase::DropTable,
              &DASqlGenerator::GetDropTableSql,
              [=] { return bench::RawExec(path, std::string("CREATE TABLE tmp_drop (") + bench::kRowColumns + ")"); });
    Batches(at);
}
