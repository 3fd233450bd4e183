#ifndef DAMEMBERLOCK_H
#define DAMEMBERLOCK_H

#include "DAMutex.h"

// Holds the member lock of one container for the guard's lifetime: a
// DAMutex named after the container's address in lower-case hexadecimal
// (no prefix, no leading zeros, full pointer width), locked on construction
// and released on every way out of the scope, exceptions included.
// file and func are the operation's, for the line logged should the name
// come out empty ("Failed to get MUTEX_NAME at file::func[line]").
class DAMemberLock {
public:
    static constexpr int kNameSize = 100;

    DAMemberLock(const void* member, const char* file, const char* func, int line);
    ~DAMemberLock();

    DAMemberLock(const DAMemberLock&) = delete;
    DAMemberLock& operator=(const DAMemberLock&) = delete;

    // Writes the lock name of member into name; returns its length.
    static int FormatName(const void* member, char (&name)[kNameSize]);

private:
    DAMutex m_mutex;
};

// Locks member for the rest of the enclosing scope, on behalf of the
// enclosing function.
#define DA_MEMBER_LOCK(member) const DAMemberLock daMemberLock_(&(member), DA_FILE_NAME, __func__, __LINE__)

#endif  // DAMEMBERLOCK_H
