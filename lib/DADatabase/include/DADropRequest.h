#ifndef DADROPREQUEST_H
#define DADROPREQUEST_H

#include <string>

#include "DABasePath.h"
#include "DAOwnedString.h"

/// A database location and the name of the table to drop
/// (DADatabase::DropTable). Names must be identifiers the caller controls:
/// they are written into SQL as given.
class DADropRequest : public DABasePath {
public:
    DADropRequest() = default;
    ~DADropRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

private:
    DAOwnedString m_table;
};

#endif  // DADROPREQUEST_H
