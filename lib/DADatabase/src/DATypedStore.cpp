#include "DATypedStore.h"

#include <cstring>

namespace {

// The arena's room at the first row: the texts of a typical row.
constexpr std::size_t kFirstRowBytes = 256;

// Holds the connection's mutex over the reads of a row: each sqlite3_column_
// call would take it again, and a column's value read under it is
// protected (sqlite3_value_ reads are allowed on it).
class RowLock {
public:
    explicit RowLock(sqlite3_stmt* stmt) : m_mutex(sqlite3_db_mutex(sqlite3_db_handle(stmt)))
    {
        sqlite3_mutex_enter(m_mutex);
    }
    ~RowLock() { sqlite3_mutex_leave(m_mutex); }
    RowLock(const RowLock&) = delete;
    RowLock& operator=(const RowLock&) = delete;

private:
    sqlite3_mutex* m_mutex;  // null for a connection without one: a no-op
};

// The value of column i of stmt's row (read under a RowLock): its type,
// its 8 bytes, and for a text or blob its bytes and size. False when
// SQLite could not give them.
bool ReadValue(sqlite3_stmt* stmt, int i, DAValueType& stored, std::uint64_t& value, const unsigned char*& bytes,
               std::uint32_t& size)
{
    sqlite3_value* column = sqlite3_column_value(stmt, i);
    const int type = sqlite3_value_type(column);
    value = 0;
    stored = DAValueType::Null;
    if (type == SQLITE_INTEGER) {
        stored = DAValueType::Integer;
        value = static_cast<std::uint64_t>(sqlite3_value_int64(column));
    } else if (type == SQLITE_FLOAT) {
        stored = DAValueType::Real;
        const double real = sqlite3_value_double(column);
        std::memcpy(&value, &real, sizeof value);
    } else if (type == SQLITE_TEXT || type == SQLITE_BLOB) {
        stored = type == SQLITE_TEXT ? DAValueType::Text : DAValueType::Blob;
        // The pointer first, then the size: the order SQLite asks for.
        bytes = static_cast<const unsigned char*>(
            type == SQLITE_TEXT ? static_cast<const void*>(sqlite3_value_text(column)) : sqlite3_value_blob(column));
        size = static_cast<std::uint32_t>(sqlite3_value_bytes(column));
        // An empty blob has no pointer; anything else is out of memory.
        return bytes != nullptr || (size == 0 && type == SQLITE_BLOB);
    }
    return true;
}

}  // namespace

void DATypedStore::Clear()
{
    types.clear();
    values.clear();
    arena.clear();
    viewed.clear();
    live = false;
    rows = 0;
    position = -1;
}

namespace {

// Unused capacity below this stays: small results are not copied again,
// and a cursor queried again keeps its room.
constexpr std::size_t kSpareBytes = 4096;

template <typename T>
void FitVector(std::vector<T>& buffer)
{
    if ((buffer.capacity() - buffer.size()) * sizeof(T) > kSpareBytes) {
        buffer.shrink_to_fit();
    }
}

}  // namespace

void DATypedStore::Fit()
{
    FitVector(types);
    FitVector(values);
    FitVector(arena);
}

void DATypedStore::TakeNames(sqlite3_stmt* stmt)
{
    const auto count = static_cast<std::size_t>(sqlite3_column_count(stmt));
    std::size_t same = 0;
    if (names.size() == count) {
        for (; same < count; ++same) {
            const char* name = sqlite3_column_name(stmt, static_cast<int>(same));
            if (std::strcmp(names[same].c_str(), name != nullptr ? name : "") != 0) {
                break;
            }
        }
    }
    if (same == count) {
        return;
    }
    names.clear();
    names.reserve(count);
    for (std::size_t i = 0; i < count; ++i) {
        const char* name = sqlite3_column_name(stmt, static_cast<int>(i));
        names.emplace_back(name != nullptr ? name : "");
    }
}

int DATypedStore::Append(sqlite3_stmt* stmt)
{
    if (rows == 0) {
        TakeNames(stmt);
    }
    const auto count = static_cast<int>(names.size());
    if (rows == 0) {  // a one-row result (a read by key) allocates each buffer once
        types.reserve(names.size());
        values.reserve(names.size());
        arena.reserve(kFirstRowBytes);
    }
    const RowLock lock(stmt);
    for (int i = 0; i < count; ++i) {
        DAValueType stored = DAValueType::Null;
        std::uint64_t value = 0;
        const unsigned char* bytes = nullptr;
        std::uint32_t size = 0;
        if (!ReadValue(stmt, i, stored, value, bytes, size)) {
            return SQLITE_NOMEM;
        }
        if (stored == DAValueType::Text || stored == DAValueType::Blob) {
            value = arena.size();
            arena.resize(arena.size() + sizeof size + size);
            std::memcpy(&arena[value], &size, sizeof size);
            if (size > 0) {
                std::memcpy(&arena[value + sizeof size], bytes, size);
            }
        }
        types.push_back(static_cast<unsigned char>(stored));
        values.push_back(value);
    }
    ++rows;
    return SQLITE_ROW;
}

int DATypedStore::View(sqlite3_stmt* stmt)
{
    if (names.empty()) {
        TakeNames(stmt);
    }
    const std::size_t count = names.size();
    types.resize(count);
    values.resize(count);
    viewed.resize(count);
    live = true;
    rows = 1;
    position = 0;
    const RowLock lock(stmt);
    for (std::size_t i = 0; i < count; ++i) {
        DAValueType stored = DAValueType::Null;
        std::uint32_t size = 0;
        viewed[i] = nullptr;
        if (!ReadValue(stmt, static_cast<int>(i), stored, values[i], viewed[i], size)) {
            return SQLITE_NOMEM;
        }
        types[i] = static_cast<unsigned char>(stored);
        if (stored == DAValueType::Text || stored == DAValueType::Blob) {
            values[i] = size;
        }
    }
    return SQLITE_ROW;
}
