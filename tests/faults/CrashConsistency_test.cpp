// A writer killed at random moments: the file stays sound and keeps every
// row whose Upsert had returned 0.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <random>
#include <set>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "FaultTestUtil.h"
#include "TempDirTest.h"
#include "dlog.h"

namespace {

using CrashConsistency = TempDirTest;

TEST_F(CrashConsistency, KilledWriterLosesNoAcknowledgedRow)
{
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT)");
    std::mt19937 random(20261123);
    std::set<int> acknowledged;
    for (int round = 0; round < 6; ++round) {
        int fds[2];
        ASSERT_EQ(0, pipe(fds));
        const pid_t pid = fork();
        if (pid == 0) {
            close(fds[0]);
            dlog_set_sink(&dlog_discard_sink, nullptr);
            DADatabase db;
            for (int k = round * 1000000;; ++k) {
                DAUpsertRequest request;
                request.SetPath(Dir().c_str(), "t.db");
                request.SetTable("t");
                request.SetData("k", k);
                request.SetData("v", std::string(static_cast<std::size_t>(k % 900), 'v').c_str());
                if (db.Upsert(request) == 0 && write(fds[1], &k, sizeof k) != sizeof k) {
                    _exit(1);
                }
            }
        }
        close(fds[1]);
        usleep(std::uniform_int_distribution<useconds_t>(20000, 150000)(random));
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
        for (int k = 0; read(fds[0], &k, sizeof k) == sizeof k;) {
            acknowledged.insert(k);
        }
        close(fds[0]);
        RawDb db(PathOf("t.db"));
        EXPECT_EQ("ok", db.Query("PRAGMA integrity_check"));
        std::istringstream stored(db.Query("SELECT group_concat(k, ' ') FROM t"));
        std::set<int> rows;
        for (int k = 0; stored >> k;) {
            rows.insert(k);
        }
        for (const int k : acknowledged) {
            ASSERT_EQ(1U, rows.count(k)) << "row " << k << " acknowledged but lost in round " << round;
        }
    }
    EXPECT_GT(acknowledged.size(), 6U);
}

}  // namespace
