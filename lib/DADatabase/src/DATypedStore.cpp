#include "DATypedStore.h"

#include <cstring>

void DATypedStore::Clear(bool keepNames)
{
    if (!keepNames) {
        names.clear();
    }
    types.clear();
    values.clear();
    arena.clear();
    rows = 0;
    position = -1;
}

void DATypedStore::TakeNames(sqlite3_stmt* stmt)
{
    const int count = sqlite3_column_count(stmt);
    names.clear();
    names.reserve(static_cast<std::size_t>(count));
    for (int i = 0; i < count; ++i) {
        const char* name = sqlite3_column_name(stmt, i);
        names.emplace_back(name != nullptr ? name : "");
    }
}

int DATypedStore::Append(sqlite3_stmt* stmt)
{
    if (names.empty()) {
        TakeNames(stmt);
    }
    const auto count = static_cast<int>(names.size());
    for (int i = 0; i < count; ++i) {
        const int type = sqlite3_column_type(stmt, i);
        std::uint64_t value = 0;
        DAValueType stored = DAValueType::Null;
        if (type == SQLITE_INTEGER) {
            stored = DAValueType::Integer;
            value = static_cast<std::uint64_t>(sqlite3_column_int64(stmt, i));
        } else if (type == SQLITE_FLOAT) {
            stored = DAValueType::Real;
            const double real = sqlite3_column_double(stmt, i);
            std::memcpy(&value, &real, sizeof value);
        } else if (type == SQLITE_TEXT || type == SQLITE_BLOB) {
            stored = type == SQLITE_TEXT ? DAValueType::Text : DAValueType::Blob;
            // The pointer first, then the size: the order SQLite asks for.
            const void* bytes = type == SQLITE_TEXT ? static_cast<const void*>(sqlite3_column_text(stmt, i))
                                                    : sqlite3_column_blob(stmt, i);
            const auto size = static_cast<std::uint32_t>(sqlite3_column_bytes(stmt, i));
            if (bytes == nullptr && (size > 0 || type == SQLITE_TEXT)) {
                return SQLITE_NOMEM;  // an empty blob has no pointer; anything else is out of memory
            }
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
