// The library against raw SQLite (and SQLiteCpp for queries), same data,
// same process, same run. Every case is registered once per location: a
// tmpfs folder (/dev/shm) and a folder on the ordinary disk.
//
// Names: <group>/<case>/<location>/<impl>, impl being lib, raw, sqlitecpp
// or stdmutex. scripts/bench.sh turns the JSON output into the report.
//
// Extra flags (after Google Benchmark's own):
//   --ulo_locations=tmpfs,disk   which folders to run on
//   --ulo_sizes=1000,10000,...   which select sizes to run
//   --ulo_tmpfs_parent=DIR       default /dev/shm
//   --ulo_disk_parent=DIR        default $TMPDIR or /tmp

#include <malloc.h>
#include <sys/vfs.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <mutex>
#include <sstream>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <sqlite3.h>

#include "DADatabase.h"
#include "DAMutex.h"
#include "DASqlGenerator.h"
#include "bench_data.h"
#include "dlog.h"

namespace {

using bench::Fail;
using bench::kQueryFile;
using bench::Location;
using bench::Register;

constexpr const char* kWriteFile = "write.db";
constexpr int kWriteRows = 100;  // rows of the write table w
constexpr int kDeletePool = 1000;  // rows of the delete table d, refilled when used up
constexpr int kWalkRows = 100000;  // rows of the cursor walk

std::vector<Location> g_locations;

// ---------------------------------------------------------------- helpers

// The raw write: open the same path, execute the same text, close.
int RawExec(const std::string& path, const std::string& sql)
{
    sqlite3* db = nullptr;
    int rc = sqlite3_open(path.c_str(), &db);
    if (rc == SQLITE_OK) {
        char* error = nullptr;
        rc = sqlite3_exec(db, sql.c_str(), nullptr, nullptr, &error);
        sqlite3_free(error);
    }
    sqlite3_close(db);
    return rc;
}

// The raw existence check: open, prepare, step, read the count, close.
int RawCheckExist(const std::string& path, const std::string& sql, bool& exists)
{
    sqlite3* db = nullptr;
    int rc = sqlite3_open(path.c_str(), &db);
    if (rc == SQLITE_OK) {
        sqlite3_stmt* stmt = nullptr;
        rc = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
        bool found = false;
        while (rc == SQLITE_OK && sqlite3_step(stmt) == SQLITE_ROW) {
            found = found || sqlite3_column_int(stmt, 0) > 0;
        }
        exists = found;
        sqlite3_finalize(stmt);
    }
    sqlite3_close(db);
    return rc;
}

// The conversion DACursor's typed reads make: formatted extraction from a
// fresh default stream over a copy of the value.
template <typename Number>
bool ReadNumber(const std::string& text, Number& out)
{
    std::istringstream stream(text);
    Number number{};
    stream >> number;
    if (stream.fail()) {
        return false;
    }
    out = number;
    return true;
}

void CreateWriteRequest(DACreateRequest& request, const Location& location, const char* table)
{
    request.SetPath(location.dir.c_str(), kWriteFile);
    request.SetTable(table);
    request.SetPrimaryKey("id", "INTEGER");
    request.SetColumnKey("qty", "INTEGER");
    request.SetColumnKey("price", "REAL");
    request.SetColumnKey("label", "TEXT");
}

std::string RefillDeletePoolSql()
{
    return "WITH RECURSIVE c(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM c WHERE x < " + std::to_string(kDeletePool) +
        ") INSERT OR REPLACE INTO d (id, qty, price, label) SELECT x, x * 3, x * 0.5, 'row-' || x FROM c";
}

bool PrepareWriteDatabase(const Location& location)
{
    DADatabase db;
    for (const char* table : {"w", "d"}) {
        DACreateRequest create;
        CreateWriteRequest(create, location, table);
        if (db.CreateTable(create) != SQLITE_OK) {
            return false;
        }
    }
    const std::string path = location.Path(kWriteFile);
    return bench::RawExecScript(path,
                                "WITH RECURSIVE c(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM c WHERE x < " +
                                    std::to_string(kWriteRows) +
                                    ") INSERT OR REPLACE INTO w (id, qty, price, label) SELECT x, x, x * 0.5, "
                                    "'row-' || x FROM c") &&
        bench::RawExecScript(path, RefillDeletePoolSql());
}

// ---------------------------------------------------------------- writes

// A write case: lib runs the requests in turn through op; raw executes
// their statement texts in the same turn. before(), if given, runs untimed
// before every call.
template <typename Request>
void RegisterWrite(const Location& location, const std::string& caseName,
                   std::vector<std::shared_ptr<Request>> requests, int (DADatabase::*op)(Request&),
                   void (DASqlGenerator::*generate)(Request&, std::string&), std::function<void()> before = nullptr)
{
    const std::string prefix = "write/" + caseName + "/" + location.name + "/";
    const std::string path = location.Path(kWriteFile);
    Register(prefix + "lib", [requests, op, before](benchmark::State& state) {
        DADatabase db;
        std::size_t turn = 0;
        for (auto _ : state) {
            if (before) {
                state.PauseTiming();
                before();
                state.ResumeTiming();
            }
            const int rc = (db.*op)(*requests[turn++ % requests.size()]);
            if (rc != SQLITE_OK) {
                Fail(state, "library call", rc);
                break;
            }
        }
    });
    Register(prefix + "raw", [requests, generate, before, path](benchmark::State& state) {
        std::vector<std::string> texts;
        for (const auto& request : requests) {
            texts.emplace_back();
            (DASqlGenerator().*generate)(*request, texts.back());
        }
        std::size_t turn = 0;
        for (auto _ : state) {
            if (before) {
                state.PauseTiming();
                before();
                state.ResumeTiming();
            }
            const int rc = RawExec(path, texts[turn++ % texts.size()]);
            if (rc != SQLITE_OK) {
                Fail(state, "sqlite3_exec", rc);
                break;
            }
        }
    });
}

// Delete takes a different row each time from a pool that is refilled,
// untimed, when used up; lib and raw delete the same rows.
void RegisterDelete(const Location& location)
{
    const std::string prefix = "write/Delete/" + location.name + "/";
    const std::string path = location.Path(kWriteFile);
    auto requests = std::make_shared<std::vector<std::unique_ptr<DADeleteRequest>>>();
    auto texts = std::make_shared<std::vector<std::string>>();
    for (int key = 1; key <= kDeletePool; ++key) {
        auto request = std::make_unique<DADeleteRequest>();
        request->SetPath(location.dir.c_str(), kWriteFile);
        request->SetTable("d");
        request->SetWhere("id", key);
        std::string sql;
        DASqlGenerator().GetDeleteSql(*request, sql);
        texts->push_back(sql);
        requests->push_back(std::move(request));
    }
    auto run = [path](benchmark::State& state, const std::function<int(std::size_t)>& call) {
        std::size_t next = 0;
        if (!bench::RawExecScript(path, RefillDeletePoolSql())) {
            state.SkipWithError("refill failed");
        }
        for (auto _ : state) {
            if (next == kDeletePool) {
                state.PauseTiming();
                bench::RawExecScript(path, RefillDeletePoolSql());
                next = 0;
                state.ResumeTiming();
            }
            const int rc = call(next++);
            if (rc != SQLITE_OK) {
                Fail(state, "delete", rc);
                break;
            }
        }
    };
    Register(prefix + "lib", [run, requests](benchmark::State& state) {
        DADatabase db;
        run(state, [&](std::size_t i) { return db.Delete(*(*requests)[i]); });
    });
    Register(prefix + "raw", [run, texts, path](benchmark::State& state) {
        run(state, [&](std::size_t i) { return RawExec(path, (*texts)[i]); });
    });
}

void RegisterWrites(const Location& location)
{
    auto upsert = std::make_shared<DAUpsertRequest>();
    upsert->SetPath(location.dir.c_str(), kWriteFile);
    upsert->SetTable("w");
    upsert->SetData("id", 7);
    upsert->SetData("qty", 42);
    upsert->SetData("price", 2.5);
    upsert->SetData("label", "upserted");
    RegisterWrite<DAUpsertRequest>(location, "Upsert", {upsert}, &DADatabase::Upsert, &DASqlGenerator::GetUpsertSql);

    // Two updates in turn: SQLite writes nothing when a row would not change.
    std::vector<std::shared_ptr<DAUpdateRequest>> updates;
    for (const int qty : {43, 44}) {
        auto update = std::make_shared<DAUpdateRequest>();
        update->SetPath(location.dir.c_str(), kWriteFile);
        update->SetTable("w");
        update->SetData("qty", qty);
        update->SetData("label", "updated");
        update->SetWhere("id", 8);
        updates.push_back(update);
    }
    RegisterWrite<DAUpdateRequest>(location, "Update", updates, &DADatabase::Update, &DASqlGenerator::GetUpdateSql);

    RegisterDelete(location);

    auto create = std::make_shared<DACreateRequest>();
    CreateWriteRequest(*create, location, "w");
    RegisterWrite<DACreateRequest>(location, "CreateTable", {create}, &DADatabase::CreateTable,
                                   &DASqlGenerator::GetCreateTableSql);

    auto drop = std::make_shared<DADropRequest>();
    drop->SetPath(location.dir.c_str(), kWriteFile);
    drop->SetTable("tmp_drop");
    const std::string path = location.Path(kWriteFile);
    RegisterWrite<DADropRequest>(location, "DropTable", {drop}, &DADatabase::DropTable,
                                 &DASqlGenerator::GetDropTableSql, [path] {
                                     RawExec(path,
                                             "CREATE TABLE tmp_drop (id INTEGER PRIMARY KEY, qty INTEGER, "
                                             "price REAL, label TEXT)");
                                 });
}

// ---------------------------------------------------------------- queries

// One query case: lib through call(db, cursor), raw and SQLiteCpp through
// the statement text the library would run. rows: the expected count.
void RegisterQuery(const std::string& prefix, const std::string& path, const std::string& sql, int rows,
                   std::function<int(DADatabase&, DACursor&)> call, int iterations)
{
    Register(
        prefix + "lib",
        [call, rows](benchmark::State& state) {
            DADatabase db;
            for (auto _ : state) {
                DACursor cursor;
                const int rc = call(db, cursor);
                if (rc != SQLITE_OK || cursor.GetCount() != rows) {
                    Fail(state, "library query", rc);
                    break;
                }
            }
            state.counters["rows"] = rows;
            state.SetItemsProcessed(state.iterations() * rows);
        },
        iterations);
    // The two baselines differ only in the function that copies the rows.
    const struct {
        const char* suffix;
        int (*copy)(const std::string&, const std::string&, bench::RawColumns&);
        const char* what;
    } baselines[] = {{"raw", &bench::RawSelect, "raw query"},
                     {"sqlitecpp", &bench::SqliteCppSelect, "SQLiteCpp query"}};
    for (const auto& baseline : baselines) {
        Register(
            prefix + baseline.suffix,
            [path, sql, rows, copy = baseline.copy, what = baseline.what](benchmark::State& state) {
                for (auto _ : state) {
                    bench::RawColumns columns;
                    const int rc = copy(path, sql, columns);
                    if (rc != SQLITE_OK || columns.empty() || columns[0].size() != static_cast<std::size_t>(rows)) {
                        Fail(state, what, rc);
                        break;
                    }
                }
                state.counters["rows"] = rows;
                state.SetItemsProcessed(state.iterations() * rows);
            },
            iterations);
    }
}

void RegisterQueries(const Location& location, const std::vector<int>& sizes)
{
    const std::string path = location.Path(kQueryFile);
    for (const int rows : sizes) {
        auto request = std::make_shared<DASelectRequest>();
        request->SetPath(location.dir.c_str(), kQueryFile);
        const std::string table = bench::SelectTable(rows);
        request->SetTable(table.c_str());
        std::string sql;
        DASqlGenerator().GetSelectSql(*request, sql);
        // 1M rows: a fixed, small number of iterations.
        RegisterQuery(
            "select/" + std::to_string(rows) + "/" + location.name + "/", path, sql, rows,
            [request](DADatabase& db, DACursor& cursor) { return db.Select(*request, cursor); },
            rows >= 1000000 ? 2 : 0);
    }

    auto join = std::make_shared<DAJoinRequest>();
    join->SetPath(location.dir.c_str(), kQueryFile);
    join->SetLeftJoin("jl", "gid");
    join->SetRightJoin("jr", "gkey");
    std::string joinSql;
    DASqlGenerator().GetJoinSql(*join, joinSql);
    RegisterQuery(
        "join/" + std::to_string(bench::kJoinRows) + "/" + location.name + "/", path, joinSql, bench::kJoinRows,
        [join](DADatabase& db, DACursor& cursor) { return db.JoinSelect(*join, cursor); }, 0);

    auto where = std::make_shared<DABasePath>();
    where->SetPath(location.dir.c_str(), kQueryFile);
    std::string existSql;
    DASqlGenerator().GetCheckTableSql("sel_1000", existSql);
    const std::string prefix = "exist/CheckExistTable/" + location.name + "/";
    Register(prefix + "lib", [where](benchmark::State& state) {
        DADatabase db;
        for (auto _ : state) {
            bool exists = false;
            const int rc = db.CheckExistTable(*where, "sel_1000", exists);
            if (rc != SQLITE_OK || !exists) {
                Fail(state, "CheckExistTable", rc);
                break;
            }
        }
    });
    Register(prefix + "raw", [path, existSql](benchmark::State& state) {
        for (auto _ : state) {
            bool exists = false;
            const int rc = RawCheckExist(path, existSql, exists);
            if (rc != SQLITE_OK || !exists) {
                Fail(state, "raw check", rc);
                break;
            }
        }
    });
}

// ---------------------------------------------------------------- cursor walk

// Times walk over data that load() prepares once: walk(sum, real, text)
// reads every value of every row and returns how many reads failed.
template <typename Load, typename Walk>
void TimeWalk(benchmark::State& state, const Load& load, const Walk& walk)
{
    if (!load()) {
        state.SkipWithError("load failed");
    }
    for (auto _ : state) {
        long long sum = 0;
        double real = 0;
        std::string text;
        const int failures = walk(sum, real, text);
        benchmark::DoNotOptimize(sum);
        benchmark::DoNotOptimize(real);
        if (failures != 0) {
            state.SkipWithError("a typed read failed");
            break;
        }
    }
    state.counters["rows"] = kWalkRows;
    state.SetItemsProcessed(state.iterations() * kWalkRows);
}

// A full MoveToNext walk with a typed read per value, against the same
// reads from the raw column vectors. The data is loaded once, untimed.
void RegisterWalk(const Location& location)
{
    struct Data {
        DACursor cursor;
        bench::RawColumns columns;
        bool loaded = false;
    };
    auto data = std::make_shared<Data>();
    const std::string table = bench::SelectTable(kWalkRows);
    auto load = [data, location, table]() {
        if (data->loaded) {
            return true;
        }
        DASelectRequest request;
        request.SetPath(location.dir.c_str(), kQueryFile);
        request.SetTable(table.c_str());
        std::string sql;
        DASqlGenerator().GetSelectSql(request, sql);
        DADatabase db;
        data->loaded = db.Select(request, data->cursor) == SQLITE_OK &&
            bench::RawSelect(location.Path(kQueryFile), sql, data->columns) == SQLITE_OK &&
            data->cursor.GetCount() == kWalkRows && data->columns.size() == 4;
        return data->loaded;
    };
    const std::string prefix = "walk/" + std::to_string(kWalkRows) + "/memory/";
    Register(prefix + "lib", [data, load](benchmark::State& state) {
        TimeWalk(state, load, [&cursor = data->cursor](long long& sum, double& real, std::string& text) {
            int failures = 0;
            cursor.MoveToFirst();
            while (cursor.MoveToNext() == 0) {
                int number = 0;
                double value = 0;
                failures += cursor.GetInt("id", number);
                sum += number;
                failures += cursor.GetInt("qty", number);
                sum += number;
                failures += cursor.GetDouble("price", value);
                real += value;
                failures += cursor.GetString("label", text);
                sum += static_cast<long long>(text.size());
            }
            return failures;
        });
    });
    Register(prefix + "raw", [data, load](benchmark::State& state) {
        TimeWalk(state, load, [&columns = data->columns](long long& sum, double& real, std::string& text) {
            int failures = 0;
            const std::size_t rows = columns[0].size();
            for (std::size_t row = 0; row < rows; ++row) {
                int number = 0;
                double value = 0;
                failures += ReadNumber(columns[0][row], number) ? 0 : 1;
                sum += number;
                failures += ReadNumber(columns[1][row], number) ? 0 : 1;
                sum += number;
                failures += ReadNumber(columns[2][row], value) ? 0 : 1;
                real += value;
                text = columns[3][row];
                sum += static_cast<long long>(text.size());
            }
            return failures;
        });
    });
}

// ---------------------------------------------------------------- named lock

// A name like the ones the library makes: a heap address in hexadecimal.
std::string LockName()
{
    auto probe = std::make_unique<int>(0);
    char name[32];
    std::snprintf(name, sizeof name, "%lx", static_cast<unsigned long>(reinterpret_cast<std::uintptr_t>(probe.get())));
    return name;
}

std::mutex g_referenceMutex;

void RegisterLocks()
{
    const std::string name = LockName();
    auto lockBody = [name](benchmark::State& state) {
        for (auto _ : state) {
            DAMutex mutex(name.c_str());
            mutex.Lock();
            mutex.Unlock();
        }
        state.SetItemsProcessed(state.iterations());
    };
    auto referenceBody = [](benchmark::State& state) {
        for (auto _ : state) {
            g_referenceMutex.lock();
            g_referenceMutex.unlock();
        }
        state.SetItemsProcessed(state.iterations());
    };
    Register("lock/uncontended/memory/lib", lockBody)->Unit(benchmark::kNanosecond);
    Register("lock/uncontended/memory/stdmutex", referenceBody)->Unit(benchmark::kNanosecond);
    Register("lock/4threads/memory/lib", lockBody)->Threads(4)->Unit(benchmark::kNanosecond);
    Register("lock/4threads/memory/stdmutex", referenceBody)->Threads(4)->Unit(benchmark::kNanosecond);
}

// ---------------------------------------------------------------- main

// glibc raises its mmap threshold the first time a large mmap-ed block is
// freed, after which large blocks come from the heap. Whichever case first
// frees a large vector would otherwise run in a different allocator regime
// from the cases after it; one large free at the start puts every case in
// the regime a long-running process is in.
void WarmUpAllocator()
{
    void* block = std::malloc(16U << 20U);
    benchmark::DoNotOptimize(block);
    std::free(block);
}

std::string FileSystemType(const std::string& dir)
{
    struct statfs info {};
    if (statfs(dir.c_str(), &info) != 0) {
        return "unknown";
    }
    return info.f_type == 0x01021994 ? "tmpfs" : "other (0x" + [&] {
        char text[32];
        std::snprintf(text, sizeof text, "%lx", static_cast<unsigned long>(info.f_type));
        return std::string(text);
    }() + ")";
}

std::string FlagValue(int argc, char** argv, const char* flag, const std::string& fallback)
{
    const std::string prefix = std::string("--") + flag + "=";
    for (int i = 1; i < argc; ++i) {
        if (std::strncmp(argv[i], prefix.c_str(), prefix.size()) == 0) {
            return argv[i] + prefix.size();
        }
    }
    return fallback;
}

std::vector<std::string> Split(const std::string& text)
{
    std::vector<std::string> parts;
    std::stringstream stream(text);
    std::string part;
    while (std::getline(stream, part, ',')) {
        if (!part.empty()) {
            parts.push_back(part);
        }
    }
    return parts;
}

}  // namespace

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    dlog_set_sink(dlog_discard_sink, nullptr);
    WarmUpAllocator();

    const char* tmpdir = std::getenv("TMPDIR");
    const std::string tmpfsParent = FlagValue(argc, argv, "ulo_tmpfs_parent", "/dev/shm");
    const std::string diskParent = FlagValue(argc, argv, "ulo_disk_parent", tmpdir != nullptr ? tmpdir : "/tmp");
    std::vector<int> sizes;
    for (const std::string& size : Split(FlagValue(argc, argv, "ulo_sizes", "1000,10000,100000,1000000"))) {
        sizes.push_back(std::stoi(size));
    }
    if (std::find(sizes.begin(), sizes.end(), kWalkRows) == sizes.end()) {
        sizes.push_back(kWalkRows);  // the walk reads it
    }

    int status = 0;
    for (const std::string& name : Split(FlagValue(argc, argv, "ulo_locations", "tmpfs,disk"))) {
        const std::string parent = name == "tmpfs" ? tmpfsParent : diskParent;
        Location location{name, bench::MakeTempDir(parent, "ulo_db_bench")};
        if (location.dir.empty()) {
            status = 1;
            break;
        }
        g_locations.push_back(location);
        benchmark::AddCustomContext("ulo_dir_" + name, location.dir + " [" + FileSystemType(location.dir) + "]");
        std::fprintf(stderr, "preparing %s data in %s\n", name.c_str(), location.dir.c_str());
        if (!bench::CreateQueryDatabase(location.Path(kQueryFile), sizes, true) || !PrepareWriteDatabase(location)) {
            status = 1;
            break;
        }
    }
    benchmark::AddCustomContext("sqlite_version", sqlite3_libversion());

    if (status == 0 && !g_locations.empty()) {
        for (const Location& location : g_locations) {
            RegisterWrites(location);
            bench::RegisterBatch(location);
        }
        for (const Location& location : g_locations) {
            RegisterQueries(location, sizes);
        }
        bench::RegisterPageQueries(g_locations);
        RegisterWalk(g_locations.front());
        RegisterLocks();
        benchmark::RunSpecifiedBenchmarks();
    }
    benchmark::Shutdown();
    for (const Location& location : g_locations) {
        bench::RemoveTree(location.dir);
    }
    return status;
}
