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
#include "DASearchIndexRequest.h"
#include "DASearchRequest.h"
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

    /// The statements of a search index (DASearchIndexRequest lists what
    /// they add), ';'-separated, in this order: "CREATE VIRTUAL TABLE IF
    /// NOT EXISTS ulo_search_i USING fts5(a, b, tokenize='unicode61
    /// remove_diacritics 2', prefix='2 3')" (Substrings: "tokenize='trigram'"),
    /// the rows of t not yet held ("INSERT INTO ulo_search_i(rowid, a, b)
    /// SELECT rowid, a, b FROM t WHERE rowid NOT IN (...)"), then the
    /// triggers "CREATE TRIGGER IF NOT EXISTS ulo_search_i_insert AFTER
    /// INSERT ON t ...", "..._update AFTER UPDATE ON t WHEN ..." (the rowid
    /// or an indexed column changed) and "..._delete AFTER DELETE ON t ...".
    /// Each trigger first deletes the entry of the old and the new rowid,
    /// then inserts the new row's, so an INSERT OR REPLACE keeps the index
    /// in step whatever recursive_triggers says.
    void GetCreateSearchIndexSql(DASearchIndexRequest& request, std::string& sql);

    /// "DROP TRIGGER IF EXISTS ulo_search_i_insert; ..._update; ..._delete;
    /// DROP TABLE IF EXISTS ulo_search_i": everything the index added.
    void GetDropSearchIndexSql(std::string name, std::string& sql);

    /// "SELECT t.*, ulo_hit.s FROM t JOIN (SELECT rowid AS ulo_rowid, rank
    /// AS ulo_rank, snippet(ulo_search_i, ...) AS s FROM ulo_search_i WHERE
    /// ulo_search_i MATCH '\"cafe\" \"au\"*') AS ulo_hit ON t.rowid =
    /// ulo_hit.ulo_rowid" (the select list in place of "t.*" when set), then
    /// GetQuerySql's conditions, groups, " ORDER BY ulo_hit.ulo_rank" (best
    /// first) unless sort keys are set, and page.
    ///
    /// The text is cut into words at white space (ASCII, U+00A0, U+3000);
    /// each word becomes an FTS5 string (double quotes doubled), which the
    /// index splits as it splits its text ("e-mail" finds the words e and
    /// mail in a row), all of them required, the last with "*" when
    /// GetPrefixLast; no word at all is the query "\"\"", which matches
    /// nothing. A word shorter than 3 characters cannot be found through
    /// trigrams: when there is one, the operand is a CASE that, for a
    /// Substrings index, looks up the whole text (trimmed) as one substring
    /// instead, and matches nothing when that is shorter than 3 characters.
    void GetSearchSql(DASearchRequest& request, std::string& sql);
};

#endif  // DASQLGENERATOR_H
