// Several threads run Upsert, Update and Select on one database file at
// once, each call with its own connection. Contention shows as SQLITE_BUSY
// and is absorbed by the busy-retry rule (up to 15 pauses of 100 ms); every
// call that returned 0 must have its effect in the file.

#include <sqlite3.h>

#include <atomic>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "LogCapture.h"
#include "TempDirTest.h"

namespace {

constexpr int kThreads = 4;
constexpr int kRowsPerThread = 8;
constexpr char kFile[] = "shared.db";
constexpr char kTable[] = "items";
constexpr char kName[] = "name";
constexpr char kValue[] = "value";

struct Outcome {
    std::string name;
    int upsertRc = -1;
    int updateRc = -1;
    int selectRc = -1;
    int selectedRows = -1;
    std::string selectedValue;
};

// name -> value, read with SQLite directly (not through the library).
std::map<std::string, std::string> ReadTable(const std::string& path)
{
    std::map<std::string, std::string> rows;
    sqlite3* db = nullptr;
    EXPECT_EQ(sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
    sqlite3_stmt* stmt = nullptr;
    EXPECT_EQ(sqlite3_prepare_v2(db, "SELECT name, value FROM items", -1, &stmt, nullptr), SQLITE_OK);
    while (stmt != nullptr && sqlite3_step(stmt) == SQLITE_ROW) {
        rows[reinterpret_cast<const char*>(sqlite3_column_text(stmt, 0))] =
            reinterpret_cast<const char*>(sqlite3_column_text(stmt, 1));
    }
    sqlite3_finalize(stmt);
    sqlite3_close(db);
    return rows;
}

class ConcurrentDatabase : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        DACreateRequest create;
        create.SetPath(Dir().c_str(), kFile);
        create.SetTable(kTable);
        create.SetPrimaryKey(kName, "TEXT");
        create.SetColumnKey(kValue, "TEXT");
        ASSERT_EQ(DADatabase().CreateTable(create), SQLITE_OK);
    }

    // Upsert a fresh row, update it, then read it back: one thread's work.
    void WriteAndReadBack(Outcome& out) const
    {
        DADatabase database;
        DAUpsertRequest upsert;
        upsert.SetPath(Dir().c_str(), kFile);
        upsert.SetTable(kTable);
        upsert.SetData(kName, out.name.c_str());
        upsert.SetData(kValue, "inserted");
        out.upsertRc = database.Upsert(upsert);

        DAUpdateRequest update;
        update.SetPath(Dir().c_str(), kFile);
        update.SetTable(kTable);
        update.SetData(kValue, ("updated " + out.name).c_str());
        update.SetWhere(kName, out.name.c_str());
        out.updateRc = database.Update(update);

        DASelectRequest select;
        select.SetPath(Dir().c_str(), kFile);
        select.SetTable(kTable);
        select.SetWhere(kName, out.name.c_str());
        DACursor cursor;
        out.selectRc = database.Select(select, cursor);
        out.selectedRows = cursor.GetCount();
        if (cursor.MoveToNext() == 0) {
            cursor.GetString(kValue, out.selectedValue);
        }
    }
};

TEST_F(ConcurrentDatabase, EverySucceededWriteIsInTheFile)
{
    const LogCapture log;
    std::vector<std::vector<Outcome>> outcomes(kThreads, std::vector<Outcome>(kRowsPerThread));
    std::atomic<bool> go{false};
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([&, t] {
            while (!go.load()) {
                std::this_thread::yield();
            }
            for (int i = 0; i < kRowsPerThread; ++i) {
                outcomes[t][i].name = "row" + std::to_string(t) + "_" + std::to_string(i);
                WriteAndReadBack(outcomes[t][i]);
            }
        });
    }
    go.store(true);
    for (std::thread& thread : threads) {
        thread.join();
    }

    const std::map<std::string, std::string> table = ReadTable(PathOf(kFile));
    int upserts = 0;
    int updates = 0;
    for (const auto& perThread : outcomes) {
        for (const Outcome& out : perThread) {
            SCOPED_TRACE(out.name);
            // Contention is expected to resolve within the retry budget.
            EXPECT_EQ(out.upsertRc, SQLITE_OK);
            EXPECT_EQ(out.updateRc, SQLITE_OK);
            EXPECT_EQ(out.selectRc, SQLITE_OK);
            if (out.upsertRc != SQLITE_OK) {
                continue;
            }
            ++upserts;
            const auto row = table.find(out.name);
            ASSERT_NE(row, table.end());
            const std::string expected = out.updateRc == SQLITE_OK ? "updated " + out.name : "inserted";
            updates += out.updateRc == SQLITE_OK ? 1 : 0;
            EXPECT_EQ(row->second, expected);
            if (out.selectRc == SQLITE_OK) {
                // The thread's own read saw its committed writes.
                EXPECT_EQ(out.selectedRows, 1);
                EXPECT_EQ(out.selectedValue, expected);
            }
        }
    }
    EXPECT_EQ(table.size(), static_cast<size_t>(upserts));
    EXPECT_EQ(log.Count("Upsert SUCCESS[0]"), upserts);
    EXPECT_EQ(log.Count("update SUCCESS[0]"), updates);
    EXPECT_EQ(log.Count("RETRY COUNT is reached LIMIT, SQLITE_BUSY"), 0);
    int busyWaits = 0;
    for (const std::string& message : log.Messages()) {
        busyWaits += message.rfind("SQLITE BUSY[", 0) == 0 ? 1 : 0;
    }
    RecordProperty("busy_waits", busyWaits);  // how much contention there was
}

}  // namespace
