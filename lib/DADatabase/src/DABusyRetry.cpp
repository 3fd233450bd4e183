#include "DABusyRetry.h"

#include <unistd.h>

#include "DALog.h"

namespace {
constexpr int kRetryLimit = 15;
constexpr useconds_t kBusyPauseMicroseconds = 100000;
constexpr useconds_t kShortStepMicroseconds = 1000;
constexpr std::chrono::microseconds kWholePause(std::chrono::microseconds::rep{kRetryLimit} * kBusyPauseMicroseconds);
}  // namespace

bool DAIsRetryLimit(int& count, const char* file, int line)
{
    ++count;
    if (count > kRetryLimit) {
        DA_LOG_WHERE(DLOG_ERROR, file, "IsRetryLimit", line, "RETRY COUNT is reached LIMIT, SQLITE_BUSY");
        return true;
    }
    DA_LOG_WHERE(DLOG_WARN, file, "IsRetryLimit", line, "SQLITE BUSY[%d]", count);
    usleep(kBusyPauseMicroseconds);
    return false;
}

bool DAShortBusyWait::IsRetryLimit(int& count, const char* file, int line)
{
    const auto now = std::chrono::steady_clock::now();
    if (count == 0) {
        m_since = now;
    }
    if (count == 0 && !m_quiet) {
        DA_LOG_WHERE(DLOG_WARN, file, "IsRetryLimit", line, "SQLITE BUSY[%d]", 1);
    }
    ++count;
    if (now - m_since >= kWholePause) {
        DA_LOG_WHERE(DLOG_ERROR, file, "IsRetryLimit", line, "RETRY COUNT is reached LIMIT, SQLITE_BUSY");
        return true;
    }
    usleep(kShortStepMicroseconds);
    return false;
}
