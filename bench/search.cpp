// Search: a word with no hit and a first page of hits through a session (against Contains and raw FTS5 stepping
// the same statement), indexing 50,000 existing messages (against FTS5's 'rebuild'), and inserting into an indexed
// table in batches (against raw bound inserts into a table indexed the same way).

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

using bench::Add;
using bench::Location;
constexpr int kMessages = 50000;
constexpr const char* kColumns = "id INTEGER PRIMARY KEY, conv INTEGER, ts INTEGER, body TEXT";
// Bodies of eight words from a vocabulary of about 3,000 ("w7" in 1 row of 50); every 100th says CAFÉ.
constexpr const char* kBodies = "i + 1, i % 50, 1700000000000 + i, 'w' || (i % 50) || ' x' || (i % 997) || ' y' || "
                                "(i % 1009) || ' about the plan for ' || CASE WHEN i % 100 = 0 THEN 'CAFÉ' ELSE "
                                "'tomorrow' END || ' z' || (i % 13)";

// The index named table over table's body.
std::shared_ptr<DASearchIndexRequest> Index(const Location& at, const char* file, const char* table)
{
    auto index = bench::Request<DASearchIndexRequest>(at, file, table);
    index->SetName(table);
    index->AddColumn("body");
    return index;
}

}  // namespace

void bench::SearchCases(const Location& at)
{
    if (at.name != "tmpfs") {
        return;
    }
    const std::string path = at.Path("search.db"), prefix = "/" + at.name + "/";
    RawExec(path, TableSql("m", kColumns, kMessages, kBodies));
    DADatabase().CreateSearchIndex(*Index(at, "search.db", "m"));
    auto session = std::make_shared<DASession>();
    session->SetSyncOnCommit(false);
    session->Open(*Index(at, "search.db", "m"));
    auto nohit = Request<DASearchRequest>(at, "search.db", "m");
    nohit->SetIndex("m");
    nohit->SetText("nothing");
    Add("search/NoHit50000" + prefix + "lib", [=] {
        DACursor cursor;
        return session->Search(*nohit, cursor) + (cursor.GetCount() == -1 ? 0 : 1);
    });
    auto contains = Request<DAQueryRequest>(at, "search.db", "m");
    contains->SetWhere("body", DACompare::Contains, "nothing");
    Add("search/NoHit50000" + prefix + "contains", [=] {
        DACursor cursor;
        return session->Query(*contains, cursor) + (cursor.GetCount() == -1 ? 0 : 1);
    });
    auto page = Request<DASearchRequest>(at, "search.db", "m");
    page->SetIndex("m");
    page->SetText("w7 plan");
    page->SetLimit(20);
    std::string sql;
    DASqlGenerator().GetSearchSql(*page, sql);
    AddQuery<DACursor>("search/FirstPage50000" + prefix + "lib", 20,
                       [=](DACursor& cursor) { return session->Search(*page, cursor); });
    AddQuery<Columns>("search/FirstPage50000" + prefix + "raw", 20, Raw(path, sql));
    // Indexing the rows there: the index dropped again before every call; raw rebuilds an external-content table.
    const std::string rebuild = "CREATE VIRTUAL TABLE r USING fts5(body, content='m', content_rowid='id', "
                                "tokenize='unicode61 remove_diacritics 2', prefix='2 3');";
    auto index = Index(at, "search.db", "m");
    index->SetName("again");
    Add(
        "search/Index50000" + prefix + "lib", [=] { return DADatabase().CreateSearchIndex(*index); }, {},
        [=] { return DADatabase().DropSearchIndex(*index, "again"); })
        ->Iterations(5);
    Add(
        "search/Index50000" + prefix + "raw", [=] { return RawExec(path, "INSERT INTO r(r) VALUES('rebuild')"); }, {},
        [=] { return RawExec(path, "DROP TABLE IF EXISTS r; " + rebuild); })
        ->Iterations(5);
    // 10,000 inserts in batches of 100 into a fresh indexed table; raw binds them into a table with the same
    // index, made by the library too.
    const std::string fresh =
        "DROP TABLE IF EXISTS w; DROP TABLE IF EXISTS ulo_search_w; CREATE TABLE w(" + std::string(kColumns) + ");";
    const auto remake = [=] {
        return RawExec(path, fresh) + DADatabase().CreateSearchIndex(*Index(at, "search.db", "w"));
    };
    Add(
        "search/Insert10000" + prefix + "lib",
        [=] {
            int rc = 0;
            for (int b = 0; b < 100; ++b) {
                DABatchRequest batch;
                for (int i = 0; i < 100; ++i) {
                    DAInsertRequest insert;
                    insert.SetTable("w");
                    insert.SetData("conv", i % 50);
                    insert.SetData("body", "w7 x123 y456 about the plan for tomorrow z5");
                    batch.Add(insert);
                }
                rc += session->ExecuteBatch(batch);
            }
            return rc;
        },
        {{"statements", 10000}}, remake)
        ->Iterations(3);
    Add(
        "search/Insert10000" + prefix + "raw",
        [=] {
            return OnFile(path, [](sqlite3* db) {
                sqlite3_stmt* stmt = nullptr;
                int rc = sqlite3_exec(db, "PRAGMA synchronous=NORMAL", nullptr, nullptr, nullptr) +
                    sqlite3_prepare_v2(db, "INSERT INTO w (conv, body) VALUES (?, ?)", -1, &stmt, nullptr);
                for (int b = 0; b < 100; ++b) {
                    rc += sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
                    for (int i = 0; i < 100; ++i) {
                        sqlite3_bind_int(stmt, 1, i % 50);
                        sqlite3_bind_text(stmt, 2, "w7 x123 y456 about the plan for tomorrow z5", -1, SQLITE_STATIC);
                        rc += sqlite3_step(stmt) == SQLITE_DONE ? 0 : 1;
                        sqlite3_reset(stmt);
                    }
                    rc += sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
                }
                sqlite3_finalize(stmt);
                return rc;
            });
        },
        {{"statements", 10000}}, remake)
        ->Iterations(3);
}
