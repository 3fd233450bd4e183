#include "DADatabaseParser.h"

#include <string>
#include <vector>

#include "DABusyRetry.h"
#include "DALog.h"
#include "DAParseRows.h"

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
    const char* const func = "ParseDatabase";
    DABusyRetry<DADatabaseParser> retry(parser);
    bool first = true;  // until the first step that was not busy
    bool registered = false;
    int columnCount = 0;
    int failed = SQLITE_OK;  // the failed step's code, once known
    // The column names, copied once from the first row: SQLite's name of a
    // column does not change while a statement prepared by sqlite3_prepare
    // runs, and asking for it again for every value costs a lock of the
    // connection's mutex each time.
    std::vector<std::string> names;
    for (;;) {
        const int rc = sqlite3_step(stmt);
        if (first && (rc != SQLITE_BUSY || retry.Stopped())) {
            first = false;
            // SQLite marks a statement expired when it met a schema newer
            // than its own and could not be prepared again against it.
            if (mayBeStale && rc != SQLITE_ROW && rc != SQLITE_DONE && sqlite3_expired(stmt) != 0) {
                return kDAStaleStatement;
            }
            cursor.Initialize();
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
        if (!registered) {
            columnCount = sqlite3_column_count(stmt);
            names.reserve(static_cast<std::size_t>(columnCount));
            for (int i = 0; i < columnCount; ++i) {
                names.emplace_back(TextOrEmpty(sqlite3_column_name(stmt, i)));
                cursor.SetColumn(names.back().c_str());
            }
            registered = true;
        }
        for (int i = 0; i < columnCount; ++i) {
            const char* name = names[static_cast<std::size_t>(i)].c_str();
            switch (sqlite3_column_type(stmt, i)) {
            case SQLITE_INTEGER:
            case SQLITE_FLOAT:
            case SQLITE_TEXT:
                cursor.SetData(name, TextOrEmpty(sqlite3_column_text(stmt, i)));
                break;
            case SQLITE_NULL:
                cursor.SetData(name, "");
                break;
            default:
                DA_LOG_AT(DLOG_ERROR, func, "UNKNOWN TYPE");
                cursor.SetData(name, "");
                break;
            }
        }
    }
}
