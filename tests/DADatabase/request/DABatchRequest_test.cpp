#include "DABatchRequest.h"

#include <chrono>
#include <thread>
#include <tuple>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

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

    // Adds an upsert of (id, name) into people; no location: the batch's.
    int AddUpsert(int id, const char* name)
    {
        DAUpsertRequest upsert;
        upsert.SetTable("people");
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
    AddUpsert(5, "Ahn");
    AddUpsert(6, nullptr);
    AddUpsert(7, "Yun");
    const std::string before = FileBytes(PathOf(kFile));
    LogCapture log;
    EXPECT_EQ(19, m_db.ExecuteBatch(m_batch));
    EXPECT_EQ(Strings{"6 DADatabase.cpp:ExecuteBatch > ExecuteBatch FAILED[19] at 2/3: NOT NULL constraint failed: "
                      "people.name"},
              Described(log));
    EXPECT_EQ(before, FileBytes(PathOf(kFile)));
}

TEST_F(DABatchTest, AddRefusesARequestForAnotherFile)
{
    DADropRequest other;  // refused before its statement is written
    other.SetPath(PathOf("sub").c_str(), kFile);  // the same name in another folder
    LogCapture log;
    EXPECT_EQ(21, m_batch.Add(other));
    other.SetPath(nullptr, kFile);
    EXPECT_EQ(21, m_batch.Add(other));
    const std::string refused = "6 DABatchRequest.cpp:Add > Add FAILED[21]: request location ";
    EXPECT_EQ((Strings{refused + Dir() + "/sub/t.db is not the batch's " + Dir() + "/t.db",
                       refused + "(incomplete) is not the batch's " + Dir() + "/t.db"}),
              Described(log));
    EXPECT_EQ(0, m_batch.GetCount());
}

// Another connection holds the file: writing throughout (the begin gives
// up, at 0/2), reading throughout (the statements run, the commit gives up,
// at 3/2), or released during the pauses (everything lands).
TEST_F(DABatchTest, BusyFileIsWaitedForAtTheBeginAndTheCommit)
{
    using Case = std::tuple<const char*, int, const char*>;  // the holder's transaction, its release (ms), the step
    for (const auto& [hold, releaseMs, step] :
         {Case{"BEGIN EXCLUSIVE", 2000, "0/2"}, Case{"BEGIN; SELECT count(*) FROM people;", 2000, "3/2"},
          Case{"BEGIN EXCLUSIVE", 250, ""}}) {
        m_batch.Clear();
        AddUpsert(8, "Cho");
        AddUpsert(9, "Yun");
        RawDb holder(PathOf(kFile));
        holder.Run(hold);
        LogCapture log;
        std::thread releaser([&, releaseMs = releaseMs] {
            std::this_thread::sleep_for(std::chrono::milliseconds(releaseMs));
            holder.Run("COMMIT");
        });
        const bool release = *step == '\0';
        EXPECT_EQ(release ? 0 : 5, m_db.ExecuteBatch(m_batch));
        releaser.join();
        const Strings lines = Described(log);
        Strings expected = BusyWarnings("DADatabase.cpp", release ? static_cast<int>(lines.size()) - 1 : 15);
        const Strings last = release ? Strings{"4 DADatabase.cpp:ExecuteBatch > ExecuteBatch SUCCESS[0]: 2 statements"}
                                     : Strings{kLimit,
                                               "6 DADatabase.cpp:ExecuteBatch > ExecuteBatch FAILED[5] at " +
                                                   std::string(step) + ": database is locked"};
        expected.insert(expected.end(), last.begin(), last.end());
        EXPECT_EQ(expected, lines) << hold;
        EXPECT_EQ(release ? "1|Kim|010;2|Lee|011;8|Cho|NULL;9|Yun|NULL" : "1|Kim|010;2|Lee|011", Rows());
    }
}

}  // namespace
