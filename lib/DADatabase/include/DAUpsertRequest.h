#ifndef DAUPSERTREQUEST_H
#define DAUPSERTREQUEST_H

#include <string>
#include <vector>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Insert-or-replace of one row (DADatabase::Upsert).
/// Reads the data map; the where map is ignored. With conflict keys
/// (AddConflictKey) the row found by them is updated in place instead of
/// replaced.
/// The table name must be an identifier the caller controls: it is written
/// into SQL as given.
class DAUpsertRequest : public DABaseSet {
public:
    DAUpsertRequest() = default;
    ~DAUpsertRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

    /// Adds a unique column that identifies the row, in call order. With
    /// keys the statement is "INSERT INTO t (k, v, n) VALUES ('a', 'x',
    /// '1') ON CONFLICT(k) DO UPDATE SET v = excluded.v, n = excluded.n":
    /// every data column but the keys in the insert's column order, then
    /// the increments ("c = c + 1"; on a first insert their delta is the
    /// value), "DO NOTHING" when only keys are set. The row keeps its rowid
    /// and the columns the request does not name. Without keys the
    /// statement is "INSERT OR REPLACE" as ever. The name is copied under
    /// the key list's member lock; one that is not a plain name is refused
    /// with the error line "INVALID COLUMN NAME, KEY NOT STORED". A key
    /// that is not a unique column fails at the operation with SQLite's
    /// code and text.
    void AddConflictKey(char const* column);

    /// Replaces keys by a copy of the conflict keys in call order.
    void GetConflictKeys(std::vector<std::string>& keys);

private:
    DAOwnedString m_table;
    std::vector<std::string> m_keys;
};

#endif  // DAUPSERTREQUEST_H
