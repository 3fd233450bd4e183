#ifndef DASELECTREQUEST_H
#define DASELECTREQUEST_H

#include <string>

#include "DABaseSet.h"
#include "DAOwnedString.h"

/// Select of every column of one table, narrowed by the where map (DADatabase::Select).
/// Reads the where map; the data map is ignored.
/// The table name must be an identifier the caller controls: it is written
/// into SQL as given.
class DASelectRequest : public DABaseSet {
public:
    DASelectRequest() = default;
    ~DASelectRequest() override = default;

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    /// Assigns the table name to table; leaves it untouched when unset.
    void GetTable(std::string& table);

private:
    DAOwnedString m_table;
};

#endif  // DASELECTREQUEST_H
