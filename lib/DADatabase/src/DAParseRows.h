#ifndef DAPARSEROWS_H
#define DAPARSEROWS_H

#include <string>

#include <sqlite3.h>

#include "DACursor.h"
#include "DADatabaseParser.h"

// DAParseRows's result for a statement that is older than the schema: see
// below.
constexpr int kDAStaleStatement = -1;

// DADatabaseParser::ParseRows, stepping under parser's busy-retry rule, with
// one more way out for a statement a held connection prepared earlier
// (mayBeStale): when its first step fails because the schema changed under
// it and it cannot be prepared again (its table is gone), returns
// kDAStaleStatement with nothing logged and cursor untouched, so that the
// caller prepares the text anew and fails, if it does, as a fresh
// connection would.
int DAParseRows(DADatabaseParser& parser, sqlite3* db, sqlite3_stmt* stmt, DACursor& cursor, std::string& failure,
                bool mayBeStale);

#endif  // DAPARSEROWS_H
