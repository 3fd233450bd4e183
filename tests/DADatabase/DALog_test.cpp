// Built without __FILE_NAME__, so the log line's file field comes from the
// fallback that cuts __FILE__ at its last "/".
#include "DALog.h"

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"

TEST(DALog, FileFieldFallsBackToTheBaseNameOfFile)
{
    EXPECT_STREQ(DASourceFileName("/a/b/c.cpp"), "c.cpp");
    EXPECT_STREQ(DASourceFileName("c.cpp"), "c.cpp");
    LogCapture log;
    DA_LOG(DLOG_ERROR, "code %d", 7);
    EXPECT_EQ(Strings{Logged(6, "DALog_test.cpp", "TestBody", "code 7")}, Described(log));
}
