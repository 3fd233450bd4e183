#ifndef DADELETEREQUEST_H
#define DADELETEREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Delete of the rows matching the where map (DADatabase::Delete).
/// Reads the where map; with none, every row is deleted. The data map is ignored.
/// The table name must be an identifier the caller controls: it is written
/// into SQL as given.
class DADeleteRequest : public DABaseSet {
public:
    DADeleteRequest() = default;
    ~DADeleteRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

private:
    DAOwnedString m_table;
};

#endif  // DADELETEREQUEST_H
