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

// "logId prio tag|format|text" of every line received.
std::vector<std::string> g_received;

}  // namespace

extern "C" int __dlog_print(log_id_t log_id, int prio, const char* tag, const char* fmt, ...)
{
    char text[1024];
    va_list args;
    va_start(args, fmt);
    const int length = std::vsnprintf(text, sizeof text, fmt, args);
    va_end(args);
    g_received.push_back(std::to_string(log_id) + " " + std::to_string(prio) + " " + tag + "|" + fmt + "|" + text);
    return length;
}

TEST(DlogInterpose, TheProgramsOwnFunctionReceivesTheLibrarysLines)
{
    DACursor cursor;
    EXPECT_EQ(3, cursor.MoveToNext());
    DADropRequest request;
    request.SetPath("/nonexistent/ulo_db", "t.db");
    request.SetTable("contacts");
    EXPECT_EQ(14, DADatabase().DropTable(request));
    ASSERT_EQ(2U, g_received.size());
    EXPECT_EQ(0U, g_received[0].find("0 4 ULO_DB|%s: %s(%d) > Last Row|DACursor.cpp: MoveToNext(")) << g_received[0];
    EXPECT_EQ(0U, g_received[1].find("0 6 ULO_DB|")) << g_received[1];
    EXPECT_NE(std::string::npos, g_received[1].find("|DADatabase.cpp: OpenDB(")) << g_received[1];
    EXPECT_NE(std::string::npos, g_received[1].find(") > DB open failed. Error no(14): unable to open database file"));
}
