#ifndef DAMUTEX_H
#define DAMUTEX_H

#include <cstddef>

/// A named lock. Every DAMutex built from the same name, in any thread,
/// locks one and the same underlying lock, which outlives the objects.
///
/// Design: the underlying locks are a fixed table of kStripeCount mutexes,
/// and a name selects its entry by a hash of its text. Names therefore cost
/// no memory at all, however many come and go, and making a DAMutex never
/// allocates. Two different names may hash to one entry; they then exclude
/// each other needlessly but correctly. That sharing could deadlock only a
/// thread that holds one named lock while taking another, which the
/// database library never does: each of its operations holds at most one
/// lock at a time and takes no other meanwhile. Callers outside the library
/// must keep to the same rule (never hold two DAMutex locks at once), and
/// must not lock the same name twice in one thread: the lock is not
/// recursive.
class DAMutex {
public:
    /// The number of underlying locks in the table.
    static constexpr std::size_t kStripeCount = 1024;

    /// Selects the lock of name (a NUL-terminated text; null is taken as "").
    /// The name is not kept.
    explicit DAMutex(char const* name);

    /// Releases the lock if this object still holds it.
    ~DAMutex();

    /// Blocks until this object holds the lock.
    void Lock();

    /// Releases the lock taken by Lock(). Does nothing if this object does
    /// not hold it.
    void Unlock();

    DAMutex(const DAMutex&) = delete;
    DAMutex& operator=(const DAMutex&) = delete;

private:
    std::size_t m_stripe;
    bool m_locked;
};

#endif  // DAMUTEX_H
