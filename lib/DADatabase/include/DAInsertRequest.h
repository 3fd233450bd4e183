#ifndef DAINSERTREQUEST_H
#define DAINSERTREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Insert of one new row (DADatabase::Insert): "INSERT INTO t (a, b) VALUES
/// ('1', '2')", or "INSERT OR IGNORE INTO ..." when an existing row is to
/// be kept. Reads the data map; the where map and listed conditions are
/// ignored. The table name must be an identifier the caller controls: it
/// is written into SQL as given.
class DAInsertRequest : public DABaseSet {
public:
    DAInsertRequest() = default;
    ~DAInsertRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

    /// With ignore, a row whose key (or other unique constraint) clashes
    /// with an existing one is skipped instead of failing with 19. Takes no
    /// lock, like SetTable.
    void SetIgnoreExisting(bool ignore = true);

    /// Whether clashing rows are skipped (false until SetIgnoreExisting).
    bool GetIgnoreExisting() const { return m_ignoreExisting; }

private:
    DAOwnedString m_table;
    bool m_ignoreExisting = false;
};

#endif  // DAINSERTREQUEST_H
