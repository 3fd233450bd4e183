#ifndef ULO_TESTS_LOGCAPTURE_H
#define ULO_TESTS_LOGCAPTURE_H

#include <algorithm>
#include <mutex>
#include <string>
#include <vector>

#include "dlog.h"

// One line as the library wrote it: "file: function(line) > message".
struct LogLine {
    int priority = 0;
    std::string file;
    std::string function;
    std::string message;  // what follows "> "; the whole text for a line of another shape
};

// Collects every line written through __dlog_print while it lives (it
// installs itself as the log sink and restores the default on destruction).
// Safe to use while other threads log.
class LogCapture {
public:
    LogCapture() { dlog_set_sink(&LogCapture::Sink, this); }
    ~LogCapture() { dlog_set_sink(nullptr, nullptr); }
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    std::vector<LogLine> Lines() const
    {
        const std::lock_guard<std::mutex> guard(m_mutex);
        return m_lines;
    }

    // How many lines carry exactly this message.
    int Count(const std::string& message) const
    {
        const std::vector<LogLine> lines = Lines();
        return static_cast<int>(
            std::count_if(lines.begin(), lines.end(), [&](const LogLine& line) { return line.message == message; }));
    }

    void Clear()
    {
        const std::lock_guard<std::mutex> guard(m_mutex);
        m_lines.clear();
    }

private:
    static void Sink(int /*logId*/, int prio, const char* /*tag*/, const char* text, void* user)
    {
        LogLine line{prio, "", "", text};
        const std::string whole = text;  // "file: function(digits) > message"
        const std::size_t colon = whole.find(':');
        const std::size_t open = whole.find('(', colon);
        const std::size_t close = whole.find(") > ", open);
        if (close != std::string::npos && whole.compare(colon, 2, ": ") == 0 && close > open + 1 &&
            whole.find_first_not_of("0123456789", open + 1) == close) {
            line = {prio, whole.substr(0, colon), whole.substr(colon + 2, open - colon - 2), whole.substr(close + 4)};
        }
        auto* self = static_cast<LogCapture*>(user);
        const std::lock_guard<std::mutex> guard(self->m_mutex);
        self->m_lines.push_back(std::move(line));
    }

    mutable std::mutex m_mutex;
    std::vector<LogLine> m_lines;
};

#endif  // ULO_TESTS_LOGCAPTURE_H
