#include "dlog.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

// Records every line as "logId prio tag|text".
struct Recorder {
    std::vector<std::string> lines;

    static void Sink(int logId, int prio, const char* tag, const char* text, void* user)
    {
        static_cast<Recorder*>(user)->lines.push_back(std::to_string(logId) + " " + std::to_string(prio) + " " + tag +
                                                      "|" + text);
    }
};

// Without a sink: one letter-tagged line per call on standard error; no
// format is an error. A sink receives every field without a newline until
// it is reset, a line as long as the stack buffer (512) uncut; the discard
// sink swallows lines.
TEST(Dlog, WritesToStandardErrorOrItsSink)
{
    ::testing::internal::CaptureStderr();
    EXPECT_EQ(__dlog_print(LOG_ID_MAIN, DLOG_INFO, "ULO_DB", "a.cpp: Run(%d) > %s", 12, "done"), 21);
    __dlog_print(LOG_ID_MAIN, DLOG_WARN, "ULO_DB", "busy");
    __dlog_print(LOG_ID_MAIN, DLOG_ERROR, nullptr, "no tag");
    __dlog_print(LOG_ID_MAIN, 99, "T", "unknown priority");
    EXPECT_LT(__dlog_print(LOG_ID_MAIN, DLOG_ERROR, "ULO_DB", nullptr), 0);
    EXPECT_EQ(::testing::internal::GetCapturedStderr(),
              "I/ULO_DB: a.cpp: Run(12) > done\nW/ULO_DB: busy\nE/: no tag\n?/T: unknown priority\n");
    Recorder recorder;
    dlog_set_sink(&Recorder::Sink, &recorder);
    __dlog_print(LOG_ID_SYSTEM, DLOG_WARN, "ULO_DB", "%s(%d)", "f", 3);
    __dlog_print(LOG_ID_MAIN, DLOG_ERROR, nullptr, "%s", std::string(512, 'q').c_str());
    EXPECT_EQ(recorder.lines, (std::vector<std::string>{"2 5 ULO_DB|f(3)", "0 6 |" + std::string(512, 'q')}));
    dlog_set_sink(nullptr, nullptr);
    ::testing::internal::CaptureStderr();
    __dlog_print(LOG_ID_MAIN, DLOG_INFO, "T", "back");
    dlog_set_sink(&dlog_discard_sink, nullptr);
    __dlog_print(LOG_ID_MAIN, DLOG_INFO, "T", "gone");
    EXPECT_EQ(::testing::internal::GetCapturedStderr(), "I/T: back\n");
    EXPECT_EQ(recorder.lines.size(), 2U);
    dlog_set_sink(nullptr, nullptr);
}

}  // namespace
