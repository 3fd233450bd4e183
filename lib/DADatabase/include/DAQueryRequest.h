#ifndef DAQUERYREQUEST_H
#define DAQUERYREQUEST_H

#include <string>
#include <utility>
#include <vector>

#include "DAOwnedString.h"
#include "DASelectRequest.h"

/// The aggregate functions of a select list: COUNT, MIN, MAX, SUM, AVG.
enum class DAAggregate { Count, Min, Max, Sum, Avg };

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
    /// logged; so is any other name that is not a plain name (see
    /// AddColumn), with "INVALID COLUMN NAME, SORT KEY NOT STORED". Keys are never removed; a column given twice is
    /// listed twice.
    void SetOrderBy(char const* column, bool descending = false);

    /// At most count rows after skipping offset rows; replaces an earlier
    /// page. A negative count means no limit (the rows after offset); a
    /// negative offset counts as 0. Takes no lock, like SetTable.
    void SetLimit(int count, int offset = 0);

    /// Replaces keys by the sort keys in call order; leaves it untouched
    /// when no key is set.
    void GetOrderBy(DAOrderKeys& keys);

    /// Drops every sort key (under the sort-key list's member lock), so one
    /// request serves page after page.
    void ClearOrderBy();

    /// Drops the limit and offset: the whole result again.
    void ClearLimit();

    /// Assigns the page of the last SetLimit to count (-1 for no limit) and
    /// offset (0 or more); leaves both untouched when SetLimit was never
    /// called.
    void GetLimit(int& count, int& offset);

    /// Appends column to the select list, which replaces "*" once it holds
    /// anything. The name is copied under the list's member lock; one that
    /// is not a plain name (letters, digits, '_', bytes from 0x80 up, no
    /// leading digit, optionally "table.column") is refused: nothing is
    /// stored and the error line "INVALID COLUMN NAME, COLUMN NOT STORED"
    /// is logged. Throws nothing but std::bad_alloc.
    void AddColumn(char const* column);

    /// Appends "FUNCTION(column) AS as" to the select list ("COUNT(*) AS
    /// as" for Count with a null column), with AddColumn's rules and line;
    /// a null column for another function, or an alias that is null or not
    /// an unqualified plain name, is refused the same way. Sort by the
    /// alias with SetOrderBy(as).
    void AddAggregate(DAAggregate function, char const* column, char const* as);

    /// Appends column to the GROUP BY list, with AddColumn's rules; the
    /// refusal line is "INVALID COLUMN NAME, GROUP NOT STORED".
    void AddGroupBy(char const* column);

    /// One select-list item.
    struct SelectItem {
        bool aggregate = false;  ///< an aggregate, else a plain column
        DAAggregate function = DAAggregate::Count;  ///< the aggregate's function
        std::string column;  ///< the column; "" for COUNT(*)
        std::string as;  ///< the aggregate's alias
    };

    /// Replaces out by the select list in call order (empty: "*").
    void GetColumns(std::vector<SelectItem>& out);

    /// Replaces out by the GROUP BY columns in call order.
    void GetGroupBy(std::vector<std::string>& out);

private:
    // The one insertion of AddColumn (aggregate false) and AddAggregate.
    void AddAggregate(DAAggregate function, char const* column, char const* as, bool aggregate, const char* func);

    struct StoredItem {
        bool aggregate;
        DAAggregate function;
        DAOwnedString column;
        DAOwnedString as;
    };

    std::vector<std::pair<DAOwnedString, bool>> m_orderBy;
    bool m_hasLimit = false;
    int m_limitCount = -1;
    int m_limitOffset = 0;
    std::vector<StoredItem> m_columns;
    std::vector<DAOwnedString> m_groupBy;
};

#endif  // DAQUERYREQUEST_H
