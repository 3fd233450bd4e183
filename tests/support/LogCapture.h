#ifndef ULO_TESTS_LOGCAPTURE_H
#define ULO_TESTS_LOGCAPTURE_H

#include <mutex>
#include <string>
#include <vector>

// One line as the library wrote it, split into the fields of its
// "file: function(line) > message" layout.
struct LogLine {
    int logId = 0;
    int priority = 0;
    std::string tag;
    std::string text;  // the whole formatted line
    std::string file;
    std::string function;
    int line = 0;
    std::string message;  // what follows "> "
};

// Collects every line written through __dlog_print while it lives (it
// installs itself as the log sink and restores the default on
// destruction). Safe to use while other threads log.
class LogCapture {
public:
    LogCapture();
    ~LogCapture();
    LogCapture(const LogCapture&) = delete;
    LogCapture& operator=(const LogCapture&) = delete;

    std::vector<LogLine> Lines() const;
    // How many lines carry exactly this message.
    int Count(const std::string& message) const;
    void Clear();

private:
    static void Sink(int logId, int prio, const char* tag, const char* text, void* user);

    mutable std::mutex m_mutex;
    std::vector<LogLine> m_lines;
};

#endif  // ULO_TESTS_LOGCAPTURE_H
