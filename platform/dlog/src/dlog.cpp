#include "dlog.h"

#include <cstdarg>
#include <cstdio>
#include <memory>
#include <mutex>
#include <string>

namespace {

std::mutex g_sinkMutex;
dlog_sink_t g_sink = nullptr;
void* g_sinkUser = nullptr;

char PriorityLetter(int prio)
{
    static const char letters[] = "??VDIWEFS";
    return (prio >= 0 && prio < DLOG_PRIO_MAX) ? letters[prio] : '?';
}

void WriteToStderr(int prio, const char* tag, const char* text)
{
    // One fprintf per line: stdio locks the stream for the call.
    std::fprintf(stderr, "%c/%s: %s\n", PriorityLetter(prio), tag, text);
}

}  // namespace

extern "C" int __dlog_print(log_id_t log_id, int prio, const char* tag, const char* fmt, ...)
{
    if (fmt == nullptr) {
        return -1;
    }
    char small[512];
    va_list args;
    va_start(args, fmt);
    const int length = std::vsnprintf(small, sizeof small, fmt, args);
    va_end(args);
    if (length < 0) {
        return length;
    }

    const char* text = small;
    std::unique_ptr<char[]> large;
    if (static_cast<size_t>(length) >= sizeof small) {
        large.reset(new char[static_cast<size_t>(length) + 1]);
        va_start(args, fmt);
        std::vsnprintf(large.get(), static_cast<size_t>(length) + 1, fmt, args);
        va_end(args);
        text = large.get();
    }

    const char* safeTag = tag != nullptr ? tag : "";
    const std::lock_guard<std::mutex> guard(g_sinkMutex);
    if (g_sink != nullptr) {
        g_sink(log_id, prio, safeTag, text, g_sinkUser);
    } else {
        WriteToStderr(prio, safeTag, text);
    }
    return length;
}

extern "C" void dlog_set_sink(dlog_sink_t sink, void* user)
{
    const std::lock_guard<std::mutex> guard(g_sinkMutex);
    g_sink = sink;
    g_sinkUser = user;
}

extern "C" void dlog_discard_sink(int /*log_id*/, int /*prio*/, const char* /*tag*/, const char* /*text*/,
                                  void* /*user*/)
{
}
