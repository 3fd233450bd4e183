#ifndef DAUPDATEREQUEST_H
#define DAUPDATEREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Update of the rows matching the where map (DADatabase::Update).
/// Reads the data map (values to set) and the where map (at least one condition is needed for valid SQL).
/// The table name must be an identifier the caller controls: it is written
/// into SQL as given.
class DAUpdateRequest : public DABaseSet {
public:
    DAUpdateRequest() = default;
    ~DAUpdateRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

private:
    DAOwnedString m_table;
};

#endif  // DAUPDATEREQUEST_H
