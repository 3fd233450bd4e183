#include "DAOperation.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "DABusyRetry.h"
#include "DADatabaseParser.h"
#include "DALog.h"
#include "DAParseRows.h"
#include "DAPlainName.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"
#include "DAStatementCache.h"
#include "DAStepRows.h"
#include "DATypedStore.h"
#include "DAWatchSchema.h"

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

// Prepares (or runs) statement on db, as text or as shape and values.
int PrepareStatement(DAConnectionSource& source, sqlite3* db, const DASqlView& statement, DAStatementLease& stmt)
{
    return statement.shaped ? source.PrepareShaped(db, statement.sql, statement.values, stmt)
                            : source.Prepare(db, statement.sql, stmt);
}

int ExecuteStatement(DAConnectionSource& source, sqlite3* db, const DASqlView& statement, DAErrorText& error)
{
    return statement.shaped ? source.ExecuteShaped(db, statement.sql, statement.values, error)
                            : source.Execute(db, statement.sql, error);
}

// A compaction's statement, always text.
void DAWriteSql(DABasePath& location, DASqlStatement& statement)
{
    statement.shaped = false;
    DASqlGenerator().GetCompactSql(location, statement.sql);
}

// The statement of request as db's source takes it: shape and values on
// a held connection, else text.
template <typename Request>
void WriteFor(DAConnectionSource& source, sqlite3* db, Request& request, DASqlStatement& statement)
{
    statement.shaped = source.TakesShapes(db);
    DAWriteSql(request, statement);
}

struct NoFollowUp {
    void operator()(sqlite3* /*db*/) const {}
};

// The write frame: acquire for writing, write the request's statement,
// exec under busy-retry; on success call done(db) while the connection is
// still held (changes, row ids) and log "<word> SUCCESS[0]", else "<word>
// FAILED[rc]: text", both under func.
template <typename Request, typename Done = NoFollowUp>
int RunWrite(DAConnectionSource& source, Request& request, const char* func, const char* word, Done done = Done())
{
    DALease db;
    int rc = source.Acquire(request, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    DASqlStatement statement;
    WriteFor(source, db.get(), request, statement);

    DAErrorText error;
    rc = ExecuteStatement(source, db.get(), statement.View(), error);
    if (rc == SQLITE_OK) {
        done(db.get());
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "%s SUCCESS[%d]", word, rc);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", word, rc,
                     FailureText(error, rc));
    }
    return rc;
}

// The query frame: acquire for reading, generate(db, statement), prepare
// under busy-retry, and on success return parse(parser, db, stmt,
// mayBeStale); on failure log "<word> FAILED[rc]: text" under func and
// return the preparation's code.
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
    DASqlStatement statement;
    generate(db.get(), statement);

    DAStatementLease stmt;
    DADatabaseParser parser;
    int rc = PrepareStatement(source, db.get(), statement.View(), stmt);
    if (rc == SQLITE_OK) {
        rc = parse(parser, db.get(), stmt.get(), source.MayBeStale());
        if (rc != kDAStaleStatement) {
            return rc;
        }
        stmt.reset();
        rc = source.DAConnectionSource::Prepare(db.get(), statement.Text().c_str(), stmt);
        if (rc == SQLITE_OK) {
            return parse(parser, db.get(), stmt.get(), false);
        }
    }
    DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", word, rc,
                 sqlite3_errmsg(db.get()));
    return rc;
}

// A query whose rows rows(parser, db, stmt, failure, mayBeStale) reads, returning
// SQLITE_DONE when it read them all; step failures are logged by the
// parser, and returned (with the line "<word> FAILED[rc]: text") when
// returnStepFailure.
template <typename Request, typename Rows>
int RunRowsQuery(DAConnectionSource& source, Request& request, const char* func, const char* word, bool logOpenFailure,
                 bool returnStepFailure, Rows rows)
{
    return RunQuery(
        source, request, [&](sqlite3* db, DASqlStatement& statement) { WriteFor(source, db, request, statement); },
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, bool mayBeStale) {
            std::string failure;
            const int rc = rows(parser, db, stmt, failure, mayBeStale);
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

// A query whose rows fill cursor.
template <typename Request>
int RunCursorQuery(DAConnectionSource& source, Request& request, DACursor& cursor, const char* func, const char* word,
                   bool logOpenFailure, bool returnStepFailure = false)
{
    return RunRowsQuery(source, request, func, word, logOpenFailure, returnStepFailure,
                        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, std::string& failure,
                            bool mayBeStale) { return DAParseRows(parser, db, stmt, cursor, failure, mayBeStale); });
}

// The typed reads' rows: Query's into a whole store, QueryEach's one at a
// time, viewed in the statement (no copy of its texts and blobs).
struct EachRow {
    DATypedStore& store;
    const std::function<bool(DARow const&)>& visit;
};

int AppendRow(void* store, sqlite3_stmt* stmt)
{
    return static_cast<DATypedStore*>(store)->Append(stmt);
}

int VisitRow(void* user, sqlite3_stmt* stmt)
{
    auto& each = *static_cast<EachRow*>(user);
    const int rc = each.store.View(stmt);
    return rc != SQLITE_ROW ? rc : each.visit(each.store.row) ? SQLITE_ROW : SQLITE_DONE;
}

// Holds SQLite's defensive mode on db for its lifetime, then restores what
// was set. A search index's tables are FTS5 shadow tables, and an index's
// own name can be another's shadow ("x_data" is index "x"'s): SQLite then
// refuses to create, write or drop it, where it would damage index "x".
class DADefensiveScope {
public:
    explicit DADefensiveScope(sqlite3* db) : m_db(db)
    {
        sqlite3_db_config(m_db, SQLITE_DBCONFIG_DEFENSIVE, -1, &m_was);
        sqlite3_db_config(m_db, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
    }
    ~DADefensiveScope() { sqlite3_db_config(m_db, SQLITE_DBCONFIG_DEFENSIVE, m_was, nullptr); }
    DADefensiveScope(const DADefensiveScope&) = delete;
    DADefensiveScope& operator=(const DADefensiveScope&) = delete;

private:
    sqlite3* m_db;
    int m_was = 0;
};

// The transaction core of batches and migrations, on a held connection:
// "BEGIN IMMEDIATE", then decide() under the write lock (any code but 0
// stops there), the count statements packed at statements
// (DAPackStatement) in order, finish() still inside the transaction, and
// "COMMIT"; every exec under busy-retry. On a failure or a stop, rolls
// back and returns that code, with step where it stopped (0 the begin or
// decide, 1..count the statements, count + 1 finish or the commit) and
// error the text of a failed exec.
struct NoStatementFollowUp {
    void operator()(int /*step*/) const {}
};

template <typename Decide, typename Finish, typename After = NoStatementFollowUp>
int RunTransaction(DAConnectionSource& source, sqlite3* db, const char* statements, int count, DAErrorText& error,
                   int& step, Decide decide, Finish finish, After after = After())
{
    const DARollbackGuard rollback(db);
    const DADefensiveScope defensive(db);
    // IMMEDIATE takes the write lock now, so a busy file shows (and is
    // waited for) before any statement runs.
    step = 0;
    int rc = ExecWhileBusy(source, db, "BEGIN IMMEDIATE", error);
    if (rc == SQLITE_OK) {
        rc = decide();
    }
    const char* at = statements;
    while (rc == SQLITE_OK && step < count) {
        ++step;
        rc = ExecuteStatement(source, db, DAUnpackStatement(at, at), error);
        if (rc == SQLITE_OK) {
            after(step);
        }
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

// Refuses a table name that is not plain, with the line "<func>
// FAILED[21]: table name is not a plain name".
bool IsWatchableName(DAConnectionSource& source, char const* table, const char* func)
{
    if (DAIsPlainName(table)) {
        return true;
    }
    DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: table name is not a plain name", func,
                 SQLITE_MISUSE);
    return false;
}

// Gives the watch counters of db a "seen" column if they have none (a new
// table, or one of an earlier build, whose triggers counted every row) and
// makes the watch triggers already there anew: the old ones would write
// the counter at every commit.
int GateCounters(DAConnectionSource& source, sqlite3* db, DAErrorText& error)
{
    const std::string table = kDAWatchTable;
    const std::string gated = "SELECT count(*) FROM pragma_table_info('" + table + "') WHERE name = 'seen'";
    std::array<std::int64_t, 1> count{};
    int rc = ReadIntegers(source, db, gated.c_str(), count, error);
    if (rc != SQLITE_OK || count[0] != 0) {
        return rc;
    }
    std::string sql = "ALTER TABLE \"" + table + "\" ADD COLUMN seen INTEGER NOT NULL DEFAULT 0;";
    const std::string watched =
        "SELECT DISTINCT tbl_name FROM sqlite_master WHERE type = 'trigger' AND name LIKE '" + table + "/%'";
    rc = ExecWhileBusy(
        source, db, watched.c_str(), error,
        [](void* user, int /*columns*/, char** texts, char** /*names*/) {
            *static_cast<std::string*>(user) += DAWatchTriggers(texts[0], true);
            return 0;
        },
        &sql);
    return rc != SQLITE_OK ? rc : ExecWhileBusy(source, db, sql.c_str(), error);
}

// Appends sql to texts, packed as RunTransaction takes it.
void AddText(std::vector<char>& texts, const std::string& sql)
{
    DASqlStatement statement;
    statement.sql = sql;
    DAPackStatement(statement, texts);
}

struct NoFinish {
    int operator()(sqlite3* /*db*/, DAErrorText& /*error*/) const { return SQLITE_OK; }
};

// Statements that land together or not at all: the count texts of AddText
// (a text may hold several statements) and finish(db, error) in one
// transaction on a connection for writing, logged "<func> SUCCESS[0]" or
// "<func> FAILED[rc]: text" under func, as the write frame logs.
template <typename Finish = NoFinish>
int RunLoggedTransaction(DAConnectionSource& source, DABasePath& location, const char* func,
                         const std::vector<char>& texts, int count, Finish finish = Finish())
{
    DALease db;
    int rc = source.Acquire(location, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    DAErrorText error;
    int step = 0;
    rc = RunTransaction(
        source, db.get(), texts.data(), count, error, step, [] { return SQLITE_OK; },
        [&] { return finish(db.get(), error); });
    if (rc == SQLITE_OK) {
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "%s SUCCESS[%d]", func, rc);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "%s FAILED[%d]: %s", func, rc,
                     FailureText(error, rc));
    }
    return rc;
}

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
    std::string shape;
    DASqlParams values;
    bool blob = false;
    if (std::strstr(sql, "X'") != nullptr && DASplitLiterals(sql, shape, values)) {
        values.View().ForEach([&](DAParamKind kind, const char* /*bytes*/, std::size_t /*size*/) {
            blob = blob || kind == DAParamKind::Blob;
        });
    }
    return blob ? ExecuteShaped(db, shape.c_str(), values.View(), error) : ExecWhileBusy(*this, db, sql, error);
}

int DAConnectionSource::PrepareShape(sqlite3* db, const char* shape, DASqlParamsView values, DAStatementLease& stmt)
{
    DAStatementCache* kept = KeptStatements(db);
    sqlite3_stmt* handle = kept != nullptr ? kept->Take(shape) : nullptr;
    int rc = SQLITE_OK;
    if (handle == nullptr) {
        // A failed preparation leaves handle null.
        rc = DARetryWhileBusy(*this, [&] { return sqlite3_prepare_v2(db, shape, -1, &handle, nullptr); });
    }
    m_kept = kept != nullptr ? handle : nullptr;
    stmt = DAStatementLease(handle, DAStatementEnd{this});
    if (rc != SQLITE_OK) {
        return rc == SQLITE_BUSY || rc == SQLITE_NOMEM ? rc : kAsWritten;
    }
    // The values outlive the statement's use: the cache clears the
    // bindings when it takes the statement back.
    return values.Bind(handle);
}

int DAConnectionSource::PrepareShaped(sqlite3* db, const char* shape, DASqlParamsView values, DAStatementLease& stmt)
{
    const int rc = PrepareShape(db, shape, values, stmt);
    if (rc != kAsWritten) {
        return rc;
    }
    std::string text;
    values.Render(shape, text);
    return DAConnectionSource::Prepare(db, text.c_str(), stmt);
}

int DAConnectionSource::ExecuteShaped(sqlite3* db, const char* shape, DASqlParamsView values, DAErrorText& error)
{
    DAStatementLease stmt;
    const int rc = PrepareShape(db, shape, values, stmt);
    if (rc != kAsWritten) {
        return StepToEnd(db, rc == SQLITE_OK ? stmt.get() : nullptr, rc, error);
    }
    std::string text;
    values.Render(shape, text);
    return ExecWhileBusy(*this, db, text.c_str(), error);
}

int DAConnectionSource::StepToEnd(sqlite3* db, sqlite3_stmt* stmt, int rc, DAErrorText& error)
{
    if (rc == SQLITE_OK) {
        rc = DARetryWhileBusy(*this, [&] {
            sqlite3_reset(stmt);  // after a busy step; keeps the bindings
            return sqlite3_step(stmt);
        });
        while (rc == SQLITE_ROW) {
            rc = sqlite3_step(stmt);
        }
    }
    error.reset();
    if (rc == SQLITE_DONE) {
        return SQLITE_OK;
    }
    error.reset(sqlite3_mprintf("%s", sqlite3_errmsg(db)));
    return rc;
}

void DAConnectionSource::Finish(sqlite3_stmt* stmt) noexcept
{
    if (stmt == std::exchange(m_kept, nullptr)) {
        KeptStatements(sqlite3_db_handle(stmt))->Put(stmt);
    } else {
        sqlite3_finalize(stmt);
    }
}

int DAOperations::DropTable(DAConnectionSource& source, DADropRequest& request)
{
    return RunWrite(source, request, "DropTable", "DropTable");
}

int DAOperations::Update(DAConnectionSource& source, DAUpdateRequest& request)
{
    return RunWrite(source, request, "Update", "update");
}

int DAOperations::Delete(DAConnectionSource& source, DADeleteRequest& request)
{
    return RunWrite(source, request, "Delete", "delete");
}

int DAOperations::Upsert(DAConnectionSource& source, DAUpsertRequest& request)
{
    return RunWrite(source, request, "Upsert", "Upsert");
}

int DAOperations::CreateTable(DAConnectionSource& source, DACreateRequest& request)
{
    return RunWrite(source, request, "CreateTable", "createTable");
}

int DAOperations::ExecuteBatch(DAConnectionSource& source, DABatchRequest& batch)
{
    const char* const func = "ExecuteBatch";
    const int count = batch.m_count;
    batch.m_rowIds.clear();
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
    std::vector<std::int64_t> ids;
    ids.reserve(batch.m_inserts.size());
    rc = RunTransaction(
        source, db.get(), batch.m_texts.data(), count, error, step,
        [&] {
            before = sqlite3_total_changes(db.get());
            return SQLITE_OK;
        },
        [&] {
            changes = sqlite3_total_changes(db.get()) - before;
            return SQLITE_OK;
        },
        [&](int at) {
            // An ignored row changes nothing, and then the last row id is
            // another statement's.
            if (ids.size() < batch.m_inserts.size() && batch.m_inserts[ids.size()] == at) {
                ids.push_back(sqlite3_changes(db.get()) > 0 ? sqlite3_last_insert_rowid(db.get()) : -1);
            }
        });
    if (rc == SQLITE_OK) {
        batch.m_changes = changes;
        batch.m_rowIds = std::move(ids);
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
    return RunCursorQuery(source, request, cursor, "Select", "SELECT", true);
}

int DAOperations::JoinSelect(DAConnectionSource& source, DAJoinRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, cursor, "JoinSelect", "JoinSelect", false);
}

int DAOperations::Query(DAConnectionSource& source, DAQueryRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, cursor, "Query", "QUERY", true, true);
}

int DAOperations::Query(DAConnectionSource& source, DAQueryRequest& request, DATypedCursor& cursor)
{
    return TypedQuery(source, request, cursor, "Query", "QUERY");
}

template <typename Request>
int DAOperations::TypedQuery(DAConnectionSource& source, Request& request, DATypedCursor& cursor, const char* func,
                             const char* word)
{
    return RunRowsQuery(
        source, request, func, word, true, true,
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, std::string& failure, bool mayBeStale) {
            if (cursor.m_store == nullptr) {  // moved from
                cursor.m_store = std::make_unique<DATypedStore>();
            }
            DATypedStore& store = *cursor.m_store;
            const auto start = [](void* user) { static_cast<DATypedStore*>(user)->Clear(); };
            const int rc = DAStepRows(parser, db, stmt, failure, &store, mayBeStale, start, AppendRow);
            if (rc != kDAStaleStatement && store.rows == 0) {
                store.TakeNames(stmt);
            }
            store.Fit();
            return rc;
        });
}

int DAOperations::QueryEach(DAConnectionSource& source, DAQueryRequest& request,
                            const std::function<bool(DARow const&)>& visit)
{
    return RunRowsQuery(
        source, request, "QueryEach", "QUERY", true, true,
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, std::string& failure, bool mayBeStale) {
            DATypedStore store;
            EachRow each{store, visit};
            return DAStepRows(
                parser, db, stmt, failure, &each, mayBeStale, [](void* /*user*/) {}, VisitRow);
        });
}

int DAOperations::CheckExistTable(DAConnectionSource& source, DABasePath& location, char const* tableName, bool& exists)
{
    return RunQuery(
        source, location,
        [&](sqlite3* /*db*/, DASqlStatement& statement) {
            // Thrown explicitly (a std::string from null is undefined); the
            // lease closes the file on the way out.
            if (tableName == nullptr) {
                throw std::logic_error("DADatabase::CheckExistTable: the table name is null");
            }
            DASqlGenerator().GetCheckTableSql(tableName, statement.sql);
        },
        [&](DADatabaseParser& parser, sqlite3* /*db*/, sqlite3_stmt* stmt, bool /*mayBeStale*/) {
            parser.ParseExistTable(stmt, exists);
            return SQLITE_OK;
        },
        "CheckExistTable", "CheckExistTable", false);
}

int DAOperations::CreateIndex(DAConnectionSource& source, DACreateIndexRequest& request)
{
    return RunWrite(source, request, "CreateIndex", "CreateIndex");
}

int DAOperations::AddColumn(DAConnectionSource& source, DAAddColumnRequest& request)
{
    return RunWrite(source, request, "AddColumn", "AddColumn");
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

int DAOperations::Migrate(DAConnectionSource& source, DABatchRequest& step, int version, bool& applied)
{
    const char* const func = "Migrate";
    applied = false;
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
            applied = true;
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
    return RunWrite(source, location, "Compact", "Compact");
}

int DAOperations::Insert(DAConnectionSource& source, DAInsertRequest& request, std::int64_t& rowId)
{
    // An ignored row changes nothing, and then the last row id is another
    // statement's.
    return RunWrite(source, request, "Insert", "Insert",
                    [&](sqlite3* db) { rowId = sqlite3_changes(db) > 0 ? sqlite3_last_insert_rowid(db) : -1; });
}

int DAOperations::Update(DAConnectionSource& source, DAUpdateRequest& request, int& changes)
{
    return RunWrite(source, request, "Update", "update", [&](sqlite3* db) { changes = sqlite3_changes(db); });
}

int DAOperations::Delete(DAConnectionSource& source, DADeleteRequest& request, int& changes)
{
    return RunWrite(source, request, "Delete", "delete", [&](sqlite3* db) { changes = sqlite3_changes(db); });
}

int DAOperations::CreateSearchIndex(DAConnectionSource& source, DASearchIndexRequest& request)
{
    std::string sql;
    DASqlGenerator().GetCreateSearchIndexSql(request, sql);
    std::vector<char> texts;
    AddText(texts, sql);
    return RunLoggedTransaction(source, request, "CreateSearchIndex", texts, 1);
}

int DAOperations::DropSearchIndex(DAConnectionSource& source, DABasePath& location, char const* name)
{
    const char* const func = "DropSearchIndex";
    if (!DAIsPlainName(name)) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "DropSearchIndex FAILED[%d]: invalid name",
                     SQLITE_MISUSE);
        return SQLITE_MISUSE;
    }
    std::string sql;
    DASqlGenerator().GetDropSearchIndexSql(name, sql);
    std::vector<char> texts;
    AddText(texts, sql);
    return RunLoggedTransaction(source, location, func, texts, 1);
}

int DAOperations::Search(DAConnectionSource& source, DASearchRequest& request, DACursor& cursor)
{
    return RunCursorQuery(source, request, cursor, "Search", "SEARCH", true, true);
}

int DAOperations::Search(DAConnectionSource& source, DASearchRequest& request, DATypedCursor& cursor)
{
    return TypedQuery(source, request, cursor, "Search", "SEARCH");
}

int DAOperations::Watch(DAConnectionSource& source, DABasePath& location, char const* table, std::int64_t& changes,
                        std::int64_t& schema)
{
    const char* const func = "AddTable";
    if (!IsWatchableName(source, table, func)) {
        return SQLITE_MISUSE;
    }
    // Names are plain, so they need no quoting inside the literals.
    const std::string counters = std::string("\"") + kDAWatchTable + "\"";
    const std::string name = std::string("'") + table + "'";
    std::vector<char> texts;
    AddText(texts,
            "CREATE TABLE IF NOT EXISTS " + counters +
                "(name TEXT PRIMARY KEY COLLATE NOCASE, changes INTEGER NOT NULL) WITHOUT ROWID");
    AddText(texts, "INSERT OR IGNORE INTO " + counters + "(name, changes) VALUES(" + name + ", 0)");
    const std::string install =
        DAWatchTriggers(table, false) + "UPDATE " + counters + " SET seen = changes WHERE name = " + name;
    const std::string read =
        "SELECT changes, (SELECT schema_version FROM pragma_schema_version) FROM " + counters + " WHERE name = " + name;
    std::array<std::int64_t, 2> values{};
    const int rc = RunLoggedTransaction(source, location, func, texts, 2, [&](sqlite3* db, DAErrorText& error) {
        int result = GateCounters(source, db, error);
        result = result != SQLITE_OK ? result : ExecWhileBusy(source, db, install.c_str(), error);
        return result != SQLITE_OK ? result : ReadIntegers(source, db, read.c_str(), values, error);
    });
    if (rc == SQLITE_OK) {
        changes = values[0];
        schema = values[1];
    }
    return rc;
}

int DAOperations::Unwatch(DAConnectionSource& source, DABasePath& location, char const* table)
{
    const char* const func = "Unwatch";
    if (!IsWatchableName(source, table, func)) {
        return SQLITE_MISUSE;
    }
    const std::string counters = std::string("\"") + kDAWatchTable + "\"";
    std::vector<char> texts;
    for (const char* event : kDAWatchEvents) {
        AddText(texts, "DROP TRIGGER IF EXISTS \"" + DAWatchTrigger(table, event) + "\"");
    }
    const std::string present =
        std::string("SELECT count(*) FROM sqlite_master WHERE type = 'table' AND name = '") + kDAWatchTable + "'";
    const std::string forget = "DELETE FROM " + counters + " WHERE name = '" + table + "'";
    const std::string left = "SELECT count(*) FROM " + counters;
    const std::string drop = "DROP TABLE " + counters;
    return RunLoggedTransaction(source, location, func, texts, 3, [&](sqlite3* db, DAErrorText& error) {
        std::array<std::int64_t, 1> count{};
        int rc = ReadIntegers(source, db, present.c_str(), count, error);
        if (rc != SQLITE_OK || count[0] == 0) {
            return rc;
        }
        rc = ExecWhileBusy(source, db, forget.c_str(), error);
        if (rc == SQLITE_OK) {
            rc = ReadIntegers(source, db, left.c_str(), count, error);
        }
        return rc == SQLITE_OK && count[0] == 0 ? ExecWhileBusy(source, db, drop.c_str(), error) : rc;
    });
}
