// A program may define its own __dlog_print: the dynamic linker then binds
// the libraries' calls to it, and the lines never reach libdlog's sink.
#include <cstdarg>
#include <cstdio>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "DACursor.h"
#include "DADatabase.h"
#include "dlog.h"

namespace {

struct Received {
    int logId;
    int prio;
    std::string tag;
    std::string format;
    std::string text;
};

std::vector<Received> g_received;

}  // namespace

extern "C" int __dlog_print(log_id_t log_id, int prio, const char* tag, const char* fmt, ...)
{
    char text[1024];
    va_list args;
    va_start(args, fmt);
    const int length = std::vsnprintf(text, sizeof text, fmt, args);
    va_end(args);
    g_received.push_back({log_id, prio, tag, fmt, text});
    return length;
}

TEST(DlogInterpose, TheProgramsOwnFunctionReceivesTheLibrarysLines)
{
    g_received.clear();
    DACursor cursor;
    EXPECT_EQ(3, cursor.MoveToNext());

    DADropRequest request;
    request.SetPath("/nonexistent/ulo_db", "t.db");
    request.SetTable("contacts");
    EXPECT_EQ(14, DADatabase().DropTable(request));

    ASSERT_EQ(2U, g_received.size());
    EXPECT_EQ(LOG_ID_MAIN, g_received[0].logId);
    EXPECT_EQ(DLOG_INFO, g_received[0].prio);
    EXPECT_EQ("ULO_DB", g_received[0].tag);
    EXPECT_EQ("%s: %s(%d) > Last Row", g_received[0].format);
    EXPECT_EQ(0U, g_received[0].text.find("DACursor.cpp: MoveToNext(")) << g_received[0].text;
    EXPECT_EQ(DLOG_ERROR, g_received[1].prio);
    const std::string& open = g_received[1].text;
    EXPECT_EQ(0U, open.find("DADatabase.cpp: OpenDB(")) << open;
    EXPECT_NE(std::string::npos, open.find(") > DB open failed. Error no(14): unable to open database file")) << open;
}
