#include "DAOperation.h"

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <string>

#include "DABusyRetry.h"
#include "DADatabaseParser.h"
#include "DALog.h"
#include "DAParseRows.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"

void DALeaseEnd::operator()(sqlite3* db) const noexcept
{
    source->Release(db);
}

void DAStatementEnd::operator()(sqlite3_stmt* stmt) const noexcept
{
    source->Finish(stmt);
}

namespace {

// sqlite3_exec of sql under busy-retry (rows, if any, to callback with
// user); error holds the text of the last attempt.
int ExecWhileBusy(DAConnectionSource& source, sqlite3* db, const char* sql, DAErrorText& error,
                  sqlite3_callback callback = nullptr, void* user = nullptr)
{
    return DARetryWhileBusy(source, [&] {
        error.reset();  // the text of a busy attempt is released before the next
        char* text = nullptr;
        const int result = sqlite3_exec(db, sql, callback, user, &text);
        error.reset(text);
        return result;
    });
}

// The text of a failed exec: sqlite3_exec gives none when it runs out of
// memory.
const char* FailureText(const DAErrorText& error, int rc)
{
    return error != nullptr ? error.get() : sqlite3_errstr(rc);
}

struct NoFollowUp {
    void operator()(sqlite3* /*db*/) const {}
};

// The write frame: acquire for writing, generate with the request's
// generator function, exec under busy-retry; on success call done(db) while
// the connection is still held (changes, row ids) and log "<word>
// SUCCESS[0]", else "<word> FAILED[rc]: text", both under func.
template <typename Request, typename Done = NoFollowUp>
int RunWrite(DAConnectionSource& source, Request& request, void (DASqlGenerator::*generate)(Request&, std::string&),
             const char* func, const char* word, Done done = Done())
{
    DALease db;
    int rc = source.Acquire(request, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string sql;
    (DASqlGenerator().*generate)(request, sql);

    DAErrorText error;
    rc = source.Execute(db.get(), sql.c_str(), error);
    if (rc == SQLITE_OK) {
        done(db.get());
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "%s SUCCESS[%d]", word, rc);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", word, rc,
                     FailureText(error, rc));
    }
    return rc;
}

// The query frame: acquire for reading, generate, prepare under busy-retry,
// and on success return parse(parser, db, stmt, mayBeStale); on failure log
// "<word> FAILED[rc]: text" under func and return the preparation's code.
// A statement the source kept from before a schema change it cannot follow
// (parse gave kDAStaleStatement) is prepared again from the text, so that
// the operation ends as on a fresh connection. When no connection can be
// had, logs "OpenDB Error: rc" (info) if logOpenFailure and returns that
// code.
template <typename Generate, typename Parse>
int RunQuery(DAConnectionSource& source, DABasePath& location, Generate generate, Parse parse, const char* func,
             const char* word, bool logOpenFailure)
{
    DALease db;
    const int openRc = source.Acquire(location, DAAccess::Read, func, db);
    if (openRc != SQLITE_OK) {
        if (logOpenFailure) {
            DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "OpenDB Error: %d", openRc);
        }
        return openRc;
    }
    std::string sql;
    generate(sql);

    DAStatementLease stmt;
    DADatabaseParser parser;
    int rc = source.Prepare(db.get(), sql.c_str(), stmt);
    if (rc == SQLITE_OK) {
        rc = parse(parser, db.get(), stmt.get(), source.MayBeStale());
        if (rc != kDAStaleStatement) {
            return rc;
        }
        stmt.reset();
        rc = source.DAConnectionSource::Prepare(db.get(), sql.c_str(), stmt);
        if (rc == SQLITE_OK) {
            return parse(parser, db.get(), stmt.get(), false);
        }
    }
    DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", word, rc,
                 sqlite3_errmsg(db.get()));
    return rc;
}

// A query whose rows fill cursor; step failures are logged by the parser,
// and returned (with the line "<word> FAILED[rc]: text") when
// returnStepFailure.
template <typename Request>
int RunCursorQuery(DAConnectionSource& source, Request& request,
                   void (DASqlGenerator::*generate)(Request&, std::string&), DACursor& cursor, const char* func,
                   const char* word, bool logOpenFailure, bool returnStepFailure = false)
{
    return RunQuery(
        source, request, [&](std::string& sql) { (DASqlGenerator().*generate)(request, sql); },
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, bool mayBeStale) {
            std::string failure;
            const int rc = DAParseRows(parser, db, stmt, cursor, failure, mayBeStale);
            if (rc == SQLITE_DONE || (rc != kDAStaleStatement && !returnStepFailure)) {
                return SQLITE_OK;
            }
            if (rc != kDAStaleStatement) {
                DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", word, rc,
                             failure.c_str());
            }
            return rc;
        },
        func, word, logOpenFailure);
}

// The transaction core of batches and migrations, on a held connection:
// "BEGIN IMMEDIATE", then decide() under the write lock (any code but 0
// stops there), the count statements of texts (NUL-separated) in order,
// finish() still inside the transaction, and "COMMIT"; every exec under
// busy-retry. On a failure or a stop, rolls back and returns that code,
// with step where it stopped (0 the begin or decide, 1..count the
// statements, count + 1 finish or the commit) and error the text of a
// failed exec.
template <typename Decide, typename Finish>
int RunTransaction(DAConnectionSource& source, sqlite3* db, const char* texts, int count, DAErrorText& error, int& step,
                   Decide decide, Finish finish)
{
    const DARollbackGuard rollback(db);
    // IMMEDIATE takes the write lock now, so a busy file shows (and is
    // waited for) before any statement runs.
    step = 0;
    int rc = ExecWhileBusy(source, db, "BEGIN IMMEDIATE", error);
    if (rc == SQLITE_OK) {
        rc = decide();
    }
    const char* sql = texts;
    while (rc == SQLITE_OK && step < count) {
        ++step;
        rc = source.Execute(db, sql, error);
        sql += std::strlen(sql) + 1;
    }
    if (rc == SQLITE_OK) {
        step = count + 1;
        rc = finish();
    }
    if (rc == SQLITE_OK) {
        rc = ExecWhileBusy(source, db, "COMMIT", error);
    }
    return rc;
}

// Reads the first row of sql's result (text values as decimal integers,
// NULL as 0) into values, on db under busy-retry; values untouched unless
// 0 is returned.
template <std::size_t N>
int ReadIntegers(DAConnectionSource& source, sqlite3* db, const char* sql, std::array<std::int64_t, N>& values,
                 DAErrorText& error)
{
    std::array<std::int64_t, N> row{};
    const int rc = ExecWhileBusy(
        source, db, sql, error,
        [](void* user, int columns, char** texts, char** /*names*/) {
            auto& out = *static_cast<std::array<std::int64_t, N>*>(user);
            for (std::size_t i = 0; i < N && i < static_cast<std::size_t>(columns); ++i) {
                out[i] = texts[i] != nullptr ? std::strtoll(texts[i], nullptr, 10) : 0;
            }
            return 0;
        },
        &row);
    if (rc == SQLITE_OK) {
        values = row;
    }
    return rc;
}

// A read of integers on its own connection: "<func> FAILED[rc]: text" on
// failure, nothing on success.
template <std::size_t N>
int RunRead(DAConnectionSource& source, DABasePath& location, const char* sql, std::array<std::int64_t, N>& values,
            const char* func)
{
    DALease db;
    int rc = source.Acquire(location, DAAccess::Read, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    DAErrorText error;
    rc = ReadIntegers(source, db.get(), sql, values, error);
    if (rc != SQLITE_OK) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", func, rc,
                     FailureText(error, rc));
    }
    return rc;
}

const char* const kReadVersion = "PRAGMA user_version";

}  // namespace

int DAConnectionSource::Prepare(sqlite3* db, const char* sql, DAStatementLease& stmt)
{
    return DARetryWhileBusy(*this, [&] {
        sqlite3_stmt* handle = nullptr;
        const int result = sqlite3_prepare(db, sql, -1, &handle, nullptr);
        stmt = DAStatementLease(handle, DAStatementEnd{this});
        return result;
    });
}

int DAConnectionSource::Execute(sqlite3* db, const char* sql, DAErrorText& error)
{
    return ExecWhileBusy(*this, db, sql, error);
}

void DAConnectionSource::Finish(sqlite3_stmt* stmt) noexcept
{
    sqlite3_finalize(stmt);
}

int DAOperations::DropTable(DAConnectionSource& source, DADropRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetDropTableSql, "DropTable", "DropTable");
}

int DAOperations::Update(DAConnectionSource& source, DAUpdateRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetUpdateSql, "Update", "update");
}

int DAOperations::Delete(DAConnectionSource& source, DADeleteRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetDeleteSql, "Delete", "delete");
}

int DAOperations::Upsert(DAConnectionSource& source, DAUpsertRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetUpsertSql, "Upsert", "Upsert");
}

int DAOperations::CreateTable(DAConnectionSource& source, DACreateRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetCreateTableSql, "CreateTable", "createTable");
}

int DAOperations::ExecuteBatch(DAConnectionSource& source, DABatchRequest& batch)
{
    const char* const func = "ExecuteBatch";
    const int count = batch.m_count;
    if (count == 0) {
        return SQLITE_OK;
    }
    DALease db;
    int rc = source.Acquire(batch, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    DAErrorText error;
    int step = 0;
    int before = 0;
    int changes = 0;
    rc = RunTransaction(
        source, db.get(), batch.m_texts.data(), count, error, step,
        [&] {
            before = sqlite3_total_changes(db.get());
            return SQLITE_OK;
        },
        [&] {
            changes = sqlite3_total_changes(db.get()) - before;
            return SQLITE_OK;
        });
    if (rc == SQLITE_OK) {
        batch.m_changes = changes;
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "ExecuteBatch SUCCESS[%d]: %d statements", rc,
                     count);
        return rc;
    }
    DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "ExecuteBatch FAILED[%d] at %d/%d: %s", rc, step,
                 count, FailureText(error, rc));
    return rc;
}

int DAOperations::Select(DAConnectionSource& source, DASelectRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, &DASqlGenerator::GetSelectSql, cursor, "Select", "SELECT", true);
}

int DAOperations::JoinSelect(DAConnectionSource& source, DAJoinRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, &DASqlGenerator::GetJoinSql, cursor, "JoinSelect", "JoinSelect", false);
}

int DAOperations::Query(DAConnectionSource& source, DAQueryRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, &DASqlGenerator::GetQuerySql, cursor, "Query", "QUERY", true, true);
}

int DAOperations::CheckExistTable(DAConnectionSource& source, DABasePath& location, char const* tableName, bool& exists)
{
    return RunQuery(
        source, location,
        [&](std::string& sql) {
            // Thrown explicitly (a std::string from null is undefined); the
            // lease closes the file on the way out.
            if (tableName == nullptr) {
                throw std::logic_error("DADatabase::CheckExistTable: the table name is null");
            }
            DASqlGenerator().GetCheckTableSql(tableName, sql);
        },
        [&](DADatabaseParser& parser, sqlite3* /*db*/, sqlite3_stmt* stmt, bool /*mayBeStale*/) {
            parser.ParseExistTable(stmt, exists);
            return SQLITE_OK;
        },
        "CheckExistTable", "CheckExistTable", false);
}

int DAOperations::CreateIndex(DAConnectionSource& source, DACreateIndexRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetCreateIndexSql, "CreateIndex", "CreateIndex");
}

int DAOperations::AddColumn(DAConnectionSource& source, DAAddColumnRequest& request)
{
    return RunWrite(source, request, &DASqlGenerator::GetAddColumnSql, "AddColumn", "AddColumn");
}

int DAOperations::GetVersion(DAConnectionSource& source, DABasePath& location, int& version)
{
    std::array<std::int64_t, 1> values{};
    const int rc = RunRead(source, location, kReadVersion, values, "GetVersion");
    if (rc == SQLITE_OK) {
        version = static_cast<int>(values[0]);  // SQLite keeps it as a 32-bit integer
    }
    return rc;
}

int DAOperations::Migrate(DAConnectionSource& source, DABatchRequest& step, int version)
{
    const char* const func = "Migrate";
    if (version <= 0) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(),
                     "Migrate FAILED[%d]: step for version %d, versions start at 1", SQLITE_MISUSE, version);
        return SQLITE_MISUSE;
    }
    DALease db;
    int rc = source.Acquire(step, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    // Read without the write lock: at almost every start the file is up to
    // date, and then no writer is held up.
    DAErrorText error;
    std::array<std::int64_t, 1> current{};
    rc = ReadIntegers(source, db.get(), kReadVersion, current, error);
    if (rc != SQLITE_OK) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "Migrate FAILED[%d]: %s", rc,
                     FailureText(error, rc));
        return rc;
    }
    const int count = step.m_count;
    if (current[0] == version - 1) {
        // Another process may be running this very step: only the version
        // read again under the write lock decides.
        const int kNotDue = -1;
        int at = 0;
        const std::string setVersion = "PRAGMA user_version = " + std::to_string(version);
        rc = RunTransaction(
            source, db.get(), step.m_texts.data(), count, error, at,
            [&] {
                const int read = ReadIntegers(source, db.get(), kReadVersion, current, error);
                return read != SQLITE_OK ? read : current[0] == version - 1 ? SQLITE_OK : kNotDue;
            },
            [&] { return ExecWhileBusy(source, db.get(), setVersion.c_str(), error); });
        if (rc == SQLITE_OK) {
            DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "Migrate SUCCESS[%d]: version %d", rc, version);
            return rc;
        }
        if (rc != kNotDue) {
            DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "Migrate FAILED[%d] at %d/%d: %s", rc, at,
                         count, FailureText(error, rc));
            return rc;
        }
    }
    const auto file = static_cast<long long>(current[0]);
    if (current[0] >= version) {
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "Migrate SKIPPED: file at version %lld", file);
        return SQLITE_OK;
    }
    DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(),
                 "Migrate FAILED[%d]: file at version %lld, step for version %d", SQLITE_MISUSE, file, version);
    return SQLITE_MISUSE;
}

int DAOperations::GetSpace(DAConnectionSource& source, DABasePath& location, std::int64_t& fileBytes,
                           std::int64_t& freeBytes)
{
    std::array<std::int64_t, 2> values{};
    const int rc = RunRead(source, location,
                           "SELECT page_count * page_size, freelist_count * page_size FROM pragma_page_count(), "
                           "pragma_page_size(), pragma_freelist_count()",
                           values, "GetSpace");
    if (rc == SQLITE_OK) {
        fileBytes = values[0];
        freeBytes = values[1];
    }
    return rc;
}

int DAOperations::Compact(DAConnectionSource& source, DABasePath& location)
{
    return RunWrite(source, location, &DASqlGenerator::GetCompactSql, "Compact", "Compact");
}

int DAOperations::Insert(DAConnectionSource& source, DAInsertRequest& request, std::int64_t& rowId)
{
    // An ignored row changes nothing, and then the last row id is another
    // statement's.
    return RunWrite(source, request, &DASqlGenerator::GetInsertSql, "Insert", "Insert",
                    [&](sqlite3* db) { rowId = sqlite3_changes(db) > 0 ? sqlite3_last_insert_rowid(db) : -1; });
}

int DAOperations::Update(DAConnectionSource& source, DAUpdateRequest& request, int& changes)
{
    return RunWrite(source, request, &DASqlGenerator::GetUpdateSql, "Update", "update",
                    [&](sqlite3* db) { changes = sqlite3_changes(db); });
}

int DAOperations::Delete(DAConnectionSource& source, DADeleteRequest& request, int& changes)
{
    return RunWrite(source, request, &DASqlGenerator::GetDeleteSql, "Delete", "delete",
                    [&](sqlite3* db) { changes = sqlite3_changes(db); });
}
