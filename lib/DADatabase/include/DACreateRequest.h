#ifndef DACREATEREQUEST_H
#define DACREATEREQUEST_H

#include <string>
#include <utility>
#include <vector>

#include "DABasePath.h"
#include "DAOwnedString.h"

/// Column name (the caller's pointer) and its type text, in declaration order.
using DAColumnList = std::vector<std::pair<char const*, std::string>>;

/// A table to create (DADatabase::CreateTable): its name, an optional
/// primary key, an optional composite key (used only with a primary key) and
/// further columns. Names and type texts are written into SQL as given:
/// they must be identifiers and types the caller controls.
///
/// Column names in the column list are the caller's pointers, not copied:
/// keep them alive while the request, or a list copied out of it, is in use.
class DACreateRequest : public DABasePath {
public:
    ///@{
    /// Takes the column-list lock once around emptying the (new) list.
    DACreateRequest();
    ~DACreateRequest() override = default;
    ///@}

    /// Stores a copy of table; a null table changes nothing.
    void SetTable(char const* table);

    ///@{
    /// Each non-null argument replaces its part; a null one leaves it as is.
    void SetPrimaryKey(char const* column, char const* type);
    void SetCompositeKey(char const* column, char const* type);
    ///@}

    /// Appends (column, copy of type) under the column-list lock, never
    /// looking for an earlier entry of the same column. A null column is
    /// refused: nothing is appended and one error line is logged. A null
    /// type throws std::logic_error, list unchanged.
    void SetColumnKey(char const* column, char const* type);

    /// Assigns the table name; leaves table untouched when unset.
    void GetTable(std::string& table);

    ///@{
    /// Assign both parts of the key only when both are set; otherwise
    /// neither output is touched.
    void GetPrimaryKey(std::string& column, std::string& type);
    void GetCompositeKey(std::string& column, std::string& type);
    ///@}

    /// Replaces columns by a copy of the column list. No lock.
    void GetColumnKey(DAColumnList& columns);

private:
    DAOwnedString m_table;
    DAOwnedString m_primaryKeyColumn;
    DAOwnedString m_primaryKeyType;
    DAOwnedString m_compositeKeyColumn;
    DAOwnedString m_compositeKeyType;
    DAColumnList m_columnKeys;
};

#endif  // DACREATEREQUEST_H
