#ifndef DAOPERATION_H
#define DAOPERATION_H

// The operations, written once for per-call visits (DADatabase) and held
// sessions (DASession): generate the statement, run it under busy-retry,
// log, parse. Only where the connection comes from differs, and that is a
// DAConnectionSource.

#include <cstdint>
#include <functional>
#include <memory>
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
#include "DASqlStatement.h"
#include "DASqliteHandles.h"
#include "DATypedCursor.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

class DAConnectionSource;
class DAStatementCache;
class DASqlGenerator;

// Ends a lease: a per-call visit closes the connection, a session takes it
// back (and lets the next writer in).
struct DALeaseEnd {
    DAConnectionSource* source = nullptr;
    void operator()(sqlite3* db) const noexcept;
};
using DALease = std::unique_ptr<sqlite3, DALeaseEnd>;

// Ends the use of a prepared statement: finalized, or kept by a session
// for the next statement of its shape.
struct DAStatementEnd {
    DAConnectionSource* source = nullptr;
    void operator()(sqlite3_stmt* stmt) const noexcept;
};
using DAStatementLease = std::unique_ptr<sqlite3_stmt, DAStatementEnd>;

// What an operation will do with its connection: a session serialises
// writers and lets readers run beside them.
enum class DAAccess { Read, Write };

// Where the operations' connections come from, and the file and line
// their lines carry: those of the public operation the source serves, so
// that a line points at the function it names.
class DAConnectionSource {
public:
    DAConnectionSource(const char* file, int line) : m_file(file), m_line(line) {}
    virtual ~DAConnectionSource() = default;

    DAConnectionSource(const DAConnectionSource&) = delete;
    DAConnectionSource& operator=(const DAConnectionSource&) = delete;

    // The source file name and line written in the lines of this source's
    // operation.
    const char* File() const { return m_file; }
    int Line() const { return m_line; }

    // Lends a connection to location's file for one operation of func:
    // returns 0 with lease set, or the failure's code with lease empty and
    // the failure's lines written. May throw what GetPath throws.
    virtual int Acquire(DABasePath& location, DAAccess access, const char* func, DALease& lease) = 0;

    // Takes back a connection Acquire lent.
    virtual void Release(sqlite3* db) noexcept = 0;

    // The busy-retry step, logged under this source's file.
    virtual bool IsRetryLimit(int& count) = 0;

    // Prepares sql on db (a connection this source lent) under busy-retry:
    // 0 with stmt set, else the code with stmt empty. Here the text itself
    // with sqlite3_prepare; a session may hand out a kept statement of the
    // same shape with the text's literals bound.
    virtual int Prepare(sqlite3* db, const char* sql, DAStatementLease& stmt);

    // Runs sql on db to its end under busy-retry, as sqlite3_exec does:
    // returns its code, and on failure error holds SQLite's text (or null
    // when memory ran out). Here a text with a blob literal runs with the
    // blob bound (SQLite would read it back from its hex digits), as one
    // statement of its shape with its literals bound; any other text
    // with sqlite3_exec.
    virtual int Execute(sqlite3* db, const char* sql, DAErrorText& error);

    // Whether statements on db may come as shapes with their values
    // (PrepareShaped, ExecuteShaped): a session's held connections; here,
    // no (a single statement runs as its text).
    virtual bool TakesShapes(sqlite3* /*db*/) { return false; }

    // Prepare and Execute of a statement given as its shape and values
    // (DASqlStatement.h): the statement kept for the shape (KeptStatements)
    // or one prepared now, with the values bound. A shape SQLite refuses
    // (a literal where no parameter may stand) runs as its text instead,
    // and fails, if it does, as it would anyway.
    int PrepareShaped(sqlite3* db, const char* shape, DASqlParamsView values, DAStatementLease& stmt);
    int ExecuteShaped(sqlite3* db, const char* shape, DASqlParamsView values, DAErrorText& error);

    // Ends a statement Prepare handed out: kept for its shape when it came
    // from KeptStatements, else finalized.    // Ends a statement Prepare handed out: kept for its shape when it came
    // from KeptStatements, else finalized.
    void Finish(sqlite3_stmt* stmt) noexcept;

    // Whether a statement Prepare hands out may have been prepared against
    // a schema that another connection has changed since: not here, where
    // every connection is new; on a held connection, yes.
    virtual bool MayBeStale() const { return false; }

protected:
    // Where the statements of db are kept by shape between uses, if
    // anywhere: a session keeps them with its connections, a per-call
    // visit for the operation's connection while it lasts.
    virtual DAStatementCache* KeptStatements(sqlite3* /*db*/) { return nullptr; }

    // Execute's end for a statement of sql's shape with its literals bound:
    // steps stmt to its end under busy-retry when rc is 0 (else stmt is
    // not used), and returns as Execute, SQLite's text in error.
    int StepToEnd(sqlite3* db, sqlite3_stmt* stmt, int rc, DAErrorText& error);

private:
    // PrepareShape's result when the shape is to run as its text.
    static constexpr int kAsWritten = -1;

    // The statement of shape on db, kept or prepared now (under
    // busy-retry), with values bound: 0 with stmt set, or the failure's
    // code; kAsWritten when SQLite does not take the shape.
    int PrepareShape(sqlite3* db, const char* shape, DASqlParamsView values, DAStatementLease& stmt);

    const char* m_file;
    int m_line;
    sqlite3_stmt* m_kept = nullptr;  // the kept statement handed out, to be put back
};

// Rolls back whatever transaction db still has open when it goes out of
// scope: a failure, a stop, or an exception (std::bad_alloc) passing
// through. A held connection must never carry a transaction into its next
// operation, whose acknowledged write would then be lost with it.
class DARollbackGuard {
public:
    static constexpr int kRollbackAttempts = 3;

    explicit DARollbackGuard(sqlite3* db) : m_db(db) {}
    ~DARollbackGuard()
    {
        // Some failures end the transaction inside SQLite already. The
        // ROLLBACK itself needs a little memory to be prepared: it is tried
        // again when it could not get it.
        for (int attempt = 0; attempt < kRollbackAttempts && sqlite3_get_autocommit(m_db) == 0; ++attempt) {
            sqlite3_exec(m_db, "ROLLBACK", nullptr, nullptr, nullptr);
        }
    }
    DARollbackGuard(const DARollbackGuard&) = delete;
    DARollbackGuard& operator=(const DARollbackGuard&) = delete;

private:
    sqlite3* m_db;
};

// Every operation, written once over any connection source: DADatabase
// and DASession forward to these, each with its own source. Contracts,
// codes and lines are those stated in DADatabase.h; the lines carry the
// source's file name and the operation's name.
struct DAOperations {
    static int DropTable(DAConnectionSource& source, DADropRequest& request);
    static int Update(DAConnectionSource& source, DAUpdateRequest& request);
    static int Delete(DAConnectionSource& source, DADeleteRequest& request);
    static int Upsert(DAConnectionSource& source, DAUpsertRequest& request);
    static int CreateTable(DAConnectionSource& source, DACreateRequest& request);
    static int ExecuteBatch(DAConnectionSource& source, DABatchRequest& batch);
    static int Select(DAConnectionSource& source, DASelectRequest& request, DACursor& cursor);
    static int JoinSelect(DAConnectionSource& source, DAJoinRequest& request, DACursor& cursor);
    static int Query(DAConnectionSource& source, DAQueryRequest& request, DACursor& cursor);
    static int Query(DAConnectionSource& source, DAQueryRequest& request, DATypedCursor& cursor);
    static int QueryEach(DAConnectionSource& source, DAQueryRequest& request,
                         const std::function<bool(DARow const&)>& visit);
    static int CheckExistTable(DAConnectionSource& source, DABasePath& location, char const* tableName, bool& exists);
    static int CreateIndex(DAConnectionSource& source, DACreateIndexRequest& request);
    static int AddColumn(DAConnectionSource& source, DAAddColumnRequest& request);
    static int GetVersion(DAConnectionSource& source, DABasePath& location, int& version);
    static int Migrate(DAConnectionSource& source, DABatchRequest& step, int version, bool& applied);
    static int GetSpace(DAConnectionSource& source, DABasePath& location, std::int64_t& fileBytes,
                        std::int64_t& freeBytes);
    static int Compact(DAConnectionSource& source, DABasePath& location);
    static int Insert(DAConnectionSource& source, DAInsertRequest& request, std::int64_t& rowId);
    static int Update(DAConnectionSource& source, DAUpdateRequest& request, int& changes);
    static int Delete(DAConnectionSource& source, DADeleteRequest& request, int& changes);
    static int CreateSearchIndex(DAConnectionSource& source, DASearchIndexRequest& request);
    static int DropSearchIndex(DAConnectionSource& source, DABasePath& location, char const* name);
    static int Search(DAConnectionSource& source, DASearchRequest& request, DACursor& cursor);
    static int Search(DAConnectionSource& source, DASearchRequest& request, DATypedCursor& cursor);

    // A query whose rows fill a typed cursor, in Query's frame, under func
    // and word: the typed Query and Search.
    template <typename Request>
    static int TypedQuery(DAConnectionSource& source, Request& request, DATypedCursor& cursor, const char* func,
                          const char* word);

    // Installs, under the write lock, what watching table needs in the file
    // (DAWatchSchema.h; kept if there): 0 with changes and schema the
    // table's counter and the file's schema version at that commit, else
    // the code. Lines "AddTable SUCCESS[0]" / "AddTable FAILED[rc]: text";
    // a name that is not plain is refused with 21 and one line.
    static int Watch(DAConnectionSource& source, DABasePath& location, char const* table, std::int64_t& changes,
                     std::int64_t& schema);
    // Removes table's triggers and counter, and the counter table with the
    // last counter: contract in DADatabase.h (Unwatch).
    static int Unwatch(DAConnectionSource& source, DABasePath& location, char const* table);
    // Keeping files safe (DASafety.cpp).
    static int Backup(DAConnectionSource& source, DABasePath& from, DABasePath& to);
    static int Restore(DAConnectionSource& source, DABasePath& from, DABasePath& to);
    static int CheckIntegrity(DAConnectionSource& source, DABasePath& location, bool full,
                              std::vector<std::string>& problems);
    static int RebuildIndexes(DAConnectionSource& source, DABasePath& location);
    static int Salvage(DAConnectionSource& source, DABasePath& from, DABasePath& to, DASalvageReport& report);
};

#endif  // DAOPERATION_H
