#include <sys/stat.h>

#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

int ModeOf(const std::string& path)
{
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? static_cast<int>(status.st_mode & 0777) : -1;
}

using Safety = TempDirTest;

}  // namespace

// New files give others nothing: per-call 0640 less the umask, a session's
// exactly SetFileMode's, -wal and -shm alike; an existing file keeps its
// mode and so do its logs.
TEST_F(Safety, CreatedFilesArePrivate)
{
    const LogCapture quiet;
    for (const mode_t mask : {022, 077}) {
        const mode_t old = umask(mask);
        DACreateRequest create;
        const std::string visit = "visit" + std::to_string(mask) + ".db";
        create.SetPath(Dir().c_str(), visit.c_str());
        create.SetTable("t");
        create.SetColumnKey("v", "TEXT");
        EXPECT_EQ(0, DADatabase().CreateTable(create));
        DACreateRequest table;  // no location: a session's file
        table.SetTable("t");
        table.SetColumnKey("v", "TEXT");
        for (const int mode : {-1, 0660}) {
            const std::string name = "s" + std::to_string(mask) + "_" + std::to_string(mode) + ".db";
            DASession session;
            session.SetFileMode(mode);
            DABasePath location;
            location.SetPath(Dir().c_str(), name.c_str());
            ASSERT_EQ(0, session.Open(location));
            DAUpsertRequest upsert;  // no location: the session's file
            upsert.SetTable("t");
            upsert.SetData("v", "x");
            ASSERT_EQ(0, session.CreateTable(table) + session.Upsert(upsert));
            const int expected = mode >= 0 ? mode : 0640 & ~static_cast<int>(mask);
            for (const char* suffix : {"", "-wal", "-shm"}) {
                EXPECT_EQ(expected, ModeOf(PathOf(name + suffix))) << name << suffix;
            }
        }
        umask(old);
        EXPECT_EQ(0640 & ~static_cast<int>(mask), ModeOf(PathOf(visit))) << mask;
    }
    RawDb(PathOf("old.db")).Run("CREATE TABLE t(v TEXT)");
    chmod(PathOf("old.db").c_str(), 0644);
    DASession session;
    session.SetFileMode(0600);
    DABasePath location;
    location.SetPath(Dir().c_str(), "old.db");
    ASSERT_EQ(0, session.Open(location));
    DAUpsertRequest upsert;
    upsert.SetTable("t");
    upsert.SetData("v", "x");
    ASSERT_EQ(0, session.Upsert(upsert));
    EXPECT_EQ(0644, ModeOf(PathOf("old.db")));
    EXPECT_EQ(0644, ModeOf(PathOf("old.db-wal")));
}
