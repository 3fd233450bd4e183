#include "DADatabaseParser.h"

#include <string>
#include <vector>

#include "DABusyRetry.h"
#include "DALog.h"
#include "DAParseRows.h"
#include "DAStepRows.h"

namespace {

// SQLite gives no text only when it runs out of memory; the cursor then
// gets the empty text rather than a null it cannot copy.
const char* TextOrEmpty(const unsigned char* text)
{
    return text != nullptr ? reinterpret_cast<const char*>(text) : "";
}

const char* TextOrEmpty(const char* text)
{
    return text != nullptr ? text : "";
}

}  // namespace

bool DADatabaseParser::IsRetryLimit(int& count)
{
    return DAIsRetryLimit(count, DA_FILE_NAME, __LINE__);
}

int DADatabaseParser::ParseExistTable(sqlite3_stmt* stmt, bool& exists)
{
    bool found = false;
    DABusyRetry<DADatabaseParser> retry(*this);
    int rc = SQLITE_OK;
    for (;;) {
        rc = sqlite3_step(stmt);
        if (rc == SQLITE_DONE || retry.Stopped()) {
            break;
        }
        if (retry.ShouldRetry(rc)) {
            continue;
        }
        if (rc == SQLITE_ROW) {
            if (sqlite3_column_int(stmt, 0) > 0) {
                found = true;
            }
        } else {
            // SQLITE_ERROR, and any result without a meaning here, which
            // would otherwise be stepped again without end.
            DA_LOG(DLOG_ERROR, "SQLITE STEP ERROR!!!");
            retry.Stop();
        }
    }
    exists = found;
    return rc;
}

void DADatabaseParser::ParseDatabase(sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor)
{
    std::string failure;
    ParseRows(db, stmt, cursor, failure);
}

int DADatabaseParser::ParseRows(sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor, std::string& failure)
{
    return DAParseRows(*this, db, stmt, cursor, failure, false);
}

int DAParseRows(DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor, std::string& failure,
                bool mayBeStale)
{
    // The column names, copied once from the first row: SQLite's name of a
    // column does not change while a statement prepared by sqlite3_prepare
    // runs, and asking for it again for every value costs a lock of the
    // connection's mutex each time.
    struct Rows {
        DACursor& cursor;
        std::vector<std::string> names;
        bool registered;
    } rows{cursor, {}, false};
    const auto start = [](void* user) { static_cast<Rows*>(user)->cursor.Initialize(); };
    return DAStepRows(parser, db, stmt, failure, &rows, mayBeStale, start, [](void* user, sqlite3_stmt* row) {
        const char* const func = "ParseDatabase";
        Rows& to = *static_cast<Rows*>(user);
        if (!to.registered) {
            const int columnCount = sqlite3_column_count(row);
            to.names.reserve(static_cast<std::size_t>(columnCount));
            for (int i = 0; i < columnCount; ++i) {
                to.names.emplace_back(TextOrEmpty(sqlite3_column_name(row, i)));
                to.cursor.SetColumn(to.names.back().c_str());
            }
            to.registered = true;
        }
        const auto columnCount = static_cast<int>(to.names.size());
        for (int i = 0; i < columnCount; ++i) {
            const char* name = to.names[static_cast<std::size_t>(i)].c_str();
            switch (sqlite3_column_type(row, i)) {
            case SQLITE_INTEGER:
            case SQLITE_FLOAT:
            case SQLITE_TEXT:
                to.cursor.SetData(name, TextOrEmpty(sqlite3_column_text(row, i)));
                break;
            case SQLITE_NULL:
                to.cursor.SetData(name, "");
                break;
            default:
                DA_LOG_AT(DLOG_ERROR, func, "UNKNOWN TYPE");
                to.cursor.SetData(name, "");
                break;
            }
        }
        return SQLITE_ROW;
    });
}

int DAStepRows(DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, std::string& failure, void* user,
               bool mayBeStale, void (*onStart)(void* user), DARowSink onRow)
{
    const char* const func = "ParseDatabase";
    DABusyRetry<DADatabaseParser> retry(parser);
    bool first = true;  // until the first step that was not busy
    int failed = SQLITE_OK;  // the failed step's code, once known
    for (;;) {
        const int rc = sqlite3_step(stmt);
        if (first && (rc != SQLITE_BUSY || retry.Stopped())) {
            first = false;
            // SQLite marks a statement expired when it met a schema newer
            // than its own and could not be prepared again against it.
            if (mayBeStale && rc != SQLITE_ROW && rc != SQLITE_DONE && sqlite3_expired(stmt) != 0) {
                return kDAStaleStatement;
            }
            onStart(user);
        }
        if (rc == SQLITE_DONE && failed == SQLITE_OK) {
            return rc;
        }
        if (rc == SQLITE_DONE || retry.Stopped()) {
            if (failed == SQLITE_OK) {  // the busy limit ended the loop
                failed = SQLITE_BUSY;
                failure = sqlite3_errstr(failed);
            }
            return failed;
        }
        if (retry.ShouldRetry(rc)) {
            continue;
        }
        if (rc != SQLITE_ROW) {
            DA_LOG_AT(DLOG_ERROR, func, "SQLITE STEP ERROR!!! %s", sqlite3_errmsg(db));
            // A statement from sqlite3_prepare steps into the generic 1;
            // the reset gives the step's own code and text.
            const int specific = sqlite3_reset(stmt);
            failed = specific != SQLITE_OK ? specific : rc;
            failure = specific != SQLITE_OK ? sqlite3_errmsg(db) : sqlite3_errstr(rc);
            retry.Stop();
            continue;
        }
        const int next = onRow(user, stmt);
        if (next != SQLITE_ROW) {
            if (next != SQLITE_DONE) {
                failure = sqlite3_errstr(next);
            }
            return next;
        }
    }
}
