// Typed reads and values: QueryEach, DATypedCursor and DACursor against raw SQLite reading the same statement
// typed; a 1 MiB blob per call; a batch through an unsynced session.

#include <cstdint>
#include <cstring>
#include <memory>
#include <utility>
#include <vector>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DASqlGenerator.h"
#include "bench.h"

namespace {

using bench::Location;
constexpr const char* kFile = "typed.db";
constexpr int kMessages = 200000;

// Raw SQLite's typed copy of a result, one vector per type.
struct RawTyped {
    std::vector<std::int64_t> integers;
    std::vector<std::string> texts;
};

// Reads every value of the current row of stmt typed (the messaging shape); sum keeps the reads.
int RawRow(sqlite3_stmt* stmt, std::int64_t& sum)
{
    sum += sqlite3_column_int64(stmt, 0) + sqlite3_column_int64(stmt, 1) + sqlite3_column_int64(stmt, 4) +
        sqlite3_column_int64(stmt, 5);
    sum += sqlite3_column_bytes(stmt, 2) + sqlite3_column_bytes(stmt, 3);
    return sqlite3_column_text(stmt, 2) != nullptr && sqlite3_column_text(stmt, 3) != nullptr ? 0 : 1;
}

int LibRow(DARow const& row, std::int64_t& sum, std::string& text)
{
    std::int64_t v[4] = {};
    const int failures = row.GetInt64(0, v[0]) + row.GetInt64(1, v[1]) + row.GetInt64(4, v[2]) + row.GetInt64(5, v[3]) +
        row.GetString(2, text) + row.GetString(3, text);
    sum += v[0] + v[1] + v[2] + v[3] + static_cast<std::int64_t>(text.size());
    return failures;
}

// Raw: sql stepped on a fresh connection to path, each row to row(stmt).
template <typename Row>
int RawStep(const std::string& path, const std::string& sql, Row row)
{
    return bench::OnFile(path, [&](sqlite3* db) {
        sqlite3_stmt* stmt = nullptr;
        int rc = sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
        while (rc == SQLITE_OK && sqlite3_step(stmt) == SQLITE_ROW) {
            rc = row(stmt);
        }
        sqlite3_finalize(stmt);
        return rc;
    });
}

void Reads(const Location& at, int rows, bool all)
{
    const std::string path = at.Path(kFile);
    const std::string prefix = "typed/rows" + std::to_string(rows) + "/" + at.name + "/";
    auto query = bench::Request<DAQueryRequest>(at, kFile, "m");
    query->SetLimit(rows);
    std::string sql;
    DASqlGenerator().GetQuerySql(*query, sql);
    const bench::Counters counted{{"rows", rows}};
    bench::Add(
        prefix + "lib",
        [query] {  // QueryEach
            std::int64_t sum = 0;
            std::string text;
            int failures = 0;
            const int rc = DADatabase().QueryEach(*query, [&](DARow const& row) {
                failures += LibRow(row, sum, text);
                return true;
            });
            return rc + failures;
        },
        counted);
    bench::Add(
        prefix + "raw",
        [path, sql] {
            std::int64_t sum = 0;
            return RawStep(path, sql, [&](sqlite3_stmt* stmt) { return RawRow(stmt, sum); });
        },
        counted);
    bench::Add(
        prefix + "typedcursor",
        [query] {
            DATypedCursor cursor;
            std::int64_t sum = 0;
            std::string text;
            int failures = DADatabase().Query(*query, cursor);
            while (cursor.MoveToNext() == 0) {
                failures += LibRow(cursor.GetRow(), sum, text);
            }
            return failures;
        },
        counted);
    bench::Add(
        prefix + "dacursor",
        [query] {
            DACursor cursor;
            std::int64_t value = 0;
            std::string text;
            int failures = DADatabase().Query(*query, cursor);
            while (cursor.MoveToNext() == 0) {
                failures += cursor.GetInt64("id", value) + cursor.GetInt64("conv", value) +
                    cursor.GetString("sender", text) + cursor.GetString("body", text) + cursor.GetInt64("ts", value) +
                    cursor.GetInt64("flags", value);
            }
            return failures;
        },
        counted);
    if (!all) {
        return;
    }
    // The copy into typed vectors a raw caller would hold, and the heap one result of each holds.
    const auto rawCopy = [path, sql](RawTyped& out) {
        return RawStep(path, sql, [&](sqlite3_stmt* stmt) {
            for (const int i : {0, 1, 4, 5}) {
                out.integers.push_back(sqlite3_column_int64(stmt, i));
            }
            for (const int i : {2, 3}) {
                out.texts.emplace_back(reinterpret_cast<const char*>(sqlite3_column_text(stmt, i)),
                                       static_cast<std::size_t>(sqlite3_column_bytes(stmt, i)));
            }
            return SQLITE_OK;
        });
    };
    const auto held = [](auto fill) {
        const double before = bench::HeapInUse();
        const auto result = fill();  // held while the heap is measured
        const double bytes = bench::HeapInUse() - before;
        return bytes;
    };
    const double typedHeld = held([query] {
        auto c = std::make_unique<DATypedCursor>();
        DADatabase().Query(*query, *c);
        return c;
    });
    const double cursorHeld = held([query] {
        auto c = std::make_unique<DACursor>();
        DADatabase().Query(*query, *c);
        return c;
    });
    bench::Add(
        prefix + "rawcopy",
        [rawCopy] {
            RawTyped out;
            return rawCopy(out);
        },
        counted);
    bench::Add(prefix + "typedheld", [] { return 0; }, {{"result_bytes", typedHeld}});
    bench::Add(prefix + "dacursorheld", [] { return 0; }, {{"result_bytes", cursorHeld}});
}

}  // namespace

void bench::TypedCases(const Location& at)
{
    if (at.name != "tmpfs") {
        return;
    }
    const std::string path = at.Path(kFile);
    RawExec(path,
            TableSql("m",
                     "id INTEGER PRIMARY KEY, conv INTEGER, sender TEXT, body TEXT, ts INTEGER, "
                     "flags INTEGER",
                     1000000, "i + 1, i % 50, 'user' || (i % 97), printf('%060d', i), 1700000000000 + i, i % 4") +
                "CREATE TABLE b(id INTEGER PRIMARY KEY, data BLOB); CREATE TABLE w(id INTEGER PRIMARY KEY, conv "
                "INTEGER, body TEXT);");
    for (const int rows : {1000, 10000, 100000, kMessages, 1000000}) {
        Reads(at, rows, rows == kMessages);
    }
    // One row by key through a session against a held connection reusing one prepared statement.
    auto session = std::make_shared<DASession>();
    DABasePath location;
    location.SetPath(at.dir.c_str(), kFile);
    session->SetSyncOnCommit(false);
    session->Open(location);
    auto key = std::make_shared<std::int64_t>(0);
    Add("typed/bykey/" + at.name + "/lib", [session, at, key] {
        DAQueryRequest query;
        query.SetTable("m");
        query.SetWhere("id", static_cast<std::int64_t>(++*key % kMessages + 1));
        DATypedCursor cursor;
        return session->Query(query, cursor) + (cursor.GetCount() == 1 ? 0 : 1);
    });
    // The same read as an app repeating it would write it: one request and one cursor, a new key each time.
    auto reused = std::make_shared<std::pair<DAQueryRequest, DATypedCursor>>();
    reused->first.SetTable("m");
    Add("typed/bykey/" + at.name + "/libreuse", [session, reused, key] {
        reused->first.SetWhere("id", static_cast<std::int64_t>(++*key % kMessages + 1));
        return session->Query(reused->first, reused->second) + (reused->second.GetCount() == 1 ? 0 : 1);
    });
    sqlite3* raw = nullptr;
    sqlite3_open(path.c_str(), &raw);
    sqlite3_stmt* byKey = nullptr;
    sqlite3_prepare_v2(raw, "SELECT * FROM m WHERE id=?", -1, &byKey, nullptr);
    Add("typed/bykey/" + at.name + "/raw", [byKey, key] {
        std::int64_t sum = 0;
        sqlite3_bind_int64(byKey, 1, ++*key % kMessages + 1);
        const int rc = sqlite3_step(byKey) == SQLITE_ROW ? RawRow(byKey, sum) : 1;
        sqlite3_reset(byKey);
        return rc;
    });
    // A 1 MiB blob written and read back per call, against raw bound statements.
    auto blob = std::make_shared<std::vector<unsigned char>>(1 << 20, 0xA5);
    Add("typed/blob1MiB/" + at.name + "/lib", [at, blob] {
        DAUpsertRequest upsert;
        upsert.SetPath(at.dir.c_str(), kFile);
        upsert.SetTable("b");
        upsert.SetData("id", 1);
        upsert.SetBlob("data", blob->data(), blob->size());
        DAQueryRequest query;
        query.SetPath(at.dir.c_str(), kFile);
        query.SetTable("b");
        std::vector<unsigned char> back;
        int rc = DADatabase().Upsert(upsert);
        rc += DADatabase().QueryEach(query, [&](DARow const& row) { return row.GetBlob(1, back) == 0; });
        return rc + (back.size() == blob->size() ? 0 : 1);
    });
    Add("typed/blob1MiB/" + at.name + "/raw", [path, blob] {
        return OnFile(path, [&](sqlite3* db) {
            sqlite3_stmt* stmt = nullptr;
            sqlite3_prepare_v2(db, "INSERT OR REPLACE INTO b (id, data) VALUES (1, ?)", -1, &stmt, nullptr);
            sqlite3_bind_blob(stmt, 1, blob->data(), static_cast<int>(blob->size()), SQLITE_STATIC);
            int rc = sqlite3_step(stmt) == SQLITE_DONE ? 0 : 1;
            sqlite3_finalize(stmt);
            sqlite3_prepare_v2(db, "SELECT * FROM b", -1, &stmt, nullptr);
            if (sqlite3_step(stmt) == SQLITE_ROW) {
                const auto* bytes = static_cast<const unsigned char*>(sqlite3_column_blob(stmt, 1));
                const std::vector<unsigned char> back(bytes, bytes + sqlite3_column_bytes(stmt, 1));
                rc += back.size() == blob->size() ? 0 : 1;
            }
            sqlite3_finalize(stmt);
            return rc;
        });
    });
    // 500 inserts in one batch through an unsynced session, against one prepared statement bound 500 times:
    // lib runs a batch filled once (its values, as raw's, are at hand); libfill fills and adds the 500
    // requests in every iteration too.
    const auto fill = [](DABatchRequest& batch) {
        for (int i = 0; i < 500; ++i) {
            DAInsertRequest insert;
            insert.SetTable("w");
            insert.SetData("conv", i % 50);
            insert.SetData("body", "a message body of about sixty bytes, as the messaging app has");
            batch.Add(insert);
        }
    };
    auto filled = std::make_shared<DABatchRequest>();
    fill(*filled);
    Add("typed/batch500/" + at.name + "/lib", [session, filled] { return session->ExecuteBatch(*filled); },
        {{"statements", 500}});
    Add("typed/batch500/" + at.name + "/libfill",
        [session, fill] {
            DABatchRequest batch;
            fill(batch);
            return session->ExecuteBatch(batch);
        },
        {{"statements", 500}});
    Add("typed/batch500/" + at.name + "/raw",
        [raw] {
            sqlite3_exec(raw, "PRAGMA synchronous=NORMAL; BEGIN IMMEDIATE", nullptr, nullptr, nullptr);
            sqlite3_stmt* stmt = nullptr;
            sqlite3_prepare_v2(raw, "INSERT INTO w (conv, body) VALUES (?, ?)", -1, &stmt, nullptr);
            int rc = 0;
            for (int i = 0; i < 500; ++i) {
                sqlite3_bind_int(stmt, 1, i % 50);
                sqlite3_bind_text(stmt, 2, "a message body of about sixty bytes, as the messaging app has", -1,
                                  SQLITE_STATIC);
                rc += sqlite3_step(stmt) == SQLITE_DONE ? 0 : 1;
                sqlite3_reset(stmt);
            }
            sqlite3_finalize(stmt);
            return rc + sqlite3_exec(raw, "COMMIT", nullptr, nullptr, nullptr);
        },
        {{"statements", 500}});
}
