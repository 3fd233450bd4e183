#include "DABatchRequest.h"

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>
#include <tuple>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"
#include "dlog.h"

namespace {

const char* const kFile = "t.db";
const char* const kSeed = "CREATE TABLE people(_ID INTEGER PRIMARY KEY, name TEXT NOT NULL, phone TEXT);"
                          "INSERT INTO people(name, phone) VALUES ('Kim', '010'), ('Lee', '011');";
const std::string kLimit = "6 DADatabase.cpp:IsRetryLimit > RETRY COUNT is reached LIMIT, SQLITE_BUSY";

class DABatchTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        RawDb(PathOf(kFile)).Run(kSeed);
        m_batch.SetPath(Dir().c_str(), kFile);
    }

    // Adds an upsert of (id, name) into table; no location: the batch's.
    int AddUpsert(int id, const char* name, const char* table = "people")
    {
        DAUpsertRequest upsert;
        upsert.SetTable(table);
        upsert.SetData("_ID", id);
        upsert.SetData(name != nullptr ? "name" : "phone", name != nullptr ? name : "012");
        return m_batch.Add(upsert);
    }

    std::string Rows(const char* sql = "SELECT * FROM people ORDER BY _ID") { return RawDb(PathOf(kFile)).Query(sql); }

    DADatabase m_db;
    DABatchRequest m_batch;
};

// A statement in the middle fails: its code, its index, the file untouched.
TEST_F(DABatchTest, FailingStatementLeavesTheFileByteForByte)
{
    using Case = std::tuple<const char*, const char*, int, const char*>;  // table, name, code, line
    for (const auto& [table, name, rc, line] :
         {Case{"nope", "Cho", 1, "ExecuteBatch FAILED[1] at 2/3: no such table: nope"},
          Case{"people", nullptr, 19, "ExecuteBatch FAILED[19] at 2/3: NOT NULL constraint failed: people.name"}}) {
        m_batch.Clear();
        AddUpsert(5, "Ahn");
        AddUpsert(6, name, table);
        AddUpsert(7, "Yun");
        const std::string before = FileBytes(PathOf(kFile));
        LogCapture log;
        EXPECT_EQ(rc, m_db.ExecuteBatch(m_batch));
        EXPECT_EQ(Strings{std::string("6 DADatabase.cpp:ExecuteBatch > ") + line}, Described(log));
        EXPECT_EQ(before, FileBytes(PathOf(kFile)));
    }
}

TEST_F(DABatchTest, AddRefusesARequestForAnotherFile)
{
    DADropRequest other;  // refused before its statement is written
    other.SetPath(Dir().c_str(), "other.db");
    LogCapture log;
    EXPECT_EQ(21, m_batch.Add(other));
    other.SetPath(PathOf("sub").c_str(), kFile);  // the same name in another folder
    EXPECT_EQ(21, m_batch.Add(other));
    other.SetPath(nullptr, kFile);
    EXPECT_EQ(21, m_batch.Add(other));
    const std::string refused = "6 DABatchRequest.cpp:Add > Add FAILED[21]: request location ";
    EXPECT_EQ((Strings{refused + Dir() + "/other.db is not the batch's " + Dir() + "/t.db",
                       refused + Dir() + "/sub/t.db is not the batch's " + Dir() + "/t.db",
                       refused + "(incomplete) is not the batch's " + Dir() + "/t.db"}),
              Described(log));
    EXPECT_EQ(0, m_batch.GetCount());
}

// Another connection holds the file: throughout (the begin gives up), or
// released during the pauses (everything lands).
TEST_F(DABatchTest, BusyFileIsWaitedForAtTheBegin)
{
    for (const bool release : {false, true}) {
        m_batch.Clear();
        AddUpsert(8, "Cho");
        AddUpsert(9, "Yun");
        RawDb holder(PathOf(kFile));
        holder.Run("BEGIN EXCLUSIVE");
        LogCapture log;
        std::thread releaser([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(release ? 250 : 2000));
            holder.Run("COMMIT");
        });
        EXPECT_EQ(release ? 0 : 5, m_db.ExecuteBatch(m_batch));
        releaser.join();
        const Strings lines = Described(log);
        Strings expected = BusyWarnings("DADatabase.cpp", release ? static_cast<int>(lines.size()) - 1 : 15);
        const Strings last = release
            ? Strings{"4 DADatabase.cpp:ExecuteBatch > ExecuteBatch SUCCESS[0]: 2 statements"}
            : Strings{kLimit, "6 DADatabase.cpp:ExecuteBatch > ExecuteBatch FAILED[5] at 0/2: database is locked"};
        expected.insert(expected.end(), last.begin(), last.end());
        EXPECT_EQ(expected, lines);
        EXPECT_EQ(release ? "1|Kim|010;2|Lee|011;8|Cho|NULL;9|Yun|NULL" : "1|Kim|010;2|Lee|011", Rows());
    }
}

// A process killed while it runs batch after batch of 500 rows leaves
// whole batches only.
TEST_F(DABatchTest, KilledProcessLeavesAllOrNoneOfABatch)
{
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        dlog_set_sink(dlog_discard_sink, nullptr);
        for (int round = 0;; ++round) {
            m_batch.Clear();
            for (int i = 1; i <= 500; ++i) {
                AddUpsert(round * 500 + i + 2, "Row");
            }
            m_db.ExecuteBatch(m_batch);
        }
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    kill(child, SIGKILL);
    int status = 0;
    ASSERT_EQ(child, waitpid(child, &status, 0));
    EXPECT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ("ok", Rows("PRAGMA integrity_check"));
    EXPECT_EQ("0", Rows("SELECT (count(*) - 2) % 500 FROM people"));
}

}  // namespace
