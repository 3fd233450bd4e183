// Several threads fill one request or one cursor at once, or run Upsert and
// Update on one database file at once: every insertion must land
// exactly once with its own value, and every write must be in the file.

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "Operations.h"
#include "TempDirTest.h"
#include "dlog.h"

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

class ConcurrentDatabase : public TempDirTest {};

// Many threads, per call and then through one session: writes from several
// threads all land (contention absorbed by the busy-retry rule); with
// the write-ahead log a read runs beside the write in progress (here a long
// batch) instead of waiting for it, and sees the last commit before it
// began.
class ConcurrentSession : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        const LogCapture quiet;
        DABasePath location;
        ASSERT_EQ(0, m_session.Open(At(location, Dir())));
        DACreateRequest create;
        create.SetTable("items");
        create.SetPrimaryKey("name", "TEXT");
        create.SetColumnKey("value", "TEXT");
        ASSERT_EQ(0, m_session.CreateTable(create));
    }

    // The number of rows, read through the session.
    int Rows()
    {
        DAQueryRequest query;
        query.SetTable("items");
        DACursor cursor;
        EXPECT_EQ(0, m_session.Query(query, cursor));
        return std::max(cursor.GetCount(), 0);
    }

    DASession m_session;
};

TEST_F(ConcurrentSession, WritesFromEveryThreadLandAndReadsRunBesideALongBatch)
{
    constexpr int kRows = 200;
    constexpr int kWritten = kThreads / 2 * kRows;
    LogCapture log;
    DADatabase db;
    for (DASession* source : {static_cast<DASession*>(nullptr), &m_session}) {  // per call, then the session
        Target t{&db, source};
        RunTogether([&](int th) {
            for (int i = 0; i < kRows / (source != nullptr ? 1 : 10); ++i) {  // per call: each commit synced
                if (th % 2 == 0) {  // readers
                    EXPECT_GE(Rows(), 0);
                    continue;
                }
                DAUpsertRequest upsert;
                At(upsert, Dir(), "items")
                    .SetData("name", ("row" + std::to_string(th) + "_" + std::to_string(i)).c_str());
                upsert.SetData("value", i);
                EXPECT_EQ(0, RUN(t, Upsert, upsert));
            }
        });
    }
    EXPECT_EQ(kWritten, Rows());
    // A reader that meets a log index being rewritten takes the write lock
    // for an instant: a write may then pause once under the busy rule.
    EXPECT_EQ(0, log.Count("RETRY COUNT is reached LIMIT, SQLITE_BUSY"));

    DABatchRequest batch;
    const std::string value(100, 'v');
    for (int i = 0; i < 40000; ++i) {
        DAUpsertRequest upsert;
        upsert.SetTable("items");
        upsert.SetData("name", i);
        upsert.SetData("value", value.c_str());
        ASSERT_EQ(0, batch.Add(upsert));
    }
    log.Clear();
    std::atomic<int> phase{0};  // 1 while the batch runs, 2 after
    int readsDuringBatch = 0;
    std::thread reader([&] {
        while (phase.load() < 2) {
            const int before = phase.load();
            const int rows = Rows();
            readsDuringBatch += before == 1 && rows == kWritten ? 1 : 0;
            EXPECT_TRUE(rows == kWritten || rows == kWritten + 40000) << rows;  // all of the batch or none
        }
    });
    phase = 1;
    EXPECT_EQ(0, m_session.ExecuteBatch(batch));
    phase = 2;
    reader.join();
    EXPECT_GE(readsDuringBatch, 3);  // read behind the writer, at most one could slip in before it
    EXPECT_EQ(kWritten + 40000, Rows());
    EXPECT_EQ(0, log.Count("SQLITE BUSY[1]"));
}

// Four processes write to one file, one of them through a session and the
// others with per-call visits: every acknowledged row is in the file, and
// the file is whole.
TEST_F(ConcurrentDatabase, SessionAndPerCallProcessesShareAFile)
{
    constexpr int kProcesses = 4;
    constexpr int kRows = 100;
    RawDb(PathOf("t.db")).Run("CREATE TABLE items(name INTEGER PRIMARY KEY, value TEXT)");
    int fds[2];
    ASSERT_EQ(0, pipe(fds));
    std::vector<pid_t> children;
    for (int p = 0; p < kProcesses; ++p) {
        const pid_t pid = fork();
        if (pid == 0) {
            dlog_set_sink(&dlog_discard_sink, nullptr);
            DABasePath location;
            DASession session;
            const bool held = p == 0 && session.Open(At(location, Dir())) == 0;
            for (int k = p * kRows; k < (p + 1) * kRows; ++k) {
                DAUpsertRequest upsert;
                At(upsert, Dir(), "items").SetData("name", k);
                upsert.SetData("value", "v");
                const int rc = held ? session.Upsert(upsert) : DADatabase().Upsert(upsert);
                if (rc == 0 && write(fds[1], &k, sizeof k) != sizeof k) {
                    _exit(1);
                }
            }
            _exit(0);
        }
        children.push_back(pid);
    }
    close(fds[1]);
    std::string acknowledged = "-1";
    int count = 0;
    for (int k = 0; read(fds[0], &k, sizeof k) == sizeof k; ++count) {
        acknowledged += "," + std::to_string(k);
    }
    close(fds[0]);
    for (const pid_t pid : children) {
        int status = -1;
        EXPECT_EQ(pid, waitpid(pid, &status, 0));
        EXPECT_EQ(0, status);
    }
    RawDb db(PathOf("t.db"));
    EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
    EXPECT_EQ(std::to_string(count), db.Query("SELECT count(*) FROM items WHERE name IN (" + acknowledged + ")"));
    EXPECT_GT(count, kProcesses * kRows * 9 / 10);
}

// Three upgrade steps (a table, an added column, an index), each also
// inserting one marker row, run at start by 4 processes and 4 threads at
// once: every call succeeds, each step runs exactly once and exactly one
// caller reports it applied.
TEST_F(ConcurrentDatabase, EachMigrationStepRunsOnceAcrossProcessesAndThreads)
{
    const std::string dir = Dir();
    const auto upgrade = [&dir] {
        DADatabase database;
        DACreateRequest create;
        create.SetTable("markers");
        create.SetColumnKey("step", "INTEGER");
        DAAddColumnRequest note;
        note.SetTable("markers");
        note.SetColumn("note", "TEXT");
        DACreateIndexRequest index;
        index.SetTable("markers");
        index.SetName("markers_step");
        index.AddColumn("step");
        int failures = 0;  // and the steps this caller applied, in bits 1..3
        for (int version = 1; version <= 3; ++version) {
            DABatchRequest step;
            step.SetPath(dir.c_str(), "t.db");
            version == 1 ? step.Add(create) : version == 2 ? step.Add(note) : step.Add(index);
            for (int k = version == 1 ? 1000 : 0; k >= 0; --k) {  // step 1 long enough for the others to arrive
                DAUpsertRequest row;  // the marker last
                row.SetTable("markers");
                k > 0 ? row.SetData("_ID", 100 + k) : row.SetData("step", version);
                step.Add(row);
            }
            bool applied = false;
            failures += database.Migrate(step, version, applied) != 0 ? 16 : applied ? 1 << version : 0;
        }
        return failures;
    };
    int go[2];
    ASSERT_EQ(0, pipe(go));
    std::vector<pid_t> children;
    for (int p = 0; p < kThreads; ++p) {  // forked before any thread starts
        const pid_t child = fork();
        if (child == 0) {
            dlog_set_sink(&dlog_discard_sink, nullptr);
            close(go[1]);
            char byte = 0;
            _exit(read(go[0], &byte, 1) == 0 ? upgrade() : 100);  // released when the pipe closes
        }
        children.push_back(child);
    }
    close(go[0]);
    const LogCapture log;
    std::atomic<int> applied{0};  // each bit's count, in its own 4 bits
    const auto count = [&applied](int bits) {
        EXPECT_EQ(0, bits & ~0xE);
        for (int version = 1; version <= 3; ++version) {
            applied += ((bits >> version) & 1) << (4 * version);
        }
    };
    RunTogether([&](int t) {
        if (t == 0) {
            close(go[1]);
        }
        count(upgrade());
    });
    for (const pid_t child : children) {
        int status = -1;
        EXPECT_EQ(child, waitpid(child, &status, 0));
        EXPECT_TRUE(WIFEXITED(status)) << status;
        count(WEXITSTATUS(status));
    }
    EXPECT_EQ(0x1110, applied.load());
    EXPECT_EQ("3;1|1;2|1;3|1",
              RawDb(PathOf("t.db")).Query("PRAGMA user_version") + ";" +
                  RawDb(PathOf("t.db")).Query("SELECT step, count(*) FROM markers WHERE step > 0 GROUP BY step"));
    EXPECT_EQ(log.Count("RETRY COUNT is reached LIMIT, SQLITE_BUSY"), 0);
}

}  // namespace
