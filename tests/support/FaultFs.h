#ifndef ULO_TESTS_FAULTFS_H
#define ULO_TESTS_FAULTFS_H

// A file system for SQLite that behaves like a disk behind a volatile cache:
// writes and truncations are held in memory, per file, until the file is
// synced; reads see them. A process killed before a sync loses them, as a
// power cut would. It can also fail the n-th write, truncation or sync
// with an I/O error, and it counts the database files opened and the
// shared-memory lock calls (one read transaction takes and drops one). It
// wraps SQLite's "unix" file system; shared memory and locks are the real
// ones. Deletions are not held back.

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include <sqlite3.h>

namespace faultfs {

struct Op {
    sqlite3_int64 offset;
    std::string data;  // empty with truncate
    bool truncate;
};

struct State {
    std::mutex mutex;
    std::map<std::string, std::vector<Op>> pending;  // by path, unsynced, in order
    int failAt = 0;  // the write, truncation or sync to fail, counted from 1; 0: none
    int calls = 0;
    int opened = 0;  // main database files
    int shmLocks = 0;
};
inline State g_state;

struct File {
    sqlite3_file base;
    std::string* key;  // the path; a temporary file's address
    sqlite3_file* real;
};

inline sqlite3_vfs* Unix()
{
    static sqlite3_vfs* const real = sqlite3_vfs_find("unix");
    return real;
}
inline sqlite3_file* Real(sqlite3_file* file)
{
    return reinterpret_cast<File*>(file)->real;
}

// The size the process sees: the real size with the pending operations.
inline sqlite3_int64 Size(File* file, const std::vector<Op>& ops)
{
    sqlite3_int64 size = 0;
    file->real->pMethods->xFileSize(file->real, &size);
    for (const Op& op : ops) {
        size = op.truncate ? op.offset : std::max<sqlite3_int64>(size, op.offset + op.data.size());
    }
    return size;
}

// True when the fault counter reaches failAt.
inline bool FailNow()
{
    return g_state.failAt > 0 && ++g_state.calls == g_state.failAt;
}

inline int Read(sqlite3_file* handle, void* buffer, int amount, sqlite3_int64 offset)
{
    auto* file = reinterpret_cast<File*>(handle);
    const int rc = file->real->pMethods->xRead(file->real, buffer, amount, offset);
    if (rc != SQLITE_OK && rc != SQLITE_IOERR_SHORT_READ) {
        return rc;
    }
    const std::lock_guard<std::mutex> guard(g_state.mutex);
    const std::vector<Op>& ops = g_state.pending[*file->key];
    auto* bytes = static_cast<char*>(buffer);
    for (const Op& op : ops) {
        const sqlite3_int64 begin = std::max(offset, op.offset);
        const sqlite3_int64 end =
            op.truncate ? offset + amount : std::min<sqlite3_int64>(offset + amount, op.offset + op.data.size());
        if (begin < end && op.truncate) {
            std::memset(bytes + (begin - offset), 0, end - begin);
        } else if (begin < end) {
            std::memcpy(bytes + (begin - offset), op.data.data() + (begin - op.offset), end - begin);
        }
    }
    const sqlite3_int64 size = Size(file, ops);
    if (offset + amount > size) {
        const sqlite3_int64 valid = std::max<sqlite3_int64>(size - offset, 0);
        std::memset(bytes + valid, 0, amount - valid);
        return SQLITE_IOERR_SHORT_READ;
    }
    return SQLITE_OK;
}

// Holds back a write or truncation.
inline int Hold(sqlite3_file* handle, Op op)
{
    const std::lock_guard<std::mutex> guard(g_state.mutex);
    if (FailNow()) {
        return op.truncate ? SQLITE_IOERR_TRUNCATE : SQLITE_IOERR_WRITE;
    }
    g_state.pending[*reinterpret_cast<File*>(handle)->key].push_back(std::move(op));
    return SQLITE_OK;
}

// Applies what is held for the file, then syncs it for real.
inline int Sync(sqlite3_file* handle, int flags)
{
    auto* file = reinterpret_cast<File*>(handle);
    const std::lock_guard<std::mutex> guard(g_state.mutex);
    if (FailNow()) {
        return SQLITE_IOERR_FSYNC;
    }
    for (const Op& op : std::exchange(g_state.pending[*file->key], {})) {
        op.truncate
            ? file->real->pMethods->xTruncate(file->real, op.offset)
            : file->real->pMethods->xWrite(file->real, op.data.data(), static_cast<int>(op.data.size()), op.offset);
    }
    return file->real->pMethods->xSync(file->real, flags);
}

inline const sqlite3_io_methods kMethods = {
    2,
    [](sqlite3_file* f) {
        const std::unique_ptr<std::string> key(reinterpret_cast<File*>(f)->key);
        if ((*key)[0] == '#') {  // a temporary file: gone with its handle
            const std::lock_guard<std::mutex> guard(g_state.mutex);
            g_state.pending.erase(*key);
        }
        return Real(f)->pMethods->xClose(Real(f));
    },
    &Read,
    [](sqlite3_file* f, const void* data, int amount, sqlite3_int64 offset) {
        return Hold(f, Op{offset, std::string(static_cast<const char*>(data), amount), false});
    },
    [](sqlite3_file* f, sqlite3_int64 size) {
        return Hold(f, Op{size, {}, true});
    },
    &Sync,
    [](sqlite3_file* f, sqlite3_int64* size) {
        auto* file = reinterpret_cast<File*>(f);
        const std::lock_guard<std::mutex> guard(g_state.mutex);
        *size = Size(file, g_state.pending[*file->key]);
        return SQLITE_OK;
    },
    [](sqlite3_file* f, int lock) { return Real(f)->pMethods->xLock(Real(f), lock); },
    [](sqlite3_file* f, int lock) { return Real(f)->pMethods->xUnlock(Real(f), lock); },
    [](sqlite3_file* f, int* out) { return Real(f)->pMethods->xCheckReservedLock(Real(f), out); },
    [](sqlite3_file* f, int op, void* arg) { return Real(f)->pMethods->xFileControl(Real(f), op, arg); },
    [](sqlite3_file* f) { return Real(f)->pMethods->xSectorSize(Real(f)); },
    [](sqlite3_file* f) { return Real(f)->pMethods->xDeviceCharacteristics(Real(f)); },
    [](sqlite3_file* f, int page, int size, int extend, void volatile** out) {
        return Real(f)->pMethods->xShmMap(Real(f), page, size, extend, out);
    },
    [](sqlite3_file* f, int offset, int n, int flags) {
        ++g_state.shmLocks;
        return Real(f)->pMethods->xShmLock(Real(f), offset, n, flags);
    },
    [](sqlite3_file* f) { Real(f)->pMethods->xShmBarrier(Real(f)); },
    [](sqlite3_file* f, int remove) { return Real(f)->pMethods->xShmUnmap(Real(f), remove); },
    nullptr,
    nullptr,
};

// Makes the file system SQLite's default while it lives; what is held is
// dropped on destruction (a power cut of this process's cache).
class Installed {
public:
    Installed()
    {
        m_vfs = *Unix();
        m_vfs.szOsFile = static_cast<int>(sizeof(File)) + Unix()->szOsFile;
        m_vfs.zName = "faultfs";
        m_vfs.xOpen = [](sqlite3_vfs*, const char* name, sqlite3_file* handle, int flags, int* out) {
            auto* file = reinterpret_cast<File*>(handle);
            file->real = reinterpret_cast<sqlite3_file*>(file + 1);
            const int rc = Unix()->xOpen(Unix(), name, file->real, flags, out);
            g_state.opened += (flags & SQLITE_OPEN_MAIN_DB) != 0 ? 1 : 0;
            file->base.pMethods = rc == SQLITE_OK ? &kMethods : nullptr;
            file->key = rc == SQLITE_OK
                ? new std::string(name != nullptr ? name : "#" + std::to_string(reinterpret_cast<std::uintptr_t>(file)))
                : nullptr;
            return rc;
        };
        m_vfs.xDelete = [](sqlite3_vfs*, const char* name, int syncDir) {
            const std::lock_guard<std::mutex> guard(g_state.mutex);
            g_state.pending.erase(name);
            return Unix()->xDelete(Unix(), name, syncDir);
        };
        sqlite3_vfs_register(&m_vfs, 1);
    }
    ~Installed()
    {
        sqlite3_vfs_register(Unix(), 1);
        sqlite3_vfs_unregister(&m_vfs);
        g_state.pending.clear();
        g_state.failAt = g_state.calls = g_state.opened = g_state.shmLocks = 0;
    }
    Installed(const Installed&) = delete;
    Installed& operator=(const Installed&) = delete;

private:
    sqlite3_vfs m_vfs{};
};

}  // namespace faultfs

#endif  // ULO_TESTS_FAULTFS_H
