#ifndef DABUSYRETRY_H
#define DABUSYRETRY_H

#include <chrono>

#include <sqlite3.h>

// The step of the busy-retry rule that DADatabase::IsRetryLimit and
// DADatabaseParser::IsRetryLimit both are; file is the caller's, for the
// log lines. Adds 1 to count; up to 15 logs "SQLITE BUSY[count]" (warning),
// pauses 100 ms and returns false; beyond, logs the limit line (error) and
// returns true at once.
bool DAIsRetryLimit(int& count, const char* file, int line);

// The busy step of connections held open (sessions, watches): a wait for
// another connection's lock retried in short steps, so that it ends within
// a couple of milliseconds of the lock's release. At the first step of a
// loop (count 0) it logs "SQLITE BUSY[1]" (warning), once per wait; it then
// sleeps 1 ms per step and returns false until the rule's whole pause (15
// times 100 ms) has passed since the wait began, and then logs the limit
// line (error) and returns true, as DAIsRetryLimit does after its 15th
// pause. One object serves the loops of one thread, one after another.
// Quiet, it leaves out the warning: for a wait that is an expected part of
// the work (a watch waiting for the commit that woke it).
class DAShortBusyWait {
public:
    bool IsRetryLimit(int& count, const char* file, int line);
    void SetQuiet(bool quiet) { m_quiet = quiet; }

private:
    std::chrono::steady_clock::time_point m_since;
    bool m_quiet = false;
};

// The state of one busy-retry loop: its counter and its stop flag. Owner is
// the class whose IsRetryLimit logs and pauses (DADatabase or
// DADatabaseParser).
template <typename Owner>
class DABusyRetry {
public:
    explicit DABusyRetry(Owner& owner) : m_owner(owner) {}

    // True when a call that returned rc is to be made again: rc is
    // SQLITE_BUSY and the limit has not been reported. Advances the counter
    // (with its warning and pause, or the limit line) when it is.
    bool ShouldRetry(int rc)
    {
        if (rc != SQLITE_BUSY || m_stop) {
            return false;
        }
        m_stop = m_owner.IsRetryLimit(m_count);
        return true;
    }

    // Ends the loop after one more attempt (used for step errors).
    void Stop() { m_stop = true; }
    bool Stopped() const { return m_stop; }

private:
    Owner& m_owner;
    int m_count = 0;
    bool m_stop = false;
};

// Makes call() until its result is not SQLITE_BUSY, or until one attempt
// after the limit was reported; returns the last result.
template <typename Owner, typename Call>
int DARetryWhileBusy(Owner& owner, Call&& call)
{
    DABusyRetry<Owner> retry(owner);
    int rc = call();
    while (retry.ShouldRetry(rc)) {
        rc = call();
    }
    return rc;
}

#endif  // DABUSYRETRY_H
