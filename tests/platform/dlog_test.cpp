#include "dlog.h"

#include <atomic>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

namespace {

// Records every line, and whether any sink call overlapped another.
struct Recorder {
    std::mutex mutex;
    std::vector<std::string> lines;  // "logId prio tag|text"
    std::atomic<int> inside{0};
    std::atomic<bool> overlapped{false};

    static void Sink(int logId, int prio, const char* tag, const char* text, void* user)
    {
        auto* self = static_cast<Recorder*>(user);
        if (self->inside.fetch_add(1) != 0) {
            self->overlapped = true;
        }
        {
            const std::lock_guard<std::mutex> guard(self->mutex);
            self->lines.push_back(std::to_string(logId) + " " + std::to_string(prio) + " " + tag + "|" + text);
        }
        self->inside.fetch_sub(1);
    }
};

class DlogSink : public ::testing::Test {
protected:
    void SetUp() override { dlog_set_sink(&Recorder::Sink, &m_recorder); }
    void TearDown() override { dlog_set_sink(nullptr, nullptr); }
    Recorder m_recorder;
};

// A line longer than the stack buffer is not cut.
TEST(DlogDefaultSink, WritesOneLetterTaggedLinePerCallToStandardError)
{
    std::string text;
    for (int i = 0; text.size() < 3000; ++i) {
        text += std::to_string(i) + ",";
    }
    ::testing::internal::CaptureStderr();
    EXPECT_EQ(__dlog_print(LOG_ID_MAIN, DLOG_INFO, "ULO_DB", "a.cpp: Run(%d) > %s", 12, "done"), 21);
    __dlog_print(LOG_ID_MAIN, DLOG_WARN, "ULO_DB", "busy");
    __dlog_print(LOG_ID_MAIN, DLOG_ERROR, nullptr, "no tag");
    EXPECT_LT(__dlog_print(LOG_ID_MAIN, DLOG_ERROR, "ULO_DB", nullptr), 0);
    EXPECT_EQ(__dlog_print(LOG_ID_MAIN, DLOG_ERROR, "ULO_DB", "x%sy", text.c_str()), static_cast<int>(text.size() + 2));
    EXPECT_EQ(::testing::internal::GetCapturedStderr(),
              "I/ULO_DB: a.cpp: Run(12) > done\nW/ULO_DB: busy\nE/: no tag\nE/ULO_DB: x" + text + "y\n");
}

TEST_F(DlogSink, ReceivesEveryFieldWithoutNewlineUntilReset)
{
    __dlog_print(LOG_ID_SYSTEM, DLOG_WARN, "ULO_DB", "%s(%d)", "f", 3);
    __dlog_print(LOG_ID_MAIN, DLOG_ERROR, nullptr, "%s", std::string(600, 'q').c_str());
    EXPECT_EQ(m_recorder.lines, (std::vector<std::string>{"2 5 ULO_DB|f(3)", "0 6 |" + std::string(600, 'q')}));

    dlog_set_sink(nullptr, nullptr);
    ::testing::internal::CaptureStderr();
    __dlog_print(LOG_ID_MAIN, DLOG_INFO, "T", "back");
    EXPECT_EQ(::testing::internal::GetCapturedStderr(), "I/T: back\n");
    EXPECT_EQ(m_recorder.lines.size(), 2U);

    dlog_set_sink(&dlog_discard_sink, nullptr);
    ::testing::internal::CaptureStderr();
    __dlog_print(LOG_ID_MAIN, DLOG_INFO, "T", "gone");
    EXPECT_EQ(::testing::internal::GetCapturedStderr(), "");
}

TEST_F(DlogSink, ThreadsDeliverEveryLineOneAtATime)
{
    constexpr int kThreads = 8;
    constexpr int kLines = 500;
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([t] {
            for (int i = 0; i < kLines; ++i) {
                __dlog_print(LOG_ID_MAIN, DLOG_INFO, "T", "%d:%d", t, i);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_FALSE(m_recorder.overlapped);
    const std::set<std::string> distinct(m_recorder.lines.begin(), m_recorder.lines.end());
    EXPECT_EQ(m_recorder.lines.size(), static_cast<std::size_t>(kThreads * kLines));
    EXPECT_EQ(distinct.size(), m_recorder.lines.size());
    EXPECT_EQ(distinct.count("0 4 T|7:499"), 1U);
}

}  // namespace
