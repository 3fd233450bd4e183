#ifndef DASQLGENERATOR_H
#define DASQLGENERATOR_H

#include <string>

#include "DACreateRequest.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
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

    /// GetSelectSql's text for the same table and conditions, then
    /// " ORDER BY a, b DESC" when sort keys are set, then " LIMIT n OFFSET m"
    /// when a page is set (" LIMIT n" when the offset is 0; n is -1 when only
    /// an offset is given, and nothing is added for no limit and no offset).
    void GetQuerySql(DAQueryRequest& request, std::string& sql);

    /// "SELECT  * FROM l INNER JOIN r ON l.lc = r.rc[ WHERE ...]"
    void GetJoinSql(DAJoinRequest& request, std::string& sql);

    /// "INSERT OR REPLACE INTO t (a, b) VALUES ('1', '2')"
    void GetUpsertSql(DAUpsertRequest& request, std::string& sql);

    /// "UPDATE t SET a = '1', b = '2' WHERE c='3'" (" WHERE " always written)
    void GetUpdateSql(DAUpdateRequest& request, std::string& sql);

    /// "DELETE  FROM t[ WHERE c='3']"
    void GetDeleteSql(DADeleteRequest& request, std::string& sql);
};

#endif  // DASQLGENERATOR_H
