#ifndef DASTEPROWS_H
#define DASTEPROWS_H

#include <string>

#include <sqlite3.h>

#include "DADatabaseParser.h"
#include "DAParseRows.h"

// What a read does with one row of stmt: SQLITE_ROW to go on, SQLITE_DONE
// to end the read there, any other code to end it as a failure.
using DARowSink = int (*)(void* user, sqlite3_stmt* stmt);

// The parser's step loop, which every read of rows runs (DAParseRows and
// the typed reads): steps stmt under parser's busy-retry rule, calls
// onStart(user) after the first step that was not busy, and hands each row
// to onRow(user, stmt). With mayBeStale, a statement found older than the
// schema at that first step returns kDAStaleStatement (DAParseRows.h)
// before onStart, nothing logged. Returns SQLITE_DONE after the last row or when
// onRow ends the read; otherwise the failure's code with its text in
// failure, as DADatabaseParser::ParseRows states (its lines, under
// ParseDatabase, included; a sink's code gets sqlite3_errstr's text).
int DAStepRows(DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, std::string& failure, void* user,
               bool mayBeStale, void (*onStart)(void* user), DARowSink onRow);

#endif  // DASTEPROWS_H
