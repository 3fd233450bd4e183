#include "DADatabaseParser.h"

#include "DABusyRetry.h"
#include "DALog.h"

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
    cursor.Initialize();
    DABusyRetry<DADatabaseParser> retry(*this);
    bool registered = false;
    int columnCount = 0;
    for (;;) {
        const int rc = sqlite3_step(stmt);
        if (rc == SQLITE_DONE || retry.Stopped()) {
            return;
        }
        if (retry.ShouldRetry(rc)) {
            continue;
        }
        if (rc != SQLITE_ROW) {
            DA_LOG(DLOG_ERROR, "SQLITE STEP ERROR!!! %s", sqlite3_errmsg(db));
            retry.Stop();
            continue;
        }
        if (!registered) {
            columnCount = sqlite3_column_count(stmt);
            for (int i = 0; i < columnCount; ++i) {
                cursor.SetColumn(TextOrEmpty(sqlite3_column_name(stmt, i)));
            }
            registered = true;
        }
        for (int i = 0; i < columnCount; ++i) {
            const char* name = TextOrEmpty(sqlite3_column_name(stmt, i));
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
                DA_LOG(DLOG_ERROR, "UNKNOWN TYPE");
                cursor.SetData(name, "");
                break;
            }
        }
    }
}
