#ifndef DABASESET_H
#define DABASESET_H

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <type_traits>
#include <vector>

#include "DABasePath.h"
#include "DAOwnedString.h"
#include "DAValue.h"

/// Column name (the caller's pointer, compared by address) to value text.
using DAValueMap = std::map<char const*, std::string>;

/// The comparison of a listed condition (DABaseSet::SetWhere with an
/// operator): =, <>, <, <=, >, >= and LIKE, and the literal text matches
/// Contains, StartsWith and EndsWith (text values only): the value is
/// matched as typed, '%', '_' and '\\' included, written as "body LIKE
/// '%50\\%%' ESCAPE '\\'". Their case folding is SQLite's LIKE's: ASCII
/// letters only. For words in any language use full-text search.
enum class DACompare { Equal, NotEqual, Less, LessEqual, Greater, GreaterEqual, Like, Contains, StartsWith, EndsWith };

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

    /// A value of the data part that is not text: NULL, bytes, or an
    /// increment.
    struct TypedValue {
        char const* column = nullptr;  ///< the caller's column-name pointer
        bool null = true;  ///< NULL; otherwise the blob in bytes (or an increment)
        std::vector<unsigned char> bytes;  ///< the blob's bytes
        bool increment = false;  ///< column = column + delta
        std::int64_t delta = 0;  ///< the increment's delta
    };

    /// Sets column to column + delta: "unread = unread + 1" in an update
    /// ("unread = unread - 1" for -1), and delta itself (unquoted) where
    /// an insert writes the row. The rules and line of SetNull.
    void SetIncrement(char const* column, std::int64_t delta);

    /// Sets column to NULL in the data part: written NULL in the statement.
    /// Column names are kept by pointer as for SetData, and one pointer
    /// stands once in the data part: the first value set under it wins,
    /// whichever setter (SetData, SetNull, SetBlob) set it. Typed values
    /// are written after the data map's columns, in call order. A null or
    /// non-plain column name (see SetWhere with an operator) is refused
    /// with the error line "INVALID COLUMN NAME, VALUE NOT STORED".
    /// Holds the data map's member lock.
    void SetNull(char const* column);

    /// Sets column to a blob of the size bytes at data, copied at the call:
    /// written X'89504E47' (upper-case hex) in the statement, X'' when size
    /// is 0 (data may then be null). The rules of SetNull; a null data with
    /// a size is refused with the error line "NULL BLOB, NOT STORED".
    /// Throws nothing but std::bad_alloc (nothing stored then).
    void SetBlob(char const* column, void const* data, std::size_t size);

    /// Replaces out by a copy of the typed values in call order.
    void GetTypedData(std::vector<TypedValue>& out);

    ///@{
    /// The same for the where map.
    void SetWhere(char const* column, char const* value);
    void SetWhere(char const* column, int value);
    void SetWhere(char const* column, double value);
    ///@}
    /// The 64-bit setter for the where map.
    void SetWhere(char const* column, std::int64_t value);

    ///@{
    /// Every other integer type (short, long, long long, the unsigned ones,
    /// so every fixed-width alias and std::size_t): its exact decimal text,
    /// whatever the global locale ("18446744073709551615"), with the rules
    /// of the std::int64_t setters.
    template <typename Integer, std::enable_if_t<DAIsOtherInteger<Integer>::value, int> = 0>
    void SetData(char const* column, Integer value)
    {
        SetInteger(Target::Data, column, DACompare::Equal, value);
    }
    template <typename Integer, std::enable_if_t<DAIsOtherInteger<Integer>::value, int> = 0>
    void SetWhere(char const* column, Integer value)
    {
        SetInteger(Target::Where, column, DACompare::Equal, value);
    }
    ///@}

    ///@{
    /// Appends the condition "column op value" to the listed conditions,
    /// kept in call order beside the where map (whose rules are untouched)
    /// and written after its equalities, all joined by " AND ". Text is
    /// written as a quoted literal; numbers unquoted, in the classic locale
    /// (integers exactly, doubles as the shortest text that reads back
    /// equal), so SQLite compares them as numbers. Takes the list's member
    /// lock. The column is copied and must be a plain name (letters,
    /// digits, '_', bytes from 0x80 up, no leading digit, optionally
    /// "table.column"); otherwise nothing is stored and the error line
    /// "INVALID COLUMN NAME, CONDITION NOT STORED" is logged. A null text
    /// is refused with "NULL VALUE, CONDITION NOT STORED", a NaN or
    /// infinite double with "INVALID NUMBER, CONDITION NOT STORED". Throws
    /// nothing but std::bad_alloc (the list is then unchanged).
    void SetWhere(char const* column, DACompare op, char const* value);
    void SetWhere(char const* column, DACompare op, int value);
    void SetWhere(char const* column, DACompare op, std::int64_t value);
    void SetWhere(char const* column, DACompare op, double value);
    template <typename Integer, std::enable_if_t<DAIsOtherInteger<Integer>::value, int> = 0>
    void SetWhere(char const* column, DACompare op, Integer value)
    {
        SetInteger(Target::Condition, column, op, value);
    }
    ///@}

    /// Appends "column IN ('a', 'b')" (values as quoted literals, "IN ()"
    /// for none) to the listed conditions, with the rules above.
    void SetWhereIn(char const* column, std::vector<std::string> const& values);

    /// Appends "column IS NULL", or "column IS NOT NULL" when isNull is
    /// false, to the listed conditions, with the rules above.
    void SetWhereNull(char const* column, bool isNull = true);

    /// Appends the row-value comparison "(ts, _ID)<(1700000000123, 42)" to
    /// the listed conditions: for keyset pages that never skip or repeat a
    /// row when many rows share a time stamp. Column names are copied and
    /// must be plain; values are written as DAValue writes them. op must be
    /// Less, LessEqual, Greater, GreaterEqual, Equal or NotEqual. Refused,
    /// nothing stored, with one error line: a column that is not plain
    /// ("INVALID COLUMN NAME, CONDITION NOT STORED"), counts that differ or
    /// are 0 ("COLUMN AND VALUE COUNTS DIFFER, CONDITION NOT STORED"),
    /// another op ("INVALID OPERATOR, CONDITION NOT STORED"), a value that
    /// cannot be written (its DAValue::GetFailure line).
    void SetWhereRow(std::vector<char const*> const& columns, DACompare op, std::vector<DAValue> const& values);

    /// Empties the data part: the data map and every value SetNull, SetBlob
    /// and SetIncrement added. Under the data map's member lock.
    void ClearData();

    /// Empties the where part: the where map (under its member lock) and
    /// the listed conditions (under theirs).
    void ClearWhere();

    /// One listed condition, as the generator writes it.
    struct Condition {
        /// What the condition tests; Row: columns op values, each value as
        /// its SQL text.
        enum class Form { Compare, In, Null, NotNull, Row };
        std::string column;  ///< the plain column name
        Form form = Form::Compare;  ///< the kind of condition
        DACompare op = DACompare::Equal;  ///< the comparison, for Form::Compare
        std::vector<std::string> values;  ///< one value to compare with, or the IN list
        bool number = false;  ///< the one value is a number, written unquoted
        std::vector<std::string> columns;  ///< the columns of a Row comparison
    };

    /// Replaces out by a copy of the listed conditions in call order.
    void GetConditions(std::vector<Condition>& out);

    ///@{
    /// Replace out by a copy of the data map / where map.
    void GetDataMap(DAValueMap& out);
    void GetWhereMap(DAValueMap& out);
    ///@}

private:
    friend struct DARequestParts;  // the statement writer reads the parts without copying them

    // Which setter family an integer of another type came through.
    enum class Target { Data, Where, Condition };

    template <typename Integer>
    void SetInteger(Target target, char const* column, DACompare op, Integer value)
    {
        if constexpr (std::is_signed<Integer>::value) {
            SetWide(target, column, op, static_cast<std::int64_t>(value));
        } else {
            SetWide(target, column, op, static_cast<std::uint64_t>(value));
        }
    }
    void SetWide(Target target, char const* column, DACompare op, std::int64_t value);
    void SetWide(Target target, char const* column, DACompare op, std::uint64_t value);

    // Stores a listed condition whose column the caller checked.
    void AddCondition(char const* column, Condition::Form form, DACompare op, std::vector<std::string> values,
                      bool number, const char* func);

    // A listed condition with its column owned by the request.
    struct StoredCondition {
        DAOwnedString column;
        Condition::Form form;
        DACompare op;
        std::vector<std::string> values;
        bool number;
        std::vector<std::string> columns;
    };

    // Stores a typed value under the data map's lock unless its column
    // already has a value.
    void AddTyped(TypedValue value, const char* func);

    DAValueMap m_dataMap;
    DAValueMap m_whereMap;
    std::vector<TypedValue> m_typed;  // guarded by m_dataMap's lock
    std::vector<StoredCondition> m_conditions;
};

#endif  // DABASESET_H
