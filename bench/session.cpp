// Sessions: a file held open (lib) against a per-call visit (percall) and a raw WAL connection held open running
// the same text (raw), or reusing one prepared statement (rawkept).

#include <atomic>
#include <chrono>
#include <cstring>
#include <thread>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "bench.h"
#include "dlog.h"

namespace {

using bench::Location;

// file with t (rows 1..1000) and tables - 1 more, indexed; a raw connection to it held open as given.
std::shared_ptr<sqlite3> Make(const Location& at, const std::string& file, int tables = 1,
                              const char* synchronous = "FULL", const char* journal = "WAL")
{
    const char* const columns = "id INTEGER PRIMARY KEY, qty INTEGER, label TEXT";
    std::string sql = "BEGIN;" + bench::TableSql("t", columns, 1000, "i + 1, (i + 1) * 3, 'row-' || (i + 1)");
    for (int i = 1; i < tables; ++i) {
        const std::string n = std::to_string(i);
        sql += "CREATE TABLE t" + n + " (" + columns + "); CREATE INDEX i" + n + " ON t" + n + "(label);";
    }
    sql += std::string("COMMIT; PRAGMA journal_mode=") + journal + "; PRAGMA synchronous=" + synchronous;
    sqlite3* db = nullptr;
    sqlite3_open(at.Path(file.c_str()).c_str(), &db);
    sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr);
    return {db, sqlite3_close};
}

// file made as Make does (tables tables) and held open by a session.
std::shared_ptr<DASession> Open(const Location& at, const std::string& file, bool sync = true, int tables = 1)
{
    Make(at, file, tables);
    auto session = std::make_shared<DASession>();
    session->SetSyncOnCommit(sync);
    DABasePath location;
    location.SetPath(at.dir.c_str(), file.c_str());
    return session->Open(location) == SQLITE_OK ? session : nullptr;
}

// sql prepared once on db, for the raw baseline that reuses one statement (rawkept).
std::shared_ptr<sqlite3_stmt> Kept(const std::shared_ptr<sqlite3>& db, const char* sql)
{
    sqlite3_stmt* stmt = nullptr;
    sqlite3_prepare_v2(db.get(), sql, -1, &stmt, nullptr);
    return {stmt, [db](sqlite3_stmt* s) { sqlite3_finalize(s); }};
}

// The select or the upsert of the row id of t in the session's file.
template <typename R>
std::shared_ptr<R> Row(int id)
{
    auto request = std::make_shared<R>();
    request->SetTable("t");
    if constexpr (std::is_same_v<R, DASelectRequest>) {
        request->SetWhere("id", id);
    } else {
        request->SetData("id", id);
        request->SetData("label", "upserted");
    }
    return request;
}

void Writes(const Location& at)
{
    auto upsert = Row<DAUpsertRequest>(7), located = Row<DAUpsertRequest>(7);
    located->SetPath(at.dir.c_str(), "percall.db");
    std::string text;
    DASqlGenerator().GetUpsertSql(*upsert, text);
    Make(at, "percall.db", 1, "FULL", "DELETE");
    bench::Add("session/Upsert/" + at.name + "/percall", [=] { return DADatabase().Upsert(*located); });
    for (const bool sync : {true, false}) {
        const std::string prefix = std::string("session/Upsert") + (sync ? "/" : "Unsynced/") + at.name + "/";
        auto session = Open(at, sync ? "synced.db" : "unsynced.db", sync);
        bench::Add(prefix + "lib", [=] { return session ? session->Upsert(*upsert) : 1; });
        auto raw = Make(at, sync ? "raw_full.db" : "raw_normal.db", 1, sync ? "FULL" : "NORMAL");
        bench::Add(prefix + "raw", [=] { return sqlite3_exec(raw.get(), text.c_str(), nullptr, nullptr, nullptr); });
        auto kept = Kept(raw, "INSERT OR REPLACE INTO t (id, label) VALUES (?, 'upserted')");
        bench::Add(prefix + "rawkept", [=] {
            sqlite3_bind_int(kept.get(), 1, 7);
            const int rc = sqlite3_step(kept.get());
            sqlite3_reset(kept.get());
            return rc == SQLITE_DONE ? 0 : rc;
        });
    }
}

// Select by key (held_bytes: the heap an open session holds beyond SQLite's page cache after a read and a
// write), and an empty select in a file of 1 and of 500 tables.
void Reads(const Location& at)
{
    const auto heap = [] {
        sqlite3_int64 pagecache = 0, peak = 0;
        sqlite3_status64(SQLITE_STATUS_PAGECACHE_OVERFLOW, &pagecache, &peak, 0);
        return bench::HeapInUse() - static_cast<double>(pagecache);
    };
    auto raw = Make(at, "raw_select.db");
    const double closed = heap();
    auto session = Open(at, "select.db");
    auto select = Row<DASelectRequest>(500), located = Row<DASelectRequest>(500);
    located->SetPath(at.dir.c_str(), "select.db");
    DACursor cursor;
    const int warm = session ? session->Select(*select, cursor) + session->Upsert(*Row<DAUpsertRequest>(0)) : 1;
    const double held = heap() - closed;
    const std::string prefix = "session/Select/" + at.name + "/";
    const auto lib = [=](DACursor& c) { return warm != 0 ? warm : session->Select(*select, c); };
    bench::Add(prefix + "lib", bench::Rows(lib, 1), {{"held_bytes", held}});
    bench::Add(prefix + "percall", bench::Rows([=](DACursor& c) { return DADatabase().Select(*located, c); }, 1));
    std::string text;
    DASqlGenerator().GetSelectSql(*select, text);
    bench::Add(prefix + "raw", [=] {
        bench::Columns columns;
        const int rc = bench::RawSelectOn(raw.get(), text, columns);
        return rc != SQLITE_OK ? rc : columns[0].size() == 1 ? 0 : 1;
    });
    auto kept = Kept(raw, "SELECT * FROM t WHERE id=?");
    bench::Add(prefix + "rawkept", [=] {
        bench::Columns columns;
        sqlite3_bind_int(kept.get(), 1, 500);
        const int rc = bench::RawStepCopy(kept.get(), columns);
        return rc != SQLITE_OK ? rc : columns[0].size() == 1 ? 0 : 1;
    });
    for (const int tables : {1, 500}) {
        const std::string file = "tables" + std::to_string(tables) + ".db";
        auto held = Open(at, file, true, tables);
        auto none = Row<DASelectRequest>(-1);
        bench::Add("session/EmptySelect" + std::to_string(tables) + "/" + at.name + "/lib", [=] {
            DACursor cursor;
            return held ? held->Select(*none, cursor) : 1;
        });
    }
}

// session/Readers{1,2}: pages of 50 rows read for a second beside a writer upserting without pause (rows:
// the reads); fails if a read met SQLITE_BUSY. (Reads of one row do not scale even on raw connections: each
// read transaction takes SQLite's process-wide file lock, which then costs more than the read.)
thread_local bool t_reader = false;

void Readers(const Location& at, int readers)
{
    auto session = Open(at, "readers.db");
    auto body = [=](benchmark::State& state) {
        for (auto _ : state) {
            std::atomic<bool> stop{false};
            std::atomic<int> reads{0}, busy{0};
            dlog_set_sink(
                [](int, int, const char*, const char* text, void* count) {
                    *static_cast<std::atomic<int>*>(count) += t_reader && std::strstr(text, "SQLITE BUSY") ? 1 : 0;
                },
                &busy);
            std::vector<std::thread> threads;
            threads.emplace_back([&] {
                for (int i = 0; !stop; ++i) {
                    session->Upsert(*Row<DAUpsertRequest>(2000 + i % 1000));
                }
            });
            const auto start = std::chrono::steady_clock::now();
            for (int t = 0; t < readers; ++t) {
                threads.emplace_back([&] {
                    t_reader = true;
                    DASelectRequest page;  // a reader paging the file: 50 rows
                    page.SetTable("t");
                    page.SetWhere("id", DACompare::LessEqual, 50);
                    for (DACursor cursor; !stop && session->Select(page, cursor) == 0; ++reads) {}
                });
            }
            std::this_thread::sleep_for(std::chrono::seconds(1));
            stop = true;
            state.SetIterationTime(std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
            for (std::thread& thread : threads) {
                thread.join();
            }
            dlog_set_sink(dlog_discard_sink, nullptr);
            state.counters["rows"] = reads.load();
            if (busy != 0) {
                state.SkipWithError("a read met SQLITE_BUSY");
            }
        }
    };
    benchmark::RegisterBenchmark(("session/Readers" + std::to_string(readers) + "/" + at.name + "/lib").c_str(), body)
        ->UseManualTime()
        ->Iterations(1)
        ->Unit(benchmark::kMicrosecond);
}

void SessionCases(const Location& at)
{
    if (!at.dir.empty()) {
        at.name == "disk" ? Writes(at) : Reads(at);
        Readers(at, 1);
        Readers(at, 2);
    }
}

}  // namespace

ULO_BENCH_CASES(SessionCases);
