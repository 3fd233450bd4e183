// Conditions over 100,000 events (one a millisecond, seven types, ts indexed) against raw SQLite running
// the same text; equality: the way without ranges (read all, filter, a batch of deletes by key); session:
// the keyset and offset pages through a DASession.

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

constexpr int kEvents = 100000;
constexpr std::int64_t kFirst = 1700000000000, kCutoff = kFirst + kEvents / 5;  // before it: the oldest 20 %

int EqualityWay(DASelectRequest& all, const std::string& dir)
{
    DACursor cursor;
    DABatchRequest batch;
    batch.SetPath(dir.c_str(), "retention.db");
    int rc = DADatabase().Select(all, cursor);
    for (std::int64_t ts = 0, id = 0; rc == SQLITE_OK && cursor.MoveToNext() == 0;) {
        if (cursor.GetInt64("ts", ts) == 0 && ts < kCutoff && cursor.GetInt64("id", id) == 0) {
            DADeleteRequest one;
            one.SetTable("events");
            one.SetWhere("id", id);
            batch.Add(one);
        }
    }
    rc = rc != SQLITE_OK ? rc : DADatabase().ExecuteBatch(batch);
    return rc != SQLITE_OK ? rc : batch.GetChanges() == kEvents / 5 ? 0 : -1;
}

void ConditionCases(const bench::Location& at)
{
    // old: the oldest 20 % again, for the retention's refill before every call (untimed).
    const std::string events = bench::TableSql("events", "id INTEGER PRIMARY KEY, ts INTEGER, type TEXT", kEvents,
                                               "i + 1, " + std::to_string(kFirst) + " + i, 'type' || (i % 7)") +
        "CREATE INDEX events_ts ON events(ts); CREATE TABLE old AS SELECT * FROM events WHERE ts < " +
        std::to_string(kCutoff) + ";";
    const std::string path = at.Path("events.db"), kept = at.Path("retention.db"), name = "/" + at.name + "/";
    if (at.dir.empty() || bench::RawExec(path, events) != SQLITE_OK || bench::RawExec(kept, events) != SQLITE_OK) {
        return;
    }
    std::string sql;
    const bench::Op refill = [kept] { return bench::RawExec(kept, "INSERT OR IGNORE INTO events SELECT * FROM old"); };
    auto old = bench::Request<DADeleteRequest>(at, "retention.db", "events");
    old->SetWhere("ts", DACompare::Less, kCutoff);
    DASqlGenerator().GetDeleteSql(*old, sql);
    const auto remove = [old] {
        int changes = 0;
        const int rc = DADatabase().Delete(*old, changes);
        return rc != SQLITE_OK ? rc : changes == kEvents / 5 ? 0 : -1;
    };
    bench::Add("cond/retention" + name + "lib", remove, {}, refill);
    bench::Add(
        "cond/retention" + name + "raw", [kept, sql] { return bench::RawExec(kept, sql); }, {}, refill);
    auto all = bench::Request<DASelectRequest>(at, "retention.db", "events");
    bench::Add(
        "cond/retention" + name + "equality", [all, dir = at.dir] { return EqualityWay(*all, dir); }, {}, refill)
        ->Iterations(3);
    // cond/keyset: 50 rows below the middle time stamp, newest first; offset: the same by OFFSET 50,000.
    const auto query = [](const std::shared_ptr<DAQueryRequest>& request, int rows) {
        return bench::Rows([request](DACursor& cursor) { return DADatabase().Query(*request, cursor); }, rows);
    };
    auto counts = bench::Request<DAQueryRequest>(at, "events.db", "events");
    counts->AddColumn("type");
    counts->AddAggregate(DAAggregate::Count, nullptr, "n");
    counts->AddGroupBy("type");
    DASqlGenerator().GetQuerySql(*counts, sql);
    bench::Add("cond/count" + name + "lib", query(counts, 7));
    bench::Add("cond/count" + name + "raw", bench::RawRows(path, sql, 7));
    auto keyset = bench::Request<DAQueryRequest>(at, "events.db", "events");
    keyset->SetWhere("ts", DACompare::Less, kFirst + kEvents / 2);
    keyset->SetOrderBy("ts", true);
    keyset->SetLimit(50);
    DASqlGenerator().GetQuerySql(*keyset, sql);
    auto offset = bench::Request<DAQueryRequest>(at, "events.db", "events");
    offset->SetOrderBy("ts", true);
    offset->SetLimit(50, kEvents / 2);
    bench::Add("cond/keyset" + name + "lib", query(keyset, 50));
    bench::Add("cond/keyset" + name + "raw", bench::RawRows(path, sql, 50));
    bench::Add("cond/keyset" + name + "offset", query(offset, 50));
    // The same two pages through a session holding the file: no open and no schema read per page.
    auto session = std::make_shared<DASession>();
    if (session->Open(*keyset) == SQLITE_OK) {
        const auto held = [session](const std::shared_ptr<DAQueryRequest>& request) {
            return bench::Rows([session, request](DACursor& cursor) { return session->Query(*request, cursor); }, 50);
        };
        bench::Add("cond/keyset" + name + "session", held(keyset));
        bench::Add("cond/keyset" + name + "sessionoffset", held(offset));
    }
}

}  // namespace

ULO_BENCH_CASES(ConditionCases);
