// Several threads fill one request or one cursor at once, or write and read
// one database file at once (per call and through a session), and several
// processes share one file: every insertion must land exactly once with its
// own value, and every acknowledged write must be in the file.

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <memory>
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

// Threads fill one request (data, create-table columns) and
// one cursor at once; then one thread loads the cursor while another empties
// it again and again. Each call takes its container's one lock: every entry
// lands with its own value, the columns in each thread's call order, and the
// cursor's names and stored columns always agree.
TEST(ConcurrentFill, EveryEntryLandsAndInitializeEmptiesWhole)
{
    std::vector<Strings> names(kThreads);  // distinct, stable column-name pointers: "c<t>_<i>"
    for (int t = 0; t < kThreads; ++t) {
        for (int i = 0; i < kPerThread; ++i) {
            names[t].push_back("c" + std::to_string(t) + "_" + std::to_string(i));
        }
    }
    DAUpdateRequest request;
    DACreateRequest create;
    DACursor cursor;
    const auto load = [&](int t) {
        for (const std::string& name : names[t % kThreads]) {
            cursor.SetColumn(name.c_str());
            cursor.SetData(name.c_str(), "v");
        }
    };
    RunTogether([&](int t) {
        load(t);
        for (int i = 0; i < kPerThread; ++i) {
            request.SetData(names[t][i].c_str(), i);
            create.SetColumnKey(names[t][i].c_str(), "TEXT");
        }
    });
    DAValueMap data;
    DAColumnList columns;
    request.GetDataMap(data);
    create.GetColumnKey(columns);
    ASSERT_EQ(data.size(), static_cast<size_t>(kThreads * kPerThread));
    ASSERT_EQ(columns.size(), data.size());
    std::vector<int> next(kThreads, 0);
    for (const auto& entry : columns) {
        const int t = entry.first[1] - '0';
        EXPECT_EQ(entry.first, names[t][next[t]++].c_str());
    }
    for (int t = 0; t < kThreads; ++t) {
        for (int i = 0; i < kPerThread; ++i) {
            EXPECT_EQ(data.at(names[t][i].c_str()), std::to_string(i)) << names[t][i];
        }
    }
    Strings registered;
    ASSERT_EQ(0, cursor.GetColumn(registered));
    ASSERT_EQ(registered.size(), data.size());
    ExpectEveryColumnHoldsAValue(cursor);

    std::atomic<bool> loaded{false};
    std::thread loader([&] {
        for (int round = 0; round < 1000; ++round) {
            load(round);
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
        RawDb(PathOf("t.db")).Run("CREATE TABLE items(name TEXT PRIMARY KEY, value TEXT)");
        DABasePath location;
        ASSERT_EQ(0, m_session.Open(At(location, Dir())));
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
// others with per-call visits: the file holds every acknowledged row (and
// none of a failed write), and it is whole.
TEST_F(ConcurrentDatabase, SessionAndPerCallProcessesShareAFile)
{
    constexpr int kProcesses = 4;
    constexpr int kRows = 100;
    RawDb(PathOf("t.db")).Run("CREATE TABLE items(name INTEGER PRIMARY KEY, value TEXT)");
    std::vector<pid_t> children;
    for (int p = 0; p < kProcesses; ++p) {
        children.push_back(Spawn([&, p] {  // exits with the number of its writes that failed
            DABasePath location;
            DASession session;
            const bool held = p == 0 && session.Open(At(location, Dir())) == 0;
            int failed = 0;
            for (int k = p * kRows; k < (p + 1) * kRows; ++k) {
                DAUpsertRequest upsert;
                At(upsert, Dir(), "items").SetData("name", k);
                upsert.SetData("value", "v");
                failed += (held ? session.Upsert(upsert) : DADatabase().Upsert(upsert)) != 0 ? 1 : 0;
            }
            return failed;
        }));
    }
    int failed = 0;
    for (const pid_t pid : children) {
        const int rc = ExitOf(pid);
        ASSERT_GE(rc, 0);
        failed += rc;
    }
    EXPECT_LT(failed, kProcesses * kRows / 10);
    EXPECT_EQ("ok|" + std::to_string(kProcesses * kRows - failed),
              RawDb(PathOf("t.db")).Query("SELECT * FROM pragma_integrity_check, (SELECT count(*) FROM items)"));
}

// Three upgrade steps (a table, an added column, an index), each also
// inserting one marker row, run at once by 4 threads and 4 processes, each
// on a connection of its own, each also incrementing one counter between
// the steps: every call succeeds (repeated while it meets the busy limit),
// each step runs exactly once, exactly one caller reports it applied, and
// the counter ends exact.
TEST_F(ConcurrentDatabase, EachMigrationStepRunsOnceAndCountersStayExact)
{
    constexpr int kIncrements = 20;
    RawDb(PathOf("t.db")).Run("CREATE TABLE c(k TEXT PRIMARY KEY, n INTEGER); INSERT INTO c VALUES ('a', 0)");
    std::vector<std::unique_ptr<DABatchRequest>> steps;  // each caller's three, made before any starts
    for (int i = 0; i < 2 * kThreads * 3; ++i) {
        const int version = i % 3 + 1;
        DACreateRequest create;
        DAAddColumnRequest note;
        DACreateIndexRequest index;
        At(create, Dir(), "markers").SetColumnKey("step", "INTEGER");
        At(note, Dir(), "markers").SetColumn("note", "TEXT");
        At(index, Dir(), "markers").SetName("markers_step");
        index.AddColumn("step");
        DABatchRequest& step = *steps.emplace_back(std::make_unique<DABatchRequest>());
        At(step, Dir());
        version == 1 ? step.Add(create) : version == 2 ? step.Add(note) : step.Add(index);
        for (int k = version == 1 ? 1000 : 0; k >= 0; --k) {  // step 1 long enough for the others to arrive
            DAUpsertRequest row;  // the marker last
            At(row, Dir(), "markers");
            k > 0 ? row.SetData("_ID", 100 + k) : row.SetData("step", version);
            step.Add(row);
        }
    }
    DAUpdateRequest counter;
    At(counter, Dir(), "c").SetWhere("k", "a");
    counter.SetIncrement("n", 1);
    // A call that met the retry limit (5) applied nothing, so the caller repeats it, as an app
    // would: a slow disk can starve one of eight writers for the 1.5 s the rule waits.
    const auto untilNotBusy = [](const auto& call) {
        int rc = 0;
        while ((rc = call()) == 5) {}
        return rc;
    };
    // The steps caller w applied, in bits 1..3; bit 4 for any call that failed otherwise.
    const auto upgrade = [&](int w) {
        int bits = 0;
        for (int version = 1; version <= 3; ++version) {
            bool done = false;
            const int rc =
                untilNotBusy([&] { return DADatabase().Migrate(*steps[w * 3 + version - 1], version, done); });
            bits |= rc != 0 ? 16 : done ? 1 << version : 0;
            for (int i = 0; i < kIncrements; ++i) {
                bits |= untilNotBusy([&] { return DADatabase().Update(counter); }) != 0 ? 16 : 0;
            }
        }
        return bits;
    };
    int go[2];
    ASSERT_EQ(0, pipe(go));
    std::vector<pid_t> children;
    for (int p = 0; p < kThreads; ++p) {  // forked before any thread starts, released when the pipe closes
        children.push_back(Spawn([&, p] {
            close(go[1]);
            char byte = 0;
            return read(go[0], &byte, 1) == 0 ? upgrade(kThreads + p) : 32;
        }));
    }
    close(go[0]);
    std::atomic<int> applied{0};  // each version's count in 4 bits of its own; failures above
    const auto count = [&applied](int bits) {
        for (int version = 1; version <= 4; ++version) {
            applied += ((bits >> version) & 1) << (4 * version);
        }
    };
    const LogCapture log;
    RunTogether([&](int t) {
        if (t == 0) {
            close(go[1]);
        }
        count(upgrade(t));
    });
    for (const pid_t child : children) {
        const int bits = ExitOf(child);
        EXPECT_GE(bits, 0);
        count(bits);
    }
    EXPECT_EQ(0x01110, applied.load());
    RawDb db(PathOf("t.db"));
    EXPECT_EQ("3;1|1;2|1;3|1;" + std::to_string(2 * kThreads * 3 * kIncrements),
              db.Query("PRAGMA user_version") + ";" +
                  db.Query("SELECT step, count(*) FROM markers WHERE step > 0 GROUP BY step") + ";" +
                  db.Query("SELECT n FROM c"));
    EXPECT_GT(log.Count("SQLITE BUSY[1]"), 0);  // a caller waited for another's step
}

}  // namespace
