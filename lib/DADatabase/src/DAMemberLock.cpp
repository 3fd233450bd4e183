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
    // once for every value a query stores, so it must be cheap. The digits
    // are counted first and then written in place from the last one.
    static const char digits[] = "0123456789abcdef";
    auto address = reinterpret_cast<std::uintptr_t>(member);
    constexpr int kBits = static_cast<int>(sizeof(unsigned long long) * 8);
    const int length = address == 0 ? 1 : (kBits - __builtin_clzll(address) + 3) / 4;
    name[length] = '\0';
    for (int i = length; i-- > 0;) {
        name[i] = digits[address & 0xFU];
        address >>= 4U;
    }
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
