#ifndef DASQLGENERATOR_H
#define DASQLGENERATOR_H

#include <string>

#include "DAAddColumnRequest.h"
#include "DABasePath.h"
#include "DACreateIndexRequest.h"
#include "DACreateRequest.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAInsertRequest.h"
#include "DAJoinRequest.h"
#include "DAQueryRequest.h"
#include "DASelectRequest.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

/// Writes the database path and the one SQL statement each request stands
/// for. Holds no state and takes no lock; reads requests only through their
/// getters. Every operation assigns its result to its last parameter as its
/// final step (on std::bad_alloc the parameter keeps its old content).
///
/// Names (tables, columns, types) are written exactly as given. Values, and
/// the table name of the existence statement, are written as SQL text
/// literals with any single quote doubled, so every text round-trips.
/// Incomplete requests still produce text (which SQLite then rejects).
///
/// Conditions: the where map's equalities ("a='1'", map order), then the
/// listed conditions in call order ("ts<1700000000000", "name LIKE 'K%'",
/// "k IN ('a', 'b')", "v IS NULL"; numbers unquoted), joined by " AND "
/// after " WHERE "; written the same way by every statement that takes
/// conditions, and left out when there is none (but by the update).
class DASqlGenerator {
public:
    DASqlGenerator() = default;
    virtual ~DASqlGenerator() = default;

    /// dir + "/" + file, without the "/" when dir is empty or ends in "/".
    void GetDBPath(std::string dir, std::string file, std::string& path);

    /// "SELECT COUNT(*) from sqlite_master WHERE TYPE='table' AND NAME='t'"
    void GetCheckTableSql(std::string table, std::string& sql);

    /// "DROP TABLE t"
    void GetDropTableSql(DADropRequest& request, std::string& sql);

    /// "CREATE TABLE IF NOT EXISTS t (...)" in one of three shapes: an
    /// _ID INTEGER PRIMARY KEY column without a primary key; "k T NOT NULL
    /// PRIMARY KEY" with one; both key columns and "PRIMARY KEY(k, s)" with a
    /// primary and a composite key. A key counts only when both of its texts
    /// are non-empty.
    void GetCreateTableSql(DACreateRequest& request, std::string& sql);

    /// "SELECT * FROM t[ WHERE a='1' AND b='2']"
    void GetSelectSql(DASelectRequest& request, std::string& sql);

    /// GetSelectSql's text for the same table and conditions (with the
    /// select list, when one is set, in place of "*": "SELECT type,
    /// COUNT(*) AS n FROM ..."), then " GROUP BY a, b" when groups are set,
    /// then
    /// " ORDER BY a, b DESC" when sort keys are set, then " LIMIT n OFFSET m"
    /// when a page is set (" LIMIT n" when the offset is 0; n is -1 when only
    /// an offset is given, and nothing is added for no limit and no offset).
    void GetQuerySql(DAQueryRequest& request, std::string& sql);

    /// "SELECT  * FROM l INNER JOIN r ON l.lc = r.rc[ WHERE ...]"
    void GetJoinSql(DAJoinRequest& request, std::string& sql);

    /// "INSERT OR REPLACE INTO t (a, b) VALUES ('1', '2')"; typed values
    /// (DABaseSet::SetNull, SetBlob) follow the data map's columns in call
    /// order: "INSERT OR REPLACE INTO t (a, p, e) VALUES ('1', X'89504E47',
    /// NULL)". The same for GetInsertSql and GetUpdateSql ("SET e = NULL").
    void GetUpsertSql(DAUpsertRequest& request, std::string& sql);

    /// "UPDATE t SET a = '1', b = '2' WHERE c='3'" (" WHERE " always written)
    void GetUpdateSql(DAUpdateRequest& request, std::string& sql);

    /// "DELETE  FROM t[ WHERE c='3']"
    void GetDeleteSql(DADeleteRequest& request, std::string& sql);

    /// "CREATE INDEX IF NOT EXISTS i ON t (a DESC, b)", "CREATE UNIQUE INDEX
    /// IF NOT EXISTS ..." when unique; columns in AddColumn order.
    void GetCreateIndexSql(DACreateIndexRequest& request, std::string& sql);

    /// "ALTER TABLE t ADD COLUMN c TYPE", then " DEFAULT 'v'" when a default
    /// is set.
    void GetAddColumnSql(DAAddColumnRequest& request, std::string& sql);

    /// "VACUUM": rewrites location's file without its free pages.
    void GetCompactSql(DABasePath& location, std::string& sql);
    /// "INSERT INTO t (a, b) VALUES ('1', '2')" (GetUpsertSql's shape), or
    /// "INSERT OR IGNORE INTO ..." when the request ignores existing rows.
    void GetInsertSql(DAInsertRequest& request, std::string& sql);
};

#endif  // DASQLGENERATOR_H
