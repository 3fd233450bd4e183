#ifndef DAVALUE_H
#define DAVALUE_H

#include <cstddef>
#include <cstdint>
#include <string>
#include <type_traits>

/// The type of a value as SQLite stores it.
enum class DAValueType { Null, Integer, Real, Text, Blob };

/// Whether Integer is an integer type that the int and std::int64_t
/// overloads of DABaseSet do not take exactly: short, long, long long and
/// the unsigned types, but not bool, the character types, int or
/// std::int64_t (those keep the overloads they always picked).
template <typename Integer>
struct DAIsOtherInteger
    : std::integral_constant<bool,
                             std::is_integral<Integer>::value && !std::is_same<Integer, bool>::value &&
                                 !std::is_same<Integer, char>::value && !std::is_same<Integer, signed char>::value &&
                                 !std::is_same<Integer, unsigned char>::value &&
                                 !std::is_same<Integer, wchar_t>::value && !std::is_same<Integer, char16_t>::value &&
                                 !std::is_same<Integer, char32_t>::value && !std::is_same<Integer, int>::value &&
                                 !std::is_same<Integer, std::int64_t>::value> {
};

/// A small typed value, for row-value comparisons (DABaseSet::SetWhereRow):
/// NULL, a 64-bit integer, a double, a text or a blob. Implicit from every
/// integer type, double, char const* and std::string; DAValue::Null() and
/// DAValue::Blob() make the other two. Copies what it is given at
/// construction and writes it at once as SQL does: integers and doubles
/// unquoted in the classic locale (a double as the shortest text that
/// reads back equal), texts as quoted literals (quotes doubled), blobs as
/// X'00FF' (upper-case hex), NULL. An unsigned value above 2^63-1 is
/// written as its exact decimal (SQLite reads it as a real). A value that
/// cannot be written (a null text, NaN or an infinity, a null blob with a
/// size) is kept as such and refused where it is used. Copyable; throws
/// nothing but std::bad_alloc.
class DAValue {
public:
    ///@{
    /// The value given, written at once (see above). Implicit by design: a
    /// list of values reads as {ts, id}.
    // NOLINTBEGIN(google-explicit-constructor, hicpp-explicit-conversions)
    DAValue(std::int64_t value);
    DAValue(int value) : DAValue(static_cast<std::int64_t>(value)) {}
    template <typename Integer, std::enable_if_t<DAIsOtherInteger<Integer>::value, int> = 0>
    DAValue(Integer value)
    {
        if constexpr (std::is_signed<Integer>::value) {
            *this = DAValue(static_cast<std::int64_t>(value));
        } else {
            SetUnsigned(static_cast<std::uint64_t>(value));
        }
    }
    DAValue(double value);
    DAValue(char const* text);
    DAValue(std::string const& text);
    // NOLINTEND(google-explicit-constructor, hicpp-explicit-conversions)
    ///@}

    /// NULL.
    static DAValue Null();
    /// The size bytes at data; data may be null when size is 0.
    static DAValue Blob(void const* data, std::size_t size);

    /// The value's type (Null also for a value that cannot be written).
    DAValueType GetType() const { return m_type; }

    /// The value as it stands in SQL ("42", "'it''s'", "X'00FF'", "NULL"),
    /// or "" for a value that cannot be written.
    std::string const& GetSql() const { return m_sql; }

    /// Null when the value can be written; else the error line that refuses
    /// it ("NULL VALUE, CONDITION NOT STORED", "INVALID NUMBER, CONDITION
    /// NOT STORED", "NULL BLOB, CONDITION NOT STORED").
    char const* GetFailure() const { return m_failure; }

private:
    DAValue() = default;
    void SetUnsigned(std::uint64_t value);

    DAValueType m_type = DAValueType::Null;
    std::string m_sql = "NULL";
    char const* m_failure = nullptr;
};

#endif  // DAVALUE_H
