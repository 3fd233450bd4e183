#include "DARow.h"

#include <array>
#include <charconv>
#include <cmath>
#include <cstring>

#include "DALog.h"
#include "DATypedStore.h"

namespace {

const char* const kTypeNames[] = {"NULL", "INTEGER", "REAL", "TEXT", "BLOB"};

// The name a by-name read's lines give its column.
const char* Label(const char* column)
{
    return column != nullptr ? column : "(null)";
}

// A value as the reads see it: its type, its 8 bytes, and for a text or
// blob its bytes in the arena.
struct Value {
    DAValueType type;
    std::uint64_t bits;
    const unsigned char* bytes;
    std::uint32_t size;

    std::int64_t Integer() const { return static_cast<std::int64_t>(bits); }
    double Real() const
    {
        double real = 0;
        std::memcpy(&real, &bits, sizeof real);
        return real;
    }
};

Value ValueAt(const DATypedStore& store, long cell)
{
    const auto at = static_cast<std::size_t>(cell);
    Value value{static_cast<DAValueType>(store.types[at]), store.values[at], nullptr, 0};
    if ((value.type == DAValueType::Text || value.type == DAValueType::Blob) && store.live) {
        value.size = static_cast<std::uint32_t>(value.bits);
        value.bytes = store.viewed[at];
    } else if (value.type == DAValueType::Text || value.type == DAValueType::Blob) {
        std::memcpy(&value.size, &store.arena[value.bits], sizeof value.size);
        value.bytes = store.arena.data() + value.bits + sizeof value.size;
    }
    return value;
}

// 2^63, the first double beyond the 64-bit integers.
constexpr double kTwoTo63 = 9223372036854775808.0;

// The conversions of the reads: false for a type that does not convert.
bool ToInt64(const Value& stored, std::int64_t& out)
{
    if (stored.type == DAValueType::Integer) {
        out = stored.Integer();
        return true;
    }
    const double real = stored.Real();
    if (stored.type != DAValueType::Real || !(real >= -kTwoTo63 && real < kTwoTo63) || std::trunc(real) != real) {
        return false;
    }
    out = static_cast<std::int64_t>(real);
    return true;
}

bool ToDouble(const Value& stored, double& out)
{
    if (stored.type != DAValueType::Integer && stored.type != DAValueType::Real) {
        return false;
    }
    out = stored.type == DAValueType::Integer ? static_cast<double>(stored.Integer()) : stored.Real();
    return true;
}

bool ToString(const Value& stored, std::string& out)
{
    std::array<char, 32> text{};
    switch (stored.type) {
    case DAValueType::Text:
        out.assign(reinterpret_cast<const char*>(stored.bytes), stored.size);
        return true;
    case DAValueType::Integer:
        out.assign(text.data(), std::to_chars(text.data(), text.data() + text.size(), stored.Integer()).ptr);
        return true;
    case DAValueType::Real:
        // SQLite's own rendering of a real as text.
        sqlite3_snprintf(static_cast<int>(text.size()), text.data(), "%!.15g", stored.Real());
        out = text.data();
        return true;
    default:
        return false;
    }
}

bool ToBlob(const Value& stored, std::vector<unsigned char>& out)
{
    if (stored.type != DAValueType::Text && stored.type != DAValueType::Blob) {
        return false;
    }
    out.assign(stored.bytes, stored.bytes + stored.size);
    return true;
}

}  // namespace

int DARow::GetColumnCount() const
{
    return m_store != nullptr ? static_cast<int>(m_store->names.size()) : 0;
}

char const* DARow::GetColumnName(int index) const
{
    return index >= 0 && index < GetColumnCount() ? m_store->names[static_cast<std::size_t>(index)].c_str() : nullptr;
}

int DARow::GetColumnIndex(char const* column) const
{
    const int count = GetColumnCount();
    for (int i = 0; column != nullptr && i < count; ++i) {
        if (m_store->names[static_cast<std::size_t>(i)] == column) {
            return i;
        }
    }
    return -1;
}

long DARow::Cell(int index, char const* column, const char* func) const
{
    const int count = GetColumnCount();
    if (m_store == nullptr || m_store->position < 0 || m_store->position >= m_store->rows) {
        if (func != nullptr) {
            DA_LOG_AT(DLOG_ERROR, func, "CURSOR RANGE ERROR!!!");
        }
        return -1;
    }
    if (index < 0 || index >= count) {
        if (func != nullptr && column != nullptr) {
            DA_LOG_AT(DLOG_ERROR, func, "NO COLUMN %s", column);
        } else if (func != nullptr) {
            DA_LOG_AT(DLOG_ERROR, func, "NO COLUMN %d", index);
        }
        return -1;
    }
    return static_cast<long>(m_store->position) * count + index;
}

DAValueType DARow::GetType(char const* column) const
{
    return GetType(GetColumnIndex(column));
}

DAValueType DARow::GetType(int index) const
{
    const long cell = Cell(index, nullptr, nullptr);
    return cell < 0 ? DAValueType::Null : static_cast<DAValueType>(m_store->types[static_cast<std::size_t>(cell)]);
}

bool DARow::IsNull(char const* column) const
{
    return IsNull(GetColumnIndex(column));
}

bool DARow::IsNull(int index) const
{
    const long cell = Cell(index, nullptr, nullptr);
    return cell >= 0 && m_store->types[static_cast<std::size_t>(cell)] == static_cast<unsigned char>(DAValueType::Null);
}

// Every read: the value, then NULL (1, no line), then convert(value, out),
// which is false for a type that does not convert (1, the line).
template <typename Out, typename Convert>
int DARow::Read(int index, char const* column, Out& value, const char* func, Convert convert) const
{
    const long cell = Cell(index, column, func);
    if (cell < 0) {
        return 1;
    }
    const Value stored = ValueAt(*m_store, cell);
    if (stored.type == DAValueType::Null) {
        return 1;
    }
    if (!convert(stored, value)) {
        DA_LOG_AT(DLOG_ERROR, func, "COLUMN %s IS %s, NOT CONVERTED",
                  column != nullptr ? column : m_store->names[static_cast<std::size_t>(index)].c_str(),
                  kTypeNames[static_cast<int>(stored.type)]);
        return 1;
    }
    return 0;
}

int DARow::GetInt64(char const* column, std::int64_t& value) const
{
    return Read(GetColumnIndex(column), Label(column), value, __func__, ToInt64);
}

int DARow::GetInt64(int index, std::int64_t& value) const
{
    return Read(index, nullptr, value, __func__, ToInt64);
}

int DARow::GetDouble(char const* column, double& value) const
{
    return Read(GetColumnIndex(column), Label(column), value, __func__, ToDouble);
}

int DARow::GetDouble(int index, double& value) const
{
    return Read(index, nullptr, value, __func__, ToDouble);
}

int DARow::GetString(char const* column, std::string& value) const
{
    return Read(GetColumnIndex(column), Label(column), value, __func__, ToString);
}

int DARow::GetString(int index, std::string& value) const
{
    return Read(index, nullptr, value, __func__, ToString);
}

int DARow::GetBlob(char const* column, std::vector<unsigned char>& value) const
{
    return Read(GetColumnIndex(column), Label(column), value, __func__, ToBlob);
}

int DARow::GetBlob(int index, std::vector<unsigned char>& value) const
{
    return Read(index, nullptr, value, __func__, ToBlob);
}
