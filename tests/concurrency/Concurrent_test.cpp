// Several threads fill one request or one cursor at once, or run Upsert and
// Update on one database file at once: every insertion must land
// exactly once with its own value, and every write must be in the file.

#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

constexpr int kThreads = 4;
constexpr int kPerThread = 250;

// Distinct, stable column-name pointers: names[t][i] for thread t.
std::vector<Strings> MakeNames(const char* prefix)
{
    std::vector<Strings> names(kThreads);
    for (int t = 0; t < kThreads; ++t) {
        for (int i = 0; i < kPerThread; ++i) {
            names[t].push_back(prefix + std::to_string(t) + "_" + std::to_string(i));
        }
    }
    return names;
}

// Runs work(t) on kThreads threads released together, and joins them.
void RunTogether(const std::function<void(int)>& work)
{
    std::atomic<bool> go{false};
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([&, t] {
            while (!go.load()) {
                std::this_thread::yield();
            }
            work(t);
        });
    }
    go.store(true);
    for (std::thread& thread : threads) {
        thread.join();
    }
}

// Data, conditions and create-table columns: each thread's entries all land,
// with their own values, the columns in each thread's call order.
TEST(ConcurrentRequestFill, EveryInsertionLands)
{
    const auto names = MakeNames("c");
    DAUpdateRequest request;
    DACreateRequest create;
    DAQueryRequest query;
    RunTogether([&](int t) {
        for (int i = 0; i < kPerThread; ++i) {
            request.SetData(names[t][i].c_str(), i);
            request.SetWhere(names[t][i].c_str(), 0.5 + i);
            create.SetColumnKey(names[t][i].c_str(), i % 2 == 0 ? "TEXT" : "INTEGER");
        }
    });
    RunTogether([&](int t) {  // alone, so that the appends really collide
        for (int i = 0; i < 200 * kPerThread; ++i) {
            query.SetOrderBy(names[t][i % kPerThread].c_str(), i % 2 == 0);
        }
    });
    DAValueMap data;
    DAValueMap where;
    DAColumnList columns;
    request.GetDataMap(data);
    request.GetWhereMap(where);
    create.GetColumnKey(columns);
    DAOrderKeys keys;
    query.GetOrderBy(keys);
    ASSERT_EQ(data.size(), static_cast<size_t>(kThreads * kPerThread));
    ASSERT_EQ(keys.size(), 200 * data.size());
    ASSERT_EQ(where.size(), data.size());
    ASSERT_EQ(columns.size(), data.size());
    for (int t = 0; t < kThreads; ++t) {
        std::vector<const char*> order;
        for (const auto& entry : columns) {
            if (entry.first[1] == '0' + t) {
                order.push_back(entry.first);
            }
        }
        for (int i = 0; i < kPerThread; ++i) {
            EXPECT_EQ(data.at(names[t][i].c_str()), std::to_string(i)) << names[t][i];
            EXPECT_EQ(where.at(names[t][i].c_str()), std::to_string(i) + ".5") << names[t][i];
            EXPECT_EQ(order.at(i), names[t][i].c_str());
        }
    }
}

// Every registered column holds a value at row 0.
void ExpectEveryColumnHoldsAValue(DACursor& cursor)
{
    const LogCapture quiet;  // an emptied cursor logs its invalid position
    Strings registered;
    EXPECT_EQ(cursor.GetColumn(registered), cursor.MoveToPosition(0));  // 0 with columns, 1 without
    for (const std::string& name : registered) {
        std::string value;
        EXPECT_EQ(cursor.GetString(name.c_str(), value), 0) << name;
    }
}

// Threads register columns and store values at once, each value also in one
// shared column (the second in name order, so the count is its length).
// Then one thread loads while another empties the cursor again and again.
// SetColumn, SetData and Initialize take one lock: every value lands, and
// names and stored columns always agree.
TEST(ConcurrentCursorFill, EveryValueLandsAndInitializeEmptiesWhole)
{
    const auto names = MakeNames("i");
    const char* const shared = names[0][1].c_str();
    const auto load = [&](DACursor& cursor, int t) {
        for (const std::string& name : names[t % kThreads]) {
            cursor.SetColumn(name.c_str());
            cursor.SetData(name.c_str(), "v");
            cursor.SetData(shared, "v");
        }
    };
    for (int round = 0; round < 10; ++round) {
        DACursor cursor;
        cursor.SetColumn(shared);
        RunTogether([&](int t) { load(cursor, t); });
        ASSERT_EQ(cursor.GetCount(), kThreads * kPerThread + 1);
        Strings registered;
        ASSERT_EQ(cursor.GetColumn(registered), 0);
        ASSERT_EQ(registered.size(), static_cast<size_t>(kThreads * kPerThread + 1));
        ExpectEveryColumnHoldsAValue(cursor);
    }
    DACursor cursor;

    std::atomic<bool> loaded{false};
    std::thread loader([&] {
        for (int round = 0; round < 1000; ++round) {
            load(cursor, round);
        }
        loaded = true;
    });
    while (!loaded) {
        cursor.Initialize();
    }
    loader.join();
    ExpectEveryColumnHoldsAValue(cursor);
}

// Each thread upserts fresh rows and updates each, every call
// with its own connection. Contention shows as SQLITE_BUSY and must be
// absorbed by the busy-retry rule (up to 15 pauses of 100 ms).
class ConcurrentDatabase : public TempDirTest {};

TEST_F(ConcurrentDatabase, EverySucceededWriteIsInTheFile)
{
    constexpr int kRows = 8;
    const std::string dir = Dir();
    DACreateRequest create;
    At(create, dir, "items").SetPrimaryKey("name", "TEXT");
    create.SetColumnKey("value", "TEXT");
    ASSERT_EQ(DADatabase().CreateTable(create), 0);

    const LogCapture log;
    RunTogether([&](int t) {
        DADatabase database;
        for (int i = 0; i < kRows; ++i) {
            const std::string name = "row" + std::to_string(t) + "_" + std::to_string(i);
            const std::string updated = "updated " + name;
            DAUpsertRequest upsert;
            At(upsert, dir, "items").SetData("name", name.c_str());
            upsert.SetData("value", "inserted");
            EXPECT_EQ(database.Upsert(upsert), 0) << name;
            DAUpdateRequest update;
            At(update, dir, "items").SetData("value", updated.c_str());
            update.SetWhere("name", name.c_str());
            EXPECT_EQ(database.Update(update), 0) << name;
        }
    });
    // Every row is there (names are the key), each with its own update.
    EXPECT_EQ(RawDb(PathOf("t.db")).Query("SELECT count(*), sum(value = 'updated ' || name) FROM items"),
              std::to_string(kThreads * kRows) + "|" + std::to_string(kThreads * kRows));
    EXPECT_EQ(log.Count("RETRY COUNT is reached LIMIT, SQLITE_BUSY"), 0);
}

}  // namespace
