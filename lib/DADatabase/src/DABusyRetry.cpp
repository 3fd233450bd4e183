#include "DABusyRetry.h"

#include <unistd.h>

#include "DALog.h"

namespace {
constexpr int kRetryLimit = 15;
constexpr useconds_t kBusyPauseMicroseconds = 100000;
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
