#ifndef DADATABASEPARSER_H
#define DADATABASEPARSER_H

#include <string>

#include <sqlite3.h>

#include "DACursor.h"

/// Steps a statement prepared by a DADatabase query and turns its rows into
/// results. Holds no state; never prepares, finalizes or closes anything.
///
/// Stepping runs under the busy-retry rule, with one counter for the whole
/// statement (rows do not reset it). A step error, the retry limit, or a
/// step result with no meaning here (logged as a step error) is followed by
/// exactly one more step, then the loop ends.
class DADatabaseParser {
public:
    DADatabaseParser() = default;
    virtual ~DADatabaseParser() = default;

    /// Adds 1 to count. Up to 15: warning "SQLITE BUSY[count]", a 100 ms
    /// pause, false. Beyond: error "RETRY COUNT is reached LIMIT,
    /// SQLITE_BUSY", no pause, true.
    bool IsRetryLimit(int& count);

    /// For a statement whose first column is a count: exists becomes true if
    /// any row gives a count above 0, false otherwise (always written).
    /// Returns the last step's code: 101 (SQLITE_DONE) after a clean run.
    int ParseExistTable(sqlite3_stmt* stmt, bool& exists);

    /// Initializes cursor, registers the column names of the first row, and
    /// stores every value as text: numbers as SQLite's text, NULL as "",
    /// any other type as "" with an "UNKNOWN TYPE" error line. db serves
    /// only for the error text of a failed step. Rows read before a failure
    /// stay.
    void ParseDatabase(sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor);

    /// ParseDatabase, lines included (they name ParseDatabase), that also
    /// tells how the rows ended: returns 101 (SQLITE_DONE) when every row
    /// was read; otherwise the failure's code, as SQLite reports it for the
    /// failed step (11 for a damaged page, not the generic 1 a statement
    /// from sqlite3_prepare steps into), or 5 when the busy limit ended the
    /// loop, with SQLite's text of it in failure. failure is untouched on
    /// SQLITE_DONE.
    int ParseRows(sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor, std::string& failure);
};

#endif  // DADATABASEPARSER_H
