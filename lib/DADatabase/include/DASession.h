#ifndef DASESSION_H
#define DASESSION_H

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "DAAddColumnRequest.h"
#include "DABasePath.h"
#include "DABatchRequest.h"
#include "DACreateIndexRequest.h"
#include "DACreateRequest.h"
#include "DACursor.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAInsertRequest.h"
#include "DAJoinRequest.h"
#include "DAQueryRequest.h"
#include "DARow.h"
#include "DASearchIndexRequest.h"
#include "DASearchRequest.h"
#include "DASelectRequest.h"
#include "DATypedCursor.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

struct DASessionState;

/// One database file held open from Open to Close (or destruction), running
/// the requests DADatabase runs: the same statements, results, codes and log
/// lines, the lines under "DASession.cpp" and the operation's name (e.g.
/// "DASession.cpp: Upsert(NN) > Upsert SUCCESS[0]"). The file is opened and
/// its schema read once, not per call.
///
/// Location: a request with no location runs at the session's file; a
/// request naming the session's file runs there; anything else is refused
/// with 21 (SQLITE_MISUSE) and the line "<operation> FAILED[21]: request
/// location <path> is not the session's <path>" (the rule of
/// DABatchRequest::Add). Every operation on a closed session returns 21 with
/// the error line "SESSION NOT OPEN" (Select and Query add "OpenDB Error:
/// 21", as for a failed open).
///
/// Threads: any number of threads may call one session at once. Writes
/// (every operation but the reads below) are serialised on the one writer
/// connection, a whole batch or migration step at a time. With the
/// write-ahead log (the default) reads (Select, JoinSelect, Query,
/// CheckExistTable, GetVersion, GetSpace) run side by side with each other
/// and with the write in progress, each on a reader connection of a small
/// pool opened on demand (up to 4 kept idle): a read never waits for a
/// write and sees the last commit before it began. Without the log every
/// operation runs on the writer connection, one at a time. Open, Close and
/// the setters wait for the operations in progress and hold off new ones.
///
/// Between a session and other connections (per-call visits of DADatabase,
/// other sessions, other processes) a session waits in short steps: an
/// operation that meets another connection's lock logs one warning "SQLITE
/// BUSY[1]" when the wait begins and retries every millisecond, so it goes
/// on within a few milliseconds of the lock's release; after the busy-retry
/// rule's whole pause (1.5 s) it logs "RETRY COUNT is reached LIMIT,
/// SQLITE_BUSY", makes one last attempt and returns its code (5 if still
/// busy), as DADatabase does. No busy handler is set. Its own readers never
/// make a read wait; rarely, a reader that meets the log's index being
/// rewritten holds the write lock for an instant, and a write starting then
/// waits that instant. Per-call visits of a file a session holds with
/// the log see every committed row. Close checkpoints the log into the file
/// and removes it when no other connection has the file open (else the last
/// one to close does); the file stays in WAL mode, which any SQLite program
/// reads.
///
/// Statements: each connection keeps the last 8 statements it ran by their
/// shape, the text with its quoted literals taken out; a text of a known
/// shape has its literals bound as text (which SQLite treats as it treats
/// the literals) instead of being parsed and planned again. Kept statements
/// follow schema changes, the session's own and other connections'; a read
/// whose table another connection dropped fails as a per-call visit does
/// (its code and "FAILED" line, the cursor untouched). Texts that cannot be
/// split so (a quote or ';' in a table or column name, a schema statement)
/// run as written. The kept statements take some kilobytes each.
///
/// One text differs from per-call visits: a statement kept by shape that
/// fails at a step (an "integer overflow" of a SUM, for one) logs SQLite's
/// own text in the parser's "SQLITE STEP ERROR!!! text" line, where a
/// per-call visit logs the generic "SQL logic error"; codes and every other
/// line are the same.
///
/// Transactions: every way out of an operation, an exception included,
/// leaves the writer with no transaction open (a batch or migration step
/// cut short is rolled back) and every kept statement reset.
///
/// Not copyable. No exceptions of its own; Open throws std::logic_error for
/// an incomplete location, std::bad_alloc passes through.
class DASession {
public:
    DASession();
    /// Closes the session.
    virtual ~DASession();

    DASession(const DASession&) = delete;
    DASession& operator=(const DASession&) = delete;

    ///@{
    /// Options, taking effect at the next Open.
    ///
    /// SetWal (default true): the write-ahead log, so that reads and one
    /// write run side by side. False puts the file in the rollback journal
    /// (DELETE) mode.
    ///
    /// SetSyncOnCommit (default true): every commit is synced
    /// (synchronous=FULL): nothing acknowledged is lost on power loss.
    /// False is synchronous=NORMAL: the file stays whole, the last commits
    /// may be lost on power loss (what survives is a prefix of what was
    /// acknowledged).
    ///
    /// SetSizeLimit (default 0: none): the file refuses to grow past bytes
    /// (rounded down to whole pages; never below its size at Open): a write
    /// that needs more returns 13 "database or disk is full" while the disk
    /// still has room, so a Delete can still free space. The log counts
    /// too: once it holds an eighth of the budget (at least 16, at most 1000
    /// pages) it is checkpointed, cut back to that size when it restarts,
    /// and truncated when it has grown past twice that. File and log
    /// together thus stay within the budget plus a margin of a quarter of
    /// it, plus the pages of the one transaction being committed (a large
    /// batch holds all of its pages in the log until its commit). On a disk
    /// that is full already every write fails with 13, a Delete too (its
    /// log needs room), and Close leaves the log for the next opener; the
    /// file keeps every acknowledged row. Set a budget below the free space
    /// where the disk may fill, so that deletes keep working.
    ///
    /// SetCreate (default true): false makes Open of a missing file fail
    /// with 14 and Open's failure line, creating nothing, so that a
    /// misspelled name does not make an empty file.
    void SetWal(bool wal);
    void SetSyncOnCommit(bool sync);
    void SetSizeLimit(std::int64_t bytes);
    void SetCreate(bool create);
    ///@}

    /// The exact permission bits (e.g. 0600, 0660) of a database file the
    /// next Open creates; its -journal, -wal and -shm files get the same
    /// from SQLite. Default (or a negative mode): 0640 less the umask, no
    /// access for other users. A file that exists keeps its mode.
    void SetFileMode(int mode);

    /// Opens location's file (creating a missing file) under busy-retry, with
    /// the options set. An open session is closed first. Returns 0, or the
    /// code of the step that failed with the error line "DB open failed.
    /// Error no(rc): text": 14 when the directory does not exist (nothing is
    /// created), 26 when the file is not a database, 10 on an I/O error
    /// while the file is switched to the journal mode asked for. A switch
    /// SQLite refuses without an error (a file system without shared memory
    /// for the log) fails with 10 and "DB open failed. Error no(10): journal
    /// mode delete, not wal". A failed Open leaves the session closed.
    /// Throws std::logic_error when location is incomplete.
    int Open(DABasePath& location);

    /// Waits for the operations in progress, then closes every connection.
    /// Nothing happens on a closed session.
    void Close();

    /// True between a successful Open and Close.
    bool IsOpen() const;

    ///@{
    /// DADatabase's operations of the same names, run at the session's file
    /// (see above): statements, codes, cursor handling and lines as stated in
    /// DADatabase.h.
    int DropTable(DADropRequest& request);
    int Update(DAUpdateRequest& request);
    int Delete(DADeleteRequest& request);
    int Upsert(DAUpsertRequest& request);
    int CreateTable(DACreateRequest& request);
    int ExecuteBatch(DABatchRequest& batch);
    int Select(DASelectRequest& request, DACursor& cursor);
    int JoinSelect(DAJoinRequest& request, DACursor& cursor);
    int Query(DAQueryRequest& request, DACursor& cursor);
    int Query(DAQueryRequest& request, DATypedCursor& cursor);
    ///@}

    /// DADatabase::QueryEach on the session's file (a read: a reader
    /// connection with the log, the writer without it). An exception from
    /// visit passes through after the statement is reset and the connection
    /// returned. From visit, on the reading thread, the session's reads
    /// run; with the log its writes run too (the read keeps seeing the rows
    /// as they were when it began). Without the log the read holds the one
    /// connection, and any operation from visit is refused with 21 and the
    /// error line "SESSION BUSY ON THIS THREAD". Open, Close and the setters
    /// must not be called from visit: they wait for the read to end.
    int QueryEach(DAQueryRequest& request, std::function<bool(DARow const&)> const& visit);

    /// exists: whether a table named exactly tableName exists in the
    /// session's file. A null tableName throws std::logic_error.
    int CheckExistTable(char const* tableName, bool& exists);

    ///@{
    /// DADatabase's schema operations of the same names, at the session's
    /// file: codes and lines as stated in DADatabase.h. GetVersion, GetSpace
    /// and Compact take no location (the session's file); Migrate's step
    /// follows the location rule above.
    int CreateIndex(DACreateIndexRequest& request);
    int AddColumn(DAAddColumnRequest& request);
    int GetVersion(int& version);
    int Migrate(DABatchRequest& step, int version);
    int Migrate(DABatchRequest& step, int version, bool& applied);
    int GetSpace(std::int64_t& fileBytes, std::int64_t& freeBytes);
    int Compact();
    ///@}

    ///@{
    /// DADatabase's writes that report what they did, at the session's file:
    /// Insert gives the new row's id, Update and Delete the rows changed;
    /// codes, lines and when the outputs are set as stated in DADatabase.h.
    int Insert(DAInsertRequest& request, std::int64_t& rowId);
    int Update(DAUpdateRequest& request, int& changes);
    int Delete(DADeleteRequest& request, int& changes);
    ///@}

    ///@{
    /// DADatabase's search operations, at the session's file: codes and
    /// lines as stated in DADatabase.h. Search is a read.
    int CreateSearchIndex(DASearchIndexRequest& request);
    int DropSearchIndex(char const* name);
    int Search(DASearchRequest& request, DACursor& cursor);
    int Search(DASearchRequest& request, DATypedCursor& cursor);
    ///@}

    /// DADatabase::Unwatch at the session's file: codes and lines as stated
    /// there.
    int Unwatch(char const* table);

    ///@{
    /// DADatabase's Backup, Restore, CheckIntegrity and RebuildIndexes at
    /// the session's file: codes, lines and files as stated in DADatabase.h.
    /// Backup and CheckIntegrity read on a reader connection (with the log,
    /// beside the session's writes, which never wait for them); Restore and
    /// RebuildIndexes hold the writer. After a Restore every operation of
    /// the session, reads on any of its connections included, sees the new
    /// content and schema.
    int Backup(DABasePath& to);
    int Restore(DABasePath& from);
    int CheckIntegrity(bool full, std::vector<std::string>& problems);
    int RebuildIndexes();
    ///@}

private:
    std::unique_ptr<DASessionState> m_state;
};

#endif  // DASESSION_H
