#ifndef DAQUERYREQUEST_H
#define DAQUERYREQUEST_H

#include <string>
#include <utility>
#include <vector>

#include "DAOwnedString.h"
#include "DASelectRequest.h"

/// Sort keys in call order: column name and true for descending.
using DAOrderKeys = std::vector<std::pair<std::string, bool>>;

/// A select (table, conditions) whose rows come sorted and a page at a
/// time (DADatabase::Query). Everything of DASelectRequest holds; sort keys
/// and the page are its own.
///
/// Sort-key names are copied at the call (unlike value-map keys), and are
/// written into SQL as given: use column names the application controls.
class DAQueryRequest : public DASelectRequest {
public:
    DAQueryRequest() = default;
    ~DAQueryRequest() override = default;

    /// Appends column as the next sort key (ascending unless descending),
    /// under the member lock of the key list, so several threads may add
    /// keys. The name is copied. A null column is refused: nothing is
    /// stored and the error line "NULL COLUMN NAME, SORT KEY NOT STORED" is
    /// logged. Keys are never removed; a column given twice is listed twice.
    void SetOrderBy(char const* column, bool descending = false);

    /// At most count rows after skipping offset rows; replaces an earlier
    /// page. A negative count means no limit (the rows after offset); a
    /// negative offset counts as 0. Takes no lock, like SetTable.
    void SetLimit(int count, int offset = 0);

    /// Replaces keys by the sort keys in call order; leaves it untouched
    /// when no key is set.
    void GetOrderBy(DAOrderKeys& keys);

    /// Assigns the page of the last SetLimit to count (-1 for no limit) and
    /// offset (0 or more); leaves both untouched when SetLimit was never
    /// called.
    void GetLimit(int& count, int& offset);

private:
    std::vector<std::pair<DAOwnedString, bool>> m_orderBy;
    bool m_hasLimit = false;
    int m_limitCount = -1;
    int m_limitOffset = 0;
};

#endif  // DAQUERYREQUEST_H
