// Sessions: a file held open against per-call visits and raw WAL connections held open.

#include <atomic>
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
    return session->Open(*bench::Request<DASelectRequest>(at, file.c_str(), "t")) == SQLITE_OK ? session : nullptr;
}

// A raw baseline on a held connection: text prepared each call (raw), or once and bound with id (rawkept).
std::function<int(bench::Columns&)> Raw(const std::shared_ptr<sqlite3>& db, const std::string& text, int id = 0)
{
    sqlite3_stmt* stmt = nullptr;
    if (id != 0) {
        sqlite3_prepare_v2(db.get(), text.c_str(), -1, &stmt, nullptr);
    }
    const std::shared_ptr<sqlite3_stmt> kept(stmt, [db](sqlite3_stmt* s) { sqlite3_finalize(s); });
    return [=](bench::Columns& c) {
        return kept ? (sqlite3_bind_int(kept.get(), 1, id), bench::RawStepCopy(kept.get(), c))
                    : bench::RawSelectOn(db.get(), text, c);
    };
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
        auto raw = Make(at, sync ? "raw_full.db" : "raw_normal.db", 1, sync ? "FULL" : "NORMAL");
        bench::Add(prefix + "lib", [=] { return session ? session->Upsert(*upsert) : 1; });
        bench::AddQuery(prefix + "raw", 0, Raw(raw, text));
        bench::AddQuery(prefix + "rawkept", 0,
                        Raw(raw, "INSERT OR REPLACE INTO t (id, label) VALUES (?, 'upserted')", 7));
    }
}

// held_bytes: the heap an open session holds beyond SQLite's page cache, after a read and a write.
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
    bench::AddQuery<DACursor>(prefix + "lib", 1,
                              [=](DACursor& c) { return warm != 0 ? warm : session->Select(*select, c); }, false,
                              {{"held_bytes", held}});
    bench::AddQuery<DACursor>(prefix + "percall", 1, [=](DACursor& c) { return DADatabase().Select(*located, c); });
    std::string text;
    DASqlGenerator().GetSelectSql(*select, text);
    bench::AddQuery(prefix + "raw", 1, Raw(raw, text));
    bench::AddQuery(prefix + "rawkept", 1, Raw(raw, "SELECT * FROM t WHERE id=?", 500));
    for (const int tables : {1, 500}) {
        auto held = Open(at, "tables" + std::to_string(tables) + ".db", true, tables);
        auto none = Row<DASelectRequest>(-1);
        const auto select = [=](DACursor& c) { return held ? held->Select(*none, c) : 1; };
        bench::AddQuery<DACursor>("session/EmptySelect" + std::to_string(tables) + "/" + at.name + "/lib", -1, select);
    }
}

// Each reader reads kReads pages of 50 rows (one row per read does not scale even raw: each read transaction
// takes SQLite's process-wide file lock); fails if a read met SQLITE_BUSY.
constexpr int kReads = 25000;
thread_local bool t_reader = false;

int ReadBesideWriter(DASession& session, int readers)
{
    std::atomic<int> failed{0};
    dlog_set_sink(
        [](int, int, const char*, const char* text, void* failures) {
            *static_cast<std::atomic<int>*>(failures) += t_reader && std::strstr(text, "SQLITE BUSY") ? 1 : 0;
        },
        &failed);
    std::atomic<bool> stop{false};
    std::thread writer([&] {
        for (int i = 0; !stop; ++i) {
            session.Upsert(*Row<DAUpsertRequest>(2000 + i % 1000));
        }
    });
    std::vector<std::thread> threads(static_cast<std::size_t>(readers));
    for (std::thread& reader : threads) {
        reader = std::thread([&] {
            t_reader = true;
            DASelectRequest page;
            page.SetTable("t");
            page.SetWhere("id", DACompare::LessEqual, 50);
            DACursor cursor;  // one per reader, as an app paging would keep it
            for (int i = 0; i < kReads; ++i) {
                failed += session.Select(page, cursor) != SQLITE_OK || cursor.GetCount() != 50 ? 1 : 0;
            }
        });
    }
    for (std::thread& reader : threads) {
        reader.join();
    }
    stop = true;
    writer.join();
    dlog_set_sink(dlog_discard_sink, nullptr);
    return failed;
}

}  // namespace

void bench::SessionCases(const Location& at)
{
    at.name == "disk" ? Writes(at) : Reads(at);
    for (const int readers : {1, 2}) {
        auto session = Open(at, "readers" + std::to_string(readers) + ".db");
        bench::Add("session/Readers" + std::to_string(readers) + "/" + at.name + "/lib",
                   [=] { return session ? ReadBesideWriter(*session, readers) : 1; }, {{"rows", kReads * readers}})
            ->Iterations(1);
    }
}
