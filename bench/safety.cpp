// Safety: a backup of a live 53,119-message file while a writer commits every ms, salvage of it with one
// damaged table page, its quick check; each against raw SQLite.

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <thread>

#include <sqlite3.h>

#include "DADatabase.h"
#include "DAQueryRequest.h"
#include "bench.h"

namespace {

constexpr int kMessages = 53119;

// Runs fn while another connection commits one message every ms (WAL); returns fn's code, and the writer's
// longest commit in ms in longest.
int WithWriter(const std::string& path, const bench::Op& fn, double* longest = nullptr)
{
    std::atomic<bool> stop{false};
    double worst = 0;
    std::thread writer([&] {
        bench::OnFile(path, [&](sqlite3* db) {
            sqlite3_busy_timeout(db, 5000);
            while (!stop) {
                const auto start = std::chrono::steady_clock::now();
                sqlite3_exec(db, "INSERT INTO messages(thread, sender, body, at) VALUES (1, 'w', 'live', 0)", nullptr,
                             nullptr, nullptr);
                worst = std::max(
                    worst, std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count());
                std::this_thread::sleep_for(std::chrono::milliseconds(1));
            }
            return 0;
        });
    });
    const int rc = fn();
    stop = true;
    writer.join();
    if (longest != nullptr) {
        *longest = worst;
    }
    return rc;
}

}  // namespace

void bench::SafetyCases(const Location& at)
{
    const std::string prefix = "/" + at.name + "/";
    const std::string path = at.Path("messages.db");
    const std::string copy = at.Path("messages-copy.db");
    RawExec(path,
            "PRAGMA journal_mode = WAL; CREATE TABLE messages (id INTEGER PRIMARY KEY, thread INTEGER, sender "
            "TEXT, body TEXT, at INTEGER); CREATE INDEX messages_thread ON messages(thread, at);"
            "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
                std::to_string(kMessages) +
                ") INSERT INTO messages SELECT i, i % 200, 'user-' || (i % 50), printf('%.*c', 80 + i % 60, "
                "'m'), 1700000000000 + i * 1000 FROM n;");
    auto from = Request<DAQueryRequest>(at, "messages.db", "messages");
    auto to = Request<DAQueryRequest>(at, "messages-copy.db", "messages");
    double longest = 0;
    WithWriter(
        path, [&] { return DADatabase().Backup(*from, *to); }, &longest);
    Add("safety/Backup53000" + prefix + "lib",
        [=] { return WithWriter(path, [=] { return DADatabase().Backup(*from, *to); }); },
        {{"writer_wait_ms", longest}})
        ->Iterations(5);
    Add("safety/Backup53000" + prefix + "raw", [=] {
        std::remove(copy.c_str());
        return OnFile(path, [&](sqlite3* src) {
            return OnFile(copy, [&](sqlite3* dest) {
                sqlite3_backup* backup = sqlite3_backup_init(dest, "main", src, "main");
                sqlite3_backup_step(backup, -1);
                return sqlite3_backup_finish(backup);
            });
        });
    })->Iterations(5);
    Add("safety/QuickCheck53000" + prefix + "lib", [=] {
        std::vector<std::string> problems;
        const int rc = DADatabase().CheckIntegrity(*from, false, problems);
        return rc != 0 ? rc : static_cast<int>(problems.size());
    });
    Add("safety/QuickCheck53000" + prefix + "raw", [=] { return RawExec(path, "PRAGMA quick_check"); });
    Add("safety/Salvage53000" + prefix + "query", [=] {  // every row into a cursor (the writer's rows too)
        DACursor cursor;
        const int rc = DADatabase().Query(*from, cursor);
        return rc != 0 ? rc : cursor.GetCount() >= kMessages ? 0 : -1;
    });
    // One table page in the middle overwritten, in a copy: salvage's counters say what it recovered.
    const std::string damaged = at.Path("damaged.db");
    RawExec(path, "VACUUM INTO '" + damaged + "'");
    int page = 0;
    int onPage = 0;
    int total = 0;
    OnFile(damaged, [&](sqlite3* db) {
        sqlite3_stmt* stmt = nullptr;
        sqlite3_prepare_v2(db,
                           "SELECT pageno, ncell, (SELECT count(*) FROM messages) FROM dbstat WHERE name = "
                           "'messages' AND pagetype = 'leaf' LIMIT 1 OFFSET 500",
                           -1, &stmt, nullptr);
        if (sqlite3_step(stmt) == SQLITE_ROW) {
            page = sqlite3_column_int(stmt, 0);
            onPage = sqlite3_column_int(stmt, 1);
            total = sqlite3_column_int(stmt, 2);
        }
        return sqlite3_finalize(stmt);
    });
    std::fstream(damaged, std::ios::in | std::ios::out | std::ios::binary).seekp((page - 1) * 4096LL)
        << std::string(4096, '\x7f');
    auto broken = Request<DAQueryRequest>(at, "damaged.db", "messages");
    auto salvaged = Request<DAQueryRequest>(at, "salvaged.db", "messages");
    DASalvageReport report;
    DADatabase().Salvage(*broken, *salvaged, report);
    const double rows = report.tables.empty() ? 0 : static_cast<double>(report.tables[0].rows);
    Add("safety/Salvage53000" + prefix + "lib",
        [=] {
            DASalvageReport each;
            return DADatabase().Salvage(*broken, *salvaged, each);
        },
        {{"rows_recovered", rows}, {"rows_not_on_page", static_cast<double>(total - onPage)}})
        ->Iterations(3);
}
