#ifndef DAUPSERTREQUEST_H
#define DAUPSERTREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Insert-or-replace of one row (DADatabase::Upsert).
/// Reads the data map; the where map is ignored.
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

private:
    DAOwnedString m_table;
};

#endif  // DAUPSERTREQUEST_H
