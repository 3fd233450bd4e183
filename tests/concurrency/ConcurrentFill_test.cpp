// Several threads fill one request or one cursor at once: every insertion
// must land, exactly once, with its own value.

#include <algorithm>
#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DACreateRequest.h"
#include "DACursor.h"
#include "DASelectRequest.h"
#include "LogCapture.h"

namespace {

constexpr int kThreads = 4;
constexpr int kPerThread = 250;

// Distinct, stable column-name pointers: names[t][i] for thread t.
std::vector<std::vector<std::string>> MakeNames(const char* prefix)
{
    std::vector<std::vector<std::string>> names(kThreads);
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

TEST(ConcurrentRequestFill, EveryDataAndWhereInsertionLands)
{
    const auto names = MakeNames("c");
    static const char shared[] = "shared";
    DASelectRequest request;
    RunTogether([&](int t) {
        for (int i = 0; i < kPerThread; ++i) {
            request.SetData(names[t][i].c_str(), i);
            request.SetWhere(names[t][i].c_str(), 0.5 + i);
            request.SetData(shared, t);  // the first value stored stays
        }
    });

    DAValueMap data;
    DAValueMap where;
    request.GetDataMap(data);
    request.GetWhereMap(where);
    ASSERT_EQ(data.size(), static_cast<size_t>(kThreads * kPerThread + 1));
    ASSERT_EQ(where.size(), static_cast<size_t>(kThreads * kPerThread));
    for (int t = 0; t < kThreads; ++t) {
        for (int i = 0; i < kPerThread; ++i) {
            EXPECT_EQ(data.at(names[t][i].c_str()), std::to_string(i)) << names[t][i];
            EXPECT_EQ(where.at(names[t][i].c_str()), std::to_string(i) + ".5") << names[t][i];
        }
    }
    const std::string first = data.at(shared);
    EXPECT_TRUE(first.size() == 1 && first[0] >= '0' && first[0] < '0' + kThreads) << first;
}

TEST(ConcurrentRequestFill, EveryColumnKeyIsAppendedOnce)
{
    const auto names = MakeNames("k");
    DACreateRequest request;
    RunTogether([&](int t) {
        for (int i = 0; i < kPerThread; ++i) {
            request.SetColumnKey(names[t][i].c_str(), i % 2 == 0 ? "TEXT" : "INTEGER");
        }
    });

    DAColumnList columns;
    request.GetColumnKey(columns);
    ASSERT_EQ(columns.size(), static_cast<size_t>(kThreads * kPerThread));
    // Each thread's entries keep that thread's call order.
    for (int t = 0; t < kThreads; ++t) {
        int next = 0;
        for (const auto& entry : columns) {
            if (next < kPerThread && entry.first == names[t][next].c_str()) {
                EXPECT_EQ(entry.second, next % 2 == 0 ? "TEXT" : "INTEGER") << entry.first;
                ++next;
            }
        }
        EXPECT_EQ(next, kPerThread) << "thread " << t;
    }
}

TEST(ConcurrentCursorFill, EveryColumnAndValueLands)
{
    // Columns "t0".."t3" get one value per call of their own thread;
    // "t0+all" gets one from every call of every thread. It is the second
    // column in name order, so the row count is the total of all values.
    static const char all[] = "t0+all";
    DACursor cursor;
    cursor.SetColumn(all);
    RunTogether([&](int t) {
        const std::string own = "t" + std::to_string(t);
        cursor.SetColumn(own.c_str());
        for (int i = 0; i < kPerThread; ++i) {
            const std::string value = own + ":" + std::to_string(i);
            cursor.SetData(own.c_str(), value.c_str());
            cursor.SetData(all, value.c_str());
        }
    });

    std::vector<std::string> columns;
    ASSERT_EQ(cursor.GetColumn(columns), 0);
    std::sort(columns.begin(), columns.end());
    EXPECT_EQ(columns, (std::vector<std::string>{"t0", "t0+all", "t1", "t2", "t3"}));
    ASSERT_EQ(cursor.GetCount(), kThreads * kPerThread);

    const LogCapture log;
    std::vector<std::string> expectedAll;
    std::vector<std::string> readAll;
    for (int t = 0; t < kThreads; ++t) {
        const std::string own = "t" + std::to_string(t);
        for (int i = 0; i < kPerThread; ++i) {
            const std::string expected = own + ":" + std::to_string(i);
            expectedAll.push_back(expected);
            std::string value;
            ASSERT_EQ(cursor.MoveToPosition(i), 0);
            ASSERT_EQ(cursor.GetString(own.c_str(), value), 0) << expected;
            EXPECT_EQ(value, expected);
        }
        // The row after a thread's last value is past its column's list.
        std::string beyond = "untouched";
        ASSERT_EQ(cursor.MoveToPosition(kPerThread), 0);
        EXPECT_EQ(cursor.GetString(own.c_str(), beyond), 1);
        EXPECT_EQ(beyond, "untouched");
    }
    EXPECT_EQ(log.Count("CURSOR RANGE ERROR!!!"), kThreads);
    for (int row = 0; row < kThreads * kPerThread; ++row) {
        std::string value;
        ASSERT_EQ(cursor.MoveToPosition(row), 0);
        ASSERT_EQ(cursor.GetString(all, value), 0);
        readAll.push_back(value);
    }
    std::sort(expectedAll.begin(), expectedAll.end());
    std::sort(readAll.begin(), readAll.end());
    EXPECT_EQ(readAll, expectedAll);
}

}  // namespace
