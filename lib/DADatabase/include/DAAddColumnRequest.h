#ifndef DAADDCOLUMNREQUEST_H
#define DAADDCOLUMNREQUEST_H

#include <string>

#include "DABasePath.h"
#include "DAOwnedString.h"

/// A column to add to an existing table (DADatabase::AddColumn): the table,
/// the column's name and type, and an optional default for the rows already
/// there and those written without it.
///
/// The table, column and type are copied at the call and must each be one
/// plain name (letters, digits, '_' and bytes from 0x80 up, not starting
/// with a digit: "INTEGER", "TEXT", "REAL"), since they are written into
/// SQL unquoted. Any other text, null included, is refused: nothing is
/// stored (by SetColumn, neither part) and the error line "INVALID NAME,
/// NOT STORED" is logged.
class DAAddColumnRequest : public DABasePath {
public:
    DAAddColumnRequest() = default;
    ~DAAddColumnRequest() override = default;

    /// Replaces the table by a copy of table.
    void SetTable(char const* table);

    /// Replaces the column's name and type by copies of column and type.
    void SetColumn(char const* column, char const* type);

    /// Replaces the default by a copy of value, which may be any text (it
    /// is written as an SQL text literal, quotes doubled). A null value
    /// changes nothing.
    void SetDefault(char const* value);

    /// Assigns the table; leaves table untouched when unset.
    void GetTable(std::string& table);

    /// Assigns the column's name and type; touches neither when unset.
    void GetColumn(std::string& column, std::string& type);

    /// Assigns the default and returns true; returns false and leaves value
    /// untouched when no default is set.
    bool GetDefault(std::string& value);

private:
    DAOwnedString m_table;
    DAOwnedString m_column;
    DAOwnedString m_type;
    DAOwnedString m_default;
};

#endif  // DAADDCOLUMNREQUEST_H
