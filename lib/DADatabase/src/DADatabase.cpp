#include "DADatabase.h"

#include <cstring>
#include <stdexcept>

#include "DABusyRetry.h"
#include "DADatabaseParser.h"
#include "DALog.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"

namespace {

// Opens the location of request, or returns the open's code with db null.
int OpenLocation(DADatabase& database, DABasePath& location, DAConnection& db)
{
    std::string dir;
    std::string file;
    location.GetPath(dir, file);
    sqlite3* handle = nullptr;
    const int rc = database.OpenDB(handle, dir, file);
    db.reset(handle);
    return rc;
}

// sqlite3_exec of sql under busy-retry; error holds the text of the last
// attempt (the text of a busy attempt is released before the next).
int ExecWhileBusy(DADatabase& database, sqlite3* db, const char* sql, DAErrorText& error)
{
    return DARetryWhileBusy(database, [&] {
        error.reset();
        char* text = nullptr;
        const int result = sqlite3_exec(db, sql, nullptr, nullptr, &text);
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

// The frame every write operation shares: open, generate, execute under
// busy-retry, log "<word> SUCCESS[0]" or "<word> FAILED[rc]: text" under
// func, release, return the code.
template <typename Request>
int Execute(DADatabase& database, Request& request, void (DASqlGenerator::*generate)(Request&, std::string&),
            const char* func, const char* word)
{
    DAConnection db;
    int rc = OpenLocation(database, request, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string sql;
    DASqlGenerator generator;
    (generator.*generate)(request, sql);

    DAErrorText error;
    rc = ExecWhileBusy(database, db.get(), sql.c_str(), error);
    if (rc == SQLITE_OK) {
        DA_LOG_AT(DLOG_INFO, func, "%s SUCCESS[%d]", word, rc);
    } else {
        DA_LOG_AT(DLOG_ERROR, func, "%s FAILED[%d]: %s", word, rc, FailureText(error, rc));
    }
    return rc;
}

// The frame the queries share: open, generate, prepare under busy-retry,
// and parse the statement on success; on failure log "<word> FAILED[rc]:
// text" under func. Returns the open's code if it failed, else the
// preparation's.
template <typename Generate, typename Parse>
int Query(DADatabase& database, DABasePath& location, Generate generate, Parse parse, const char* func,
          const char* word, bool logOpenFailure)
{
    DAConnection db;
    const int openRc = OpenLocation(database, location, db);
    if (openRc != SQLITE_OK) {
        if (logOpenFailure) {
            DA_LOG_AT(DLOG_INFO, func, "OpenDB Error: %d", openRc);
        }
        return openRc;
    }
    std::string sql;
    generate(sql);

    DAStatement stmt;
    const int rc = DARetryWhileBusy(database, [&] {
        sqlite3_stmt* handle = nullptr;
        const int result = sqlite3_prepare(db.get(), sql.c_str(), -1, &handle, nullptr);
        stmt.reset(handle);
        return result;
    });
    if (rc != SQLITE_OK) {
        DA_LOG_AT(DLOG_ERROR, func, "%s FAILED[%d]: %s", word, rc, sqlite3_errmsg(db.get()));
        return rc;
    }
    DADatabaseParser parser;
    parse(parser, db.get(), stmt.get());
    return rc;
}

}  // namespace

int DADatabase::OpenDB(sqlite3*& db, std::string dir, std::string file)
{
    std::string path;
    DASqlGenerator generator;
    generator.GetDBPath(std::move(dir), std::move(file), path);

    DAConnection handle;
    const int rc = DARetryWhileBusy(*this, [&] {
        handle.reset();  // the handle of a busy attempt is closed before the next
        sqlite3* opened = nullptr;
        const int result = sqlite3_open(path.c_str(), &opened);
        handle.reset(opened);
        return result;
    });
    if (rc != SQLITE_OK) {
        DA_LOG(DLOG_ERROR, "DB open failed. Error no(%d): %s", rc, sqlite3_errmsg(handle.get()));
        handle.reset();
    }
    db = handle.release();
    return rc;
}

bool DADatabase::IsRetryLimit(int& count)
{
    return DAIsRetryLimit(count, DA_FILE_NAME, __LINE__);
}

int DADatabase::DropTable(DADropRequest& request)
{
    return Execute(*this, request, &DASqlGenerator::GetDropTableSql, __func__, "DropTable");
}

int DADatabase::Update(DAUpdateRequest& request)
{
    return Execute(*this, request, &DASqlGenerator::GetUpdateSql, __func__, "update");
}

int DADatabase::Delete(DADeleteRequest& request)
{
    return Execute(*this, request, &DASqlGenerator::GetDeleteSql, __func__, "delete");
}

int DADatabase::Upsert(DAUpsertRequest& request)
{
    return Execute(*this, request, &DASqlGenerator::GetUpsertSql, __func__, "Upsert");
}

int DADatabase::CreateTable(DACreateRequest& request)
{
    return Execute(*this, request, &DASqlGenerator::GetCreateTableSql, __func__, "createTable");
}

int DADatabase::ExecuteBatch(DABatchRequest& batch)
{
    const int count = batch.m_count;
    if (count == 0) {
        return SQLITE_OK;
    }
    DAConnection db;
    int rc = OpenLocation(*this, batch, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    // IMMEDIATE takes the write lock now, so a busy file shows (and is
    // waited for) before any statement runs.
    DAErrorText error;
    int step = 0;  // 0 the begin, 1..count the statements, count + 1 the commit
    rc = ExecWhileBusy(*this, db.get(), "BEGIN IMMEDIATE", error);
    const int before = sqlite3_total_changes(db.get());
    const char* sql = batch.m_texts.data();
    while (rc == SQLITE_OK && step < count) {
        ++step;
        rc = ExecWhileBusy(*this, db.get(), sql, error);
        sql += std::strlen(sql) + 1;
    }
    if (rc == SQLITE_OK) {
        step = count + 1;
        const int changes = sqlite3_total_changes(db.get()) - before;
        rc = ExecWhileBusy(*this, db.get(), "COMMIT", error);
        if (rc == SQLITE_OK) {
            batch.m_changes = changes;
            DA_LOG(DLOG_INFO, "ExecuteBatch SUCCESS[%d]: %d statements", rc, count);
            return rc;
        }
    }
    // Some failures end the transaction inside SQLite already.
    if (sqlite3_get_autocommit(db.get()) == 0) {
        sqlite3_exec(db.get(), "ROLLBACK", nullptr, nullptr, nullptr);
    }
    DA_LOG(DLOG_ERROR, "ExecuteBatch FAILED[%d] at %d/%d: %s", rc, step, count, FailureText(error, rc));
    return rc;
}

// The frame is called as ::Query: inside the class the name Query means
// the member DADatabase::Query.
int DADatabase::Select(DASelectRequest& request, DACursor& cursor)
{
    return ::Query(
        *this, request, [&](std::string& sql) { DASqlGenerator().GetSelectSql(request, sql); },
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt) { parser.ParseDatabase(db, stmt, cursor); },
        __func__, "SELECT", true);
}

int DADatabase::JoinSelect(DAJoinRequest& request, DACursor& cursor)
{
    return ::Query(
        *this, request, [&](std::string& sql) { DASqlGenerator().GetJoinSql(request, sql); },
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt) { parser.ParseDatabase(db, stmt, cursor); },
        __func__, "JoinSelect", false);
}

int DADatabase::Query(DAQueryRequest& request, DACursor& cursor)
{
    return ::Query(
        *this, request, [&](std::string& sql) { DASqlGenerator().GetQuerySql(request, sql); },
        [&](DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt) { parser.ParseDatabase(db, stmt, cursor); },
        __func__, "QUERY", true);
}

int DADatabase::CheckExistTable(DABasePath& location, char const* tableName, bool& exists)
{
    return ::Query(
        *this, location,
        [&](std::string& sql) {
            // Thrown explicitly (a std::string from null is undefined); the
            // connection owner closes the file on the way out.
            if (tableName == nullptr) {
                throw std::logic_error("DADatabase::CheckExistTable: the table name is null");
            }
            DASqlGenerator().GetCheckTableSql(tableName, sql);
        },
        [&](DADatabaseParser& parser, sqlite3* /*db*/, sqlite3_stmt* stmt) { parser.ParseExistTable(stmt, exists); },
        __func__, "CheckExistTable", false);
}
