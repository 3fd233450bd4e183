#ifndef DADATABASE_H
#define DADATABASE_H

#include <string>

#include <sqlite3.h>

#include "DABasePath.h"
#include "DABatchRequest.h"
#include "DACreateRequest.h"
#include "DACursor.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAJoinRequest.h"
#include "DAQueryRequest.h"
#include "DASelectRequest.h"
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
    /// directory does not exist; no file is created then).
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
    /// were and the failure line is "SELECT FAILED[rc]: text",
    /// "JoinSelect FAILED[rc]: text" or "CheckExistTable FAILED[rc]: text".
    /// Select also logs "OpenDB Error: rc" (info) when the open fails.
    int Select(DASelectRequest& request, DACursor& cursor);
    int JoinSelect(DAJoinRequest& request, DACursor& cursor);
    ///@}

    /// Select's frame for a sorted, paged query (DASqlGenerator::GetQuerySql):
    /// the same codes, cursor handling and lines, under the function name
    /// "Query": "OpenDB Error: rc" (info) when the open fails, "QUERY
    /// FAILED[rc]: text" when the preparation fails. A page past the last
    /// row returns 0 with an emptied cursor (GetCount() -1).
    int Query(DAQueryRequest& request, DACursor& cursor);

    /// exists: whether a table named exactly tableName exists. A null
    /// tableName throws std::logic_error (the connection is closed first).
    int CheckExistTable(DABasePath& location, char const* tableName, bool& exists);
};

#endif  // DADATABASE_H
