#include "DAMemberLock.h"

#include <cstdint>

#include "DALog.h"

namespace {

// Formats the name and returns it; a failed formatting is logged and
// yields the empty name, which is still a valid lock.
struct LockName {
    char text[DAMemberLock::kNameSize] = {};

    LockName(const void* member, const char* file, const char* func, int line)
    {
        if (DAMemberLock::FormatName(member, text) < 1) {
            text[0] = '\0';
            DA_LOG_WHERE(DLOG_ERROR, file, func, line, "Failed to get MUTEX_NAME at %s::%s[%d]", file, func, line);
        }
    }
};

}  // namespace

int DAMemberLock::FormatName(const void* member, char (&name)[kNameSize])
{
    // Hand-written rather than snprintf("%x"): the same text, but this runs
    // once for every value a query stores, so it must be cheap.
    static const char digits[] = "0123456789abcdef";
    auto address = reinterpret_cast<std::uintptr_t>(member);
    char reversed[sizeof address * 2];
    int length = 0;
    do {
        reversed[length++] = digits[address & 0xFU];
        address >>= 4U;
    } while (address != 0);
    for (int i = 0; i < length; ++i) {
        name[i] = reversed[length - 1 - i];
    }
    name[length] = '\0';
    return length;
}

DAMemberLock::DAMemberLock(const void* member, const char* file, const char* func, int line)
    : m_mutex(LockName(member, file, func, line).text)
{
    m_mutex.Lock();
}

DAMemberLock::~DAMemberLock()
{
    m_mutex.Unlock();
}
