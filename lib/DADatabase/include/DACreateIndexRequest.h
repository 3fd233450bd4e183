#ifndef DACREATEINDEXREQUEST_H
#define DACREATEINDEXREQUEST_H

#include <string>
#include <utility>
#include <vector>

#include "DABasePath.h"
#include "DAOwnedString.h"

/// Indexed columns in call order: column name and true for descending.
using DAIndexColumns = std::vector<std::pair<std::string, bool>>;

/// An index to create (DADatabase::CreateIndex): its name, its table, its
/// columns in order, and whether it is unique.
///
/// Every name is copied at the call and must be a plain name (letters,
/// digits, '_' and bytes from 0x80 up, not starting with a digit), since it
/// is written into SQL unquoted. Any other name, null included, is refused:
/// nothing is stored and the error line "INVALID NAME, NOT STORED" is
/// logged.
class DACreateIndexRequest : public DABasePath {
public:
    DACreateIndexRequest() = default;
    ~DACreateIndexRequest() override = default;

    ///@{
    /// Replaces the table, or the index's own name, by a copy of the text.
    void SetTable(char const* table);
    void SetName(char const* name);
    ///@}

    /// Appends column as the next indexed column (ascending unless
    /// descending), under the member lock of the column list, so several
    /// threads may add columns. A column given twice is listed twice.
    void AddColumn(char const* column, bool descending = false);

    /// Whether the index refuses two rows with equal values in its columns
    /// (false unless set).
    void SetUnique(bool unique);

    ///@{
    /// Assigns the table, or the index's name; leaves the output untouched
    /// when unset.
    void GetTable(std::string& table);
    void GetName(std::string& name);
    ///@}

    /// Replaces columns by the indexed columns in call order; leaves it
    /// untouched when none is set. No lock.
    void GetColumns(DAIndexColumns& columns);

    /// The last SetUnique, false before any.
    bool IsUnique() const { return m_unique; }

private:
    DAOwnedString m_table;
    DAOwnedString m_name;
    std::vector<std::pair<DAOwnedString, bool>> m_columns;
    bool m_unique = false;
};

#endif  // DACREATEINDEXREQUEST_H
