#ifndef DAWATCH_H
#define DAWATCH_H

#include <memory>
#include <string>
#include <vector>

#include "DABasePath.h"

struct DAWatchState;

/// Tells which tables of one database file changed, whoever changed them:
/// this process or another, through DADatabase, a DASession or any other
/// SQLite program, in write-ahead-log or rollback-journal mode.
///
/// What watching adds to the file: a table "ulo_db-watch" (name TEXT
/// PRIMARY KEY COLLATE NOCASE, changes INTEGER NOT NULL, seen INTEGER NOT
/// NULL DEFAULT 0) WITHOUT ROWID, holding per watched table a counter and
/// the value of it a watch last saw, and per watched table T three
/// triggers "ulo_db-watch/T/insert", "ulo_db-watch/T/update",
/// "ulo_db-watch/T/delete" (AFTER INSERT, UPDATE, DELETE ON T) that add 1
/// to T's counter, in the writer's own transaction, when it equals its
/// seen value. A Check that finds a counter above its seen value marks it
/// seen (a short write of its own). So the first commit to a table after a
/// Check writes its counter, and the ones after it, until a watch looks
/// again, only read it: a burst of writes costs one counter write. The
/// first watch of a table creates them under the write lock, whichever
/// watch (of whichever process) comes first; they stay when watches close,
/// so every writer keeps marking, and are removed only by
/// DADatabase::Unwatch (or DASession::Unwatch). A file watched by an
/// earlier build (triggers counting every row, no seen) is brought to this
/// form by the next AddTable; watches of both builds may not share a file.
///
/// Waking: GetFd is an inotify descriptor on the file, its log and its
/// folder, readable when a commit may have changed a watched table; put it
/// in the application's own event loop (poll, epoll, GLib, Ecore) and call
/// Check when it is readable. The watch starts no thread and no timer:
/// while nothing is written the process does not wake. A wake-up can come
/// early (before a commit is visible) or for nothing (a write to another
/// table, a checkpoint): Check then first waits for the commit in progress
/// to end (as a session waits out a lock: within 1-2 ms of its end, the
/// limit line and 5 after 1.5 s; no warning, as this wait is the normal
/// case), then compares the counters with the ones it last saw, so
/// a change is never lost and a change-less wake-up reports nothing.
///
/// A watched table that is dropped (its triggers go with it) is reported
/// as changed by the next Check; when it exists again, a later Check puts
/// its triggers back and reports it again: it stays watched, but rows
/// written between its re-creation and that Check are only known as "the
/// table changed". After an Unwatch of a table (by anyone), the next Check
/// reports it once more and the watch stops watching it.
///
/// When the watched file is deleted or another file is moved over it, the
/// next Check or Wait returns 14 (SQLITE_CANTOPEN) with every watched table
/// in changed and the line "Check FAILED[14]: <path> was deleted or
/// replaced"; the watch is then closed (Open it again to watch the file now
/// at that path).
///
/// A watching process needs write access to the file and its folder, as
/// every writer does: AddTable writes (or confirms) the triggers in a write
/// transaction, and Check waits out a commit by taking the write lock for
/// an instant and marks the counters it saw. That mark wakes every watch of
/// the file once more (this one too); their Checks report nothing. A
/// process that may only read the file (a group member of a 0640 file) gets
/// 8 (SQLITE_READONLY) from AddTable, and so watches nothing.
///
/// One DAWatch is used by one thread at a time; any number of watches, in
/// one or several processes, may watch one file. Not copyable. Every
/// operation on a closed watch returns 21 (SQLITE_MISUSE) with the line
/// "WATCH NOT OPEN"; Close and GetFd excepted.
class DAWatch {
public:
    DAWatch();
    /// Closes the watch.
    virtual ~DAWatch();

    DAWatch(const DAWatch&) = delete;
    DAWatch& operator=(const DAWatch&) = delete;

    /// Watches location's file (created when missing, as DADatabase opens
    /// it); an open watch is closed first. Returns 0, or the failure's code
    /// with the line "DB open failed. Error no(rc): text": 14 when the
    /// directory does not exist (nothing is created), 26 when the file is
    /// not a database; 14 with "Open FAILED[14]: inotify: <reason>" when no
    /// descriptor or watch can be had. A failed Open leaves the watch
    /// closed, nothing held. Throws std::logic_error for an incomplete
    /// location.
    int Open(DABasePath& location);

    /// Starts watching table (a plain name: letters, digits, '_', bytes from
    /// 0x80 up, not starting with a digit), installing its triggers and
    /// counter if missing, in one transaction under the write lock. Every
    /// commit that changes the table after AddTable returns is reported by a
    /// later Check or Wait. Returns 0 with "AddTable SUCCESS[0]" (info), or
    /// SQLite's code and text ("AddTable FAILED[1]: no such table:
    /// main.T" for a missing table); a null or non-plain name returns 21
    /// with "AddTable FAILED[21]: table name is not a plain name". Adding a
    /// watched table again changes nothing.
    int AddTable(char const* table);

    /// The descriptor to wait on for reading; -1 when closed. It stays the
    /// watch's: do not read or close it.
    int GetFd() const;

    /// changed: the watched tables changed since the last Check (or since
    /// their AddTable), sorted, each once; empty when none. Never waits for
    /// anything but a commit in progress (see above). Returns 0, 5 when a
    /// commit holds the file past the wait's bound (changed empty, nothing
    /// lost: the next Check reports it), or another code with the line
    /// "Check FAILED[rc]: text".
    int Check(std::vector<std::string>& changed);

    /// Check, and while it reports nothing, waits up to timeoutMs (without
    /// limit when negative) for the descriptor and checks again. Returns as
    /// Check does; 0 with changed empty when the time ran out.
    int Wait(int timeoutMs, std::vector<std::string>& changed);

    /// Stops watching: closes the descriptor and the connection. What was
    /// added to the file stays. Nothing happens on a closed watch.
    void Close();

private:
    std::unique_ptr<DAWatchState> m_state;
};

#endif  // DAWATCH_H
