// Conditions over 100,000 events (one a millisecond, seven types, ts indexed); docs/benchmarks.md lists the cases.

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "DATypedCursor.h"
#include "bench.h"

constexpr int kEvents = 100000;
constexpr std::int64_t kFirst = 1700000000000, kCutoff = kFirst + kEvents / 5;  // before it: the oldest 20 %

void bench::ConditionCases(const Location& at)
{
    // old: the oldest 20 % again, for the retention's refill before every call (untimed).
    const std::string events = bench::TableSql("events", "id INTEGER PRIMARY KEY, ts INTEGER, type TEXT", kEvents,
                                               "i + 1, " + std::to_string(kFirst) + " + i, 'type' || (i % 7)") +
        "CREATE INDEX events_ts ON events(ts); CREATE TABLE old AS SELECT * FROM events WHERE ts < " +
        std::to_string(kCutoff) + ";";
    const std::string path = at.Path("events.db"), kept = at.Path("retention.db"), name = "/" + at.name + "/";
    if (bench::RawExec(path, events) != SQLITE_OK || bench::RawExec(kept, events) != SQLITE_OK) {
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
    // equality: the way without ranges: read all, filter, a batch of deletes by key.
    auto all = bench::Request<DASelectRequest>(at, "retention.db", "events");
    const auto equality = [all, dir = at.dir] {
        DACursor cursor;
        DABatchRequest batch;
        batch.SetPath(dir.c_str(), "retention.db");
        int rc = DADatabase().Select(*all, cursor);
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
    };
    bench::Add("cond/retention" + name + "lib", remove, {}, refill);
    bench::Add(
        "cond/retention" + name + "raw", [kept, sql] { return bench::RawExec(kept, sql); }, {}, refill);
    bench::Add("cond/retention" + name + "equality", equality, {}, refill)->Iterations(3);
    // keyset: 50 rows below the middle time stamp, newest first; offset: the same page by OFFSET 50,000.
    auto session = std::make_shared<DASession>();
    const auto query = [session](const std::string& name, std::shared_ptr<DAQueryRequest> request, int rows,
                                 bool held = false) {
        bench::AddQuery<DACursor>(name, rows, [=](DACursor& c) {
            return held ? session->Query(*request, c) : DADatabase().Query(*request, c);
        });
    };
    auto counts = bench::Request<DAQueryRequest>(at, "events.db", "events");
    counts->AddColumn("type");
    counts->AddAggregate(DAAggregate::Count, nullptr, "n");
    counts->AddGroupBy("type");
    DASqlGenerator().GetQuerySql(*counts, sql);
    query("cond/count" + name + "lib", counts, 7);
    bench::AddQuery("cond/count" + name + "raw", 7, bench::Raw(path, sql));
    auto keyset = bench::Request<DAQueryRequest>(at, "events.db", "events");
    keyset->SetWhere("ts", DACompare::Less, kFirst + kEvents / 2);
    keyset->SetOrderBy("ts", true);
    keyset->SetLimit(50);
    DASqlGenerator().GetQuerySql(*keyset, sql);
    auto offset = bench::Request<DAQueryRequest>(at, "events.db", "events");
    offset->SetOrderBy("ts", true);
    offset->SetLimit(50, kEvents / 2);
    query("cond/keyset" + name + "lib", keyset, 50);
    bench::AddQuery("cond/keyset" + name + "raw", 50, bench::Raw(path, sql));
    query("cond/keyset" + name + "offset", offset, 50);
    // keysetrow: the page after a (ts, id) in the middle, ties broken by id, through an index on (ts, id).
    auto rows = bench::Request<DAQueryRequest>(at, "events.db", "events");
    rows->SetWhereRow({"ts", "id"}, DACompare::Less, {kFirst + kEvents / 2, std::int64_t{kEvents / 2}});
    rows->SetOrderBy("ts", true);
    rows->SetOrderBy("id", true);
    rows->SetLimit(50);
    DASqlGenerator().GetQuerySql(*rows, sql);
    query("cond/keysetrow" + name + "lib", rows, 50);
    bench::AddQuery("cond/keysetrow" + name + "raw", 50, bench::Raw(path, sql));
    bench::Add("cond/keysetrow" + name + "typed",
               [rows] {
                   DATypedCursor cursor;
                   const int rc = DADatabase().Query(*rows, cursor);
                   return rc != SQLITE_OK ? rc : cursor.GetCount() == 50 ? 0 : -1;
               },
               {{"rows", 50}});
    // increment: one counter by key, per call, and the same statement through sqlite3_exec.
    auto counter = bench::Request<DAUpdateRequest>(at, "events.db", "counters");
    counter->SetWhere("k", "unread");
    counter->SetIncrement("n", 1);
    DASqlGenerator().GetUpdateSql(*counter, sql);
    if (bench::RawExec(path,
                       "CREATE TABLE counters(k TEXT PRIMARY KEY, n INTEGER); INSERT INTO counters VALUES "
                       "('unread', 0); CREATE INDEX events_ts_id ON events(ts, id);") != SQLITE_OK) {
        return;
    }
    bench::Add("cond/increment" + name + "lib", [counter] { return DADatabase().Update(*counter); });
    bench::Add("cond/increment" + name + "raw", [path, sql] { return bench::RawExec(path, sql); });
    // unread: what a batch of 100 new messages costs to count, kept as 100 increments of the conversations'
    // counters in the batch, or counted again over all messages (the 100,000 events as messages of 7
    // conversations) with COUNT GROUP BY.
    auto unread = std::make_shared<DABatchRequest>();
    unread->SetPath(at.dir.c_str(), "events.db");
    for (int i = 0; i < 100; ++i) {
        DAUpsertRequest one;
        one.SetTable("counters");
        one.SetData("k", ("type" + std::to_string(i % 7)).c_str());
        one.AddConflictKey("k");
        one.SetIncrement("n", 1);
        unread->Add(one);
    }
    bench::Add("cond/unread" + name + "counter", [unread] { return DADatabase().ExecuteBatch(*unread); });
    query("cond/unread" + name + "recount", counts, 7);
    session->Open(*keyset);
    query("cond/keyset" + name + "session", keyset, 50, true);
    query("cond/keyset" + name + "sessionoffset", offset, 50, true);
}
