#ifndef DABASESET_H
#define DABASESET_H

#include <cstdint>
#include <map>
#include <string>

#include "DABasePath.h"

/// Column name (the caller's pointer, compared by address) to value text.
using DAValueMap = std::map<char const*, std::string>;

/// A database location plus two value maps: the data map (values to write)
/// and the where map (equality conditions). Base of the table requests and
/// of DAJoinRequest.
///
/// Keys are the caller's column-name pointers, never copied: keep each name
/// alive and unchanged while the request, or a map copied out of it, is in
/// use (string literals do). Keys compare by address, so statements list
/// columns in ascending address order. The first value stored under a key
/// stays; later ones are dropped silently. Entries are never removed.
///
/// Every setter holds the map's member lock (a DAMutex named after the map's
/// address) for the insertion, so several threads may fill one request.
/// Getters take no lock: finish filling before reading.
class DABaseSet : public DABasePath {
public:
    DABaseSet();
    ~DABaseSet() override = default;

    ///@{
    /// Store value's text under column in the data map. Text is stored as
    /// given (no quotes, no escaping); int and double are written by a
    /// default std::ostringstream (-42, 2.5, 1.23457e+06).
    /// A null column is refused: nothing is stored and one error line is
    /// logged. A null text value throws std::logic_error, map unchanged.
    void SetData(char const* column, char const* value);
    void SetData(char const* column, int value);
    void SetData(char const* column, double value);
    ///@}
    /// Stores the plain decimal text of a 64-bit value under column in the
    /// data map ("-9223372036854775808", "1700000000000"): no digit
    /// grouping, whatever the global locale. Same lock, null-column line
    /// and first-value-wins rule as the other setters. Chosen for
    /// std::int64_t arguments; int and double keep their own overloads.
    void SetData(char const* column, std::int64_t value);

    ///@{
    /// The same for the where map.
    void SetWhere(char const* column, char const* value);
    void SetWhere(char const* column, int value);
    void SetWhere(char const* column, double value);
    ///@}
    /// The 64-bit setter for the where map.
    void SetWhere(char const* column, std::int64_t value);

    ///@{
    /// Replace out by a copy of the data map / where map.
    void GetDataMap(DAValueMap& out);
    void GetWhereMap(DAValueMap& out);
    ///@}

private:
    DAValueMap m_dataMap;
    DAValueMap m_whereMap;
};

#endif  // DABASESET_H
