#ifndef DASQLITEHANDLES_H
#define DASQLITEHANDLES_H

#include <memory>

#include <sqlite3.h>

// Owners for what SQLite hands out, so every way out of an operation
// releases it. Declare the connection first: the statement and the error
// text are then released before it is closed.
struct DAConnectionCloser {
    void operator()(sqlite3* db) const { sqlite3_close(db); }
};
struct DAStatementFinalizer {
    void operator()(sqlite3_stmt* stmt) const { sqlite3_finalize(stmt); }
};
struct DASqliteFree {
    void operator()(char* text) const { sqlite3_free(text); }
};

// An online backup, finished (its error then on the destination).
struct DABackupFinisher {
    void operator()(sqlite3_backup* backup) const { sqlite3_backup_finish(backup); }
};

using DAConnection = std::unique_ptr<sqlite3, DAConnectionCloser>;
using DAStatement = std::unique_ptr<sqlite3_stmt, DAStatementFinalizer>;
using DAErrorText = std::unique_ptr<char, DASqliteFree>;
using DABackup = std::unique_ptr<sqlite3_backup, DABackupFinisher>;

#endif  // DASQLITEHANDLES_H
