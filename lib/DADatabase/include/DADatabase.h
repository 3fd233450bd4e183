#ifndef DADATABASE_H
#define DADATABASE_H

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <sqlite3.h>

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
#include "DASalvageReport.h"
#include "DASearchIndexRequest.h"
#include "DASearchRequest.h"
#include "DASelectRequest.h"
#include "DATypedCursor.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

/// Runs requests against SQLite files. Every operation is one complete visit
/// to the file: open a connection (creating a missing file), build the
/// statement, run it, log, close, and return SQLite's result code (0 on
/// success, else the code of the step that failed). Nothing is kept between
/// calls; any number of threads may call at once, each call with its own
/// connection. Every connection and statement is released on every way out,
/// exceptions included.
///
/// Busy-retry: each open, exec, prepare and step that returns SQLITE_BUSY is
/// repeated after a warning "SQLITE BUSY[n]" (n = 1..15) and a 100 ms pause;
/// then the error line "RETRY COUNT is reached LIMIT, SQLITE_BUSY" and one
/// last attempt whose result stands. No busy handler is set.
///
/// Requests whose location lacks a directory or file name make the operation
/// throw std::logic_error before anything is opened.
class DADatabase {
public:
    DADatabase() = default;
    ~DADatabase() = default;

    /// Opens dir/file under busy-retry. On 0, db is open and the caller
    /// closes it with sqlite3_close. Otherwise logs "DB open failed. Error
    /// no(rc): text", leaves db null and returns the code (14 when the
    /// directory does not exist; no file is created then). A missing file
    /// is created with mode 0640 less the umask: no access for other users
    /// (its -journal, -wal and -shm files follow, SQLite giving them the
    /// database file's mode); an existing file keeps its mode.
    int OpenDB(sqlite3*& db, std::string dir, std::string file);

    /// The busy-retry step: see DADatabaseParser::IsRetryLimit.
    bool IsRetryLimit(int& count);

    ///@{
    /// Write operations. Each logs "<word> SUCCESS[0]" (info) or
    /// "<word> FAILED[rc]: SQLite's text" (error), with the words
    /// "DropTable", "update", "delete", "Upsert", "createTable". When the
    /// open fails only OpenDB's line is written.
    int DropTable(DADropRequest& request);
    int Update(DAUpdateRequest& request);
    int Delete(DADeleteRequest& request);
    int Upsert(DAUpsertRequest& request);
    int CreateTable(DACreateRequest& request);
    ///@}

    /// Runs every statement of batch, in Add order, in one transaction on
    /// one connection at the batch's location: all of them land or none.
    /// An empty batch returns 0 at once (nothing opened, nothing logged).
    /// Otherwise opens with OpenDB (its lines and code on failure), runs
    /// "BEGIN IMMEDIATE", each statement and "COMMIT", each under the
    /// busy-retry rule. On success logs "ExecuteBatch SUCCESS[0]: n
    /// statements" (info), sets batch.GetChanges() and returns 0. On the
    /// first failure rolls back, logs "ExecuteBatch FAILED[rc] at i/n:
    /// SQLite's text" (error; i is 0 for the begin, 1..n for the
    /// statements, n + 1 for the commit) and returns rc; the file then
    /// holds exactly what it held before. The connection is closed on
    /// every way out. An incomplete batch location throws std::logic_error
    /// before anything is opened. The batch is only read (but for its
    /// change count) and may be executed again.
    int ExecuteBatch(DABatchRequest& batch);

    ///@{
    /// Queries. Return the open's code if it failed, else the preparation's
    /// code; step failures are logged by the parser but not returned. When
    /// the open or the preparation fails, cursor / exists are left as they
    /// were. A failed open writes only OpenDB's line (for Select followed by
    /// "OpenDB Error: rc", info); a failed preparation writes "SELECT
    /// FAILED[rc]: text", "JoinSelect FAILED[rc]: text" or "CheckExistTable
    /// FAILED[rc]: text".
    int Select(DASelectRequest& request, DACursor& cursor);
    int JoinSelect(DAJoinRequest& request, DACursor& cursor);
    ///@}

    /// Select's frame for a sorted, paged query (DASqlGenerator::GetQuerySql):
    /// the same codes, cursor handling and lines, under the function name
    /// "Query": "OpenDB Error: rc" (info) when the open fails, "QUERY
    /// FAILED[rc]: text" when the preparation fails. A page past the last
    /// row returns 0 with an emptied cursor (GetCount() -1). Unlike Select,
    /// a failed step is returned: 11 for a damaged page, 26, 5 once the
    /// busy limit is reached while stepping, after the parser's line and
    /// "QUERY FAILED[rc]: SQLite's text"; the rows read before it stay in
    /// the cursor.
    int Query(DAQueryRequest& request, DACursor& cursor);

    /// Query into a typed cursor: the same statement, codes and lines (under
    /// "Query"), each value kept with its stored type and bytes (DARow.h).
    /// A failure before the first step (open, preparation) leaves cursor as
    /// it was; otherwise it holds the rows read, positioned before the
    /// first (-1), with the step failure's code returned after the rows read
    /// before it.
    int Query(DAQueryRequest& request, DATypedCursor& cursor);

    /// Query's statement, codes and lines (under "QueryEach"), handing the
    /// rows to visit one at a time: memory does not grow with the rows. The
    /// row is valid during the call only. visit returning false ends the
    /// read with 0; a step failure returns its code after the rows before
    /// it were visited. An exception from visit passes through, after the
    /// statement is finalized and the file closed. The file is read
    /// (locked against writers, unless it is in WAL mode) until the read
    /// ends: a write to it from visit meets that lock, as another
    /// connection would (busy-retry, then 5).
    int QueryEach(DAQueryRequest& request, std::function<bool(DARow const&)> const& visit);

    /// exists: whether a table named exactly tableName exists. A null
    /// tableName throws std::logic_error (the connection is closed first).
    int CheckExistTable(DABasePath& location, char const* tableName, bool& exists);

    ///@{
    /// Schema writes, in the frame of the writes above: CreateIndex
    /// (DASqlGenerator::GetCreateIndexSql; an index of that name already
    /// there is left as it is) and AddColumn (GetAddColumnSql; a column that
    /// exists fails with 1, "duplicate column name: c"). Lines "CreateIndex
    /// SUCCESS[0]" / "CreateIndex FAILED[rc]: text", "AddColumn SUCCESS[0]"
    /// / "AddColumn FAILED[rc]: text".
    int CreateIndex(DACreateIndexRequest& request);
    int AddColumn(DAAddColumnRequest& request);
    ///@}

    /// version: the schema version of location's file (SQLite's
    /// user_version; 0 for a new file, which is created). Returns the
    /// open's code (with OpenDB's lines), else the read's, logging
    /// "GetVersion FAILED[rc]: text"; version is untouched unless 0 is
    /// returned. Logs nothing on success.
    int GetVersion(DABasePath& location, int& version);

    /// Brings the file at step's location from version - 1 to version by
    /// running step's statements, once per file however many processes and
    /// threads migrate it at once. On one connection: reads the file's
    /// version V without taking the write lock; when V is version - 1 it
    /// takes the write lock ("BEGIN IMMEDIATE", busy-retry as ExecuteBatch)
    /// and reads V again, and only that reading decides:
    /// - V = version - 1: runs the statements in Add order, sets the
    ///   version, commits; logs "Migrate SUCCESS[0]: version N" (info),
    ///   returns 0. An empty step only sets the version.
    /// - V >= version: changes nothing, logs "Migrate SKIPPED: file at
    ///   version V" (info), returns 0.
    /// - V < version - 1: changes nothing, logs "Migrate FAILED[21]: file at
    ///   version V, step for version N" (error), returns 21.
    /// A failing statement (or commit) rolls everything back, the version
    /// stays V, and it logs "Migrate FAILED[rc] at i/n: text" as
    /// ExecuteBatch does and returns rc; a process killed midway leaves the
    /// file the same way. A version of 0 or less returns 21 with the line
    /// "Migrate FAILED[21]: step for version N, versions start at 1",
    /// nothing opened. An app calls Migrate once per step, in version
    /// order, at every start.
    int Migrate(DABatchRequest& step, int version);

    /// Migrate, telling what it did: applied is true only when this call
    /// ran the step (its "Migrate SUCCESS" line), false otherwise, also
    /// when another process ran it first.
    int Migrate(DABatchRequest& step, int version, bool& applied);

    /// The size of location's file and the part of it its free pages take,
    /// in bytes (page count and free-list count times the page size).
    /// Codes and lines as GetVersion ("GetSpace FAILED[rc]: text"); both
    /// outputs untouched unless 0 is returned.
    int GetSpace(DABasePath& location, std::int64_t& fileBytes, std::int64_t& freeBytes);

    /// Rewrites location's file without its free pages ("VACUUM", under the
    /// busy-retry rule), so it shrinks by about GetSpace's free bytes; every
    /// row stays. Needs free space beside the file of up to twice its size
    /// (a temporary copy, then the rollback journal) and every other
    /// connection to be idle. When the space is missing it returns 13
    /// (SQLITE_FULL) and the file stays as it was. Lines "Compact
    /// SUCCESS[0]" / "Compact FAILED[rc]: text".
    int Compact(DABasePath& location);

    /// Inserts one row (DASqlGenerator::GetInsertSql) in the frame of the
    /// writes, with the lines "Insert SUCCESS[0]" and "Insert FAILED[rc]:
    /// text". On 0, rowId is the new row's id, or -1 when the row was
    /// ignored (SetIgnoreExisting); on failure it is untouched. A key
    /// clash without ignoring fails with 19 and SQLite's text.
    int Insert(DAInsertRequest& request, std::int64_t& rowId);

    ///@{
    /// The one-argument Update and Delete, codes and lines included; on 0,
    /// changes is the number of rows the statement changed, on failure it
    /// is untouched.
    int Update(DAUpdateRequest& request, int& changes);
    int Delete(DADeleteRequest& request, int& changes);
    ///@}

    /// Creates the search index request describes (DASearchIndexRequest
    /// lists what it adds; DASqlGenerator::GetCreateSearchIndexSql gives
    /// the statements) and indexes the rows already there, all in one
    /// transaction ("BEGIN IMMEDIATE" ... "COMMIT", busy-retry as
    /// ExecuteBatch). From then on the triggers keep it in step with every
    /// insert, update and delete of the table by any connection, an INSERT
    /// OR REPLACE included. An index of that name already there is left as
    /// it is. A missing table or column fails with SQLite's code and text,
    /// and the file keeps nothing of the attempt. Lines "CreateSearchIndex
    /// SUCCESS[0]" / "CreateSearchIndex FAILED[rc]: text"; a failed open
    /// writes only OpenDB's line.
    int CreateSearchIndex(DASearchIndexRequest& request);

    /// Removes everything CreateSearchIndex added for the index name, in
    /// one transaction; also when its table is gone, and 0 when there is
    /// nothing to remove. Another index's own table is never removed (1,
    /// see DASearchIndexRequest). Lines "DropSearchIndex SUCCESS[0]" /
    /// "DropSearchIndex FAILED[rc]: text". A name that is not plain (see
    /// DASearchIndexRequest), null included, returns 21 with the line
    /// "DropSearchIndex FAILED[21]: invalid name", nothing opened.
    int DropSearchIndex(DABasePath& location, char const* name);

    /// The rows of request's table that hold every word of its text
    /// (DASearchRequest, DASqlGenerator::GetSearchSql), in Query's frame:
    /// the same codes, cursor handling and lines, under the function name
    /// "Search" and the word "SEARCH" ("SEARCH FAILED[rc]: text"). An empty
    /// text returns 0 with an emptied cursor. A missing index or table
    /// fails at the preparation with 1 and SQLite's text ("no such table:
    /// ulo_search_i").
    int Search(DASearchRequest& request, DACursor& cursor);
    /// Search into a typed cursor: the statement, codes and lines of the
    /// search, the cursor handled as Query's typed overload handles it.
    int Search(DASearchRequest& request, DATypedCursor& cursor);

    /// Removes from location's file what watching table left there (see
    /// DAWatch.h): its three triggers and its counter, and the counter table
    /// with the last counter, in one transaction under the write lock (the
    /// busy-retry rule). A table never watched leaves the file unchanged.
    /// Every DAWatch of that table, in any process, reports it once more at
    /// its next Check and then no longer watches it. Returns 0 with the line
    /// "Unwatch SUCCESS[0]", or the code with "Unwatch FAILED[rc]: text"; a
    /// null or non-plain table name returns 21 with the one line "Unwatch
    /// FAILED[21]: table name is not a plain name", nothing opened.
    int Unwatch(DABasePath& location, char const* table);
    /// Copies from's file into a new file at to: one committed state of the
    /// whole file, taken with SQLite's online backup while other connections
    /// go on writing. The copy reads one snapshot from start to end, in
    /// steps of 256 pages (about 1 ms each): in write-ahead-log mode no
    /// writer ever waits for it; in rollback mode a writer's commit waits
    /// while it reads, and gives up with 5 after the busy-retry rule's time.
    /// Written to "<to>.XXXXXX" beside to (created with from's mode less
    /// every permission for others), synced, passed through "PRAGMA
    /// quick_check", renamed over to, and the directory synced: after a
    /// power cut to is the previous file or the whole copy. Logs "Backup
    /// SUCCESS[0]: <pages> pages" (info) or "Backup FAILED[rc]: text"
    /// (error). Fails, leaving nothing behind and to as it was, with 13 when
    /// the disk (or the file-size limit) has no room for the copy, 14 when
    /// to's directory is missing, 21 when to is from's file itself, 5 when
    /// to has a "-wal" or "-journal" beside it (it is in use, or was left
    /// mid-transaction: its next opener would apply that to the copy). The open
    /// of from is OpenDB's (its lines and code; a missing from is created
    /// empty, as by every visit).
    int Backup(DABasePath& from, DABasePath& to);

    /// Replaces the content of to's file by that of the database file at
    /// from, through SQLite's locking (online backup into the live file, one
    /// transaction): every other connection, of this process or another,
    /// sees the old content or the new, never a mix; sessions holding the
    /// file go on with the new content. from is opened read-only and must be
    /// a whole, intact database (its quick check finds nothing): otherwise
    /// its code is returned (14 missing, 26 not a database or empty, 11
    /// damaged or truncated) and to is untouched; 21 when from is to's file
    /// itself; 8 when to is in WAL mode with another page size than from.
    /// Writers of to meet the busy-retry rule. Lines "Restore SUCCESS[0]:
    /// <pages> pages" / "Restore FAILED[rc]: text"; OpenDB's for to.
    int Restore(DABasePath& from, DABasePath& to);

    /// Checks location's file: "PRAGMA quick_check" (full false: page
    /// structure, records, NOT NULL) or "PRAGMA integrity_check" (also that
    /// every index matches its table). Returns 0 with problems empty for a
    /// sound file, or 0 with SQLite's messages (at most 100, one per line of
    /// its report) for a damaged one, also when the check itself stops with
    /// 11 after them; logs "CheckIntegrity SUCCESS[0]: <n> problems" (info
    /// for none, error otherwise). When the check cannot run, returns the
    /// code with problems holding one message: 14 (OpenDB's line), 26 not a
    /// database, 11 a file SQLite cannot read as one (a damaged first
    /// page), with "CheckIntegrity FAILED[rc]: text".
    int CheckIntegrity(DABasePath& location, bool full, std::vector<std::string>& problems);

    /// Rebuilds every index of location's file from its table ("REINDEX").
    /// Where an index has a damaged page (REINDEX, DROP INDEX and VACUUM
    /// all fail there with 11), every index with a CREATE statement is
    /// taken out of the schema and created anew from its table in one
    /// transaction (PRAGMA writable_schema, never left on), then "VACUUM"
    /// frees the pages the old ones held: every query works again and the
    /// file passes both checks. Needs the table pages intact; indexes of
    /// UNIQUE and PRIMARY KEY constraints are rebuilt by REINDEX only.
    /// VACUUM needs room of up to twice the file (13 otherwise, the indexes
    /// then already rebuilt). Lines "RebuildIndexes SUCCESS[0]: <n>
    /// recreated" (0 when REINDEX sufficed) / "RebuildIndexes FAILED[rc]:
    /// text".
    int RebuildIndexes(DABasePath& location);

    /// Copies what can still be read of a damaged file at from into a new
    /// file at to, written as Backup writes (beside to, with from's mode
    /// less others' permissions, synced, checked, renamed; nothing left on a
    /// failure): from's schema (tables, then their rows, then indexes,
    /// triggers and views; user_version and page size) and, table by table
    /// in rowid order, every row that reads; past a damaged page the copy
    /// seeks the next rowid that reads again, so a damaged page costs the
    /// rows it holds. report (replaced on success, untouched on failure)
    /// lists each table with its rows copied and lost: 0 when the table
    /// read whole, the shortfall against count(*) where that still reads
    /// (through an index), else -1. A WITHOUT ROWID table is copied up to
    /// its first damaged page; virtual tables are not recreated. from is
    /// opened read-only and never written (14 when missing). A damaged
    /// first page takes the schema with it: Salvage then returns 26 or 11
    /// and creates nothing. 21 when to is from's file. Lines "Salvage
    /// SUCCESS[0]: <rows> rows, <lost> lost" (-1: not known for every
    /// table) / "Salvage FAILED[rc]: text".
    int Salvage(DABasePath& from, DABasePath& to, DASalvageReport& report);
};

#endif  // DADATABASE_H
