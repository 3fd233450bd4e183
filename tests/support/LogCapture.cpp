#include "LogCapture.h"

#include <cstdlib>

#include "dlog.h"

namespace {

// Splits "file: function(line) > message"; leaves the fields empty for a
// line of another shape.
void SplitFields(LogLine& entry)
{
    const std::string& text = entry.text;
    const auto colon = text.find(": ");
    const auto arrow = text.find(") > ");
    if (colon == std::string::npos || arrow == std::string::npos || arrow < colon) {
        return;
    }
    const auto open = text.rfind('(', arrow);
    if (open == std::string::npos || open < colon) {
        return;
    }
    entry.file = text.substr(0, colon);
    entry.function = text.substr(colon + 2, open - colon - 2);
    entry.line = std::atoi(text.substr(open + 1, arrow - open - 1).c_str());
    entry.message = text.substr(arrow + 4);
}

}  // namespace

LogCapture::LogCapture()
{
    dlog_set_sink(&LogCapture::Sink, this);
}

LogCapture::~LogCapture()
{
    dlog_set_sink(nullptr, nullptr);
}

void LogCapture::Sink(int logId, int prio, const char* tag, const char* text, void* user)
{
    auto* self = static_cast<LogCapture*>(user);
    LogLine entry;
    entry.logId = logId;
    entry.priority = prio;
    entry.tag = tag;
    entry.text = text;
    SplitFields(entry);
    const std::lock_guard<std::mutex> guard(self->m_mutex);
    self->m_lines.push_back(std::move(entry));
}

std::vector<LogLine> LogCapture::Lines() const
{
    const std::lock_guard<std::mutex> guard(m_mutex);
    return m_lines;
}

int LogCapture::Count(const std::string& message) const
{
    int count = 0;
    for (const LogLine& entry : Lines()) {
        count += entry.message == message ? 1 : 0;
    }
    return count;
}

void LogCapture::Clear()
{
    const std::lock_guard<std::mutex> guard(m_mutex);
    m_lines.clear();
}
