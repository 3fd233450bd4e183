#include "DAStatementCache.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace {

constexpr std::size_t kMaxLiterals = 999;

bool IsNameByte(unsigned char byte)
{
    return (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') || (byte >= '0' && byte <= '9') ||
        byte == '_' || byte >= 0x80;
}

bool StartsWithDml(const char* sql)
{
    for (const char* verb : {"SELECT ", "INSERT ", "UPDATE ", "DELETE "}) {
        if (std::strncmp(sql, verb, std::strlen(verb)) == 0) {
            return true;
        }
    }
    return false;
}

// The value of an upper-case hex digit: '0'-'9' keep their low four bits,
// 'A'-'F' (0x41-0x46) add 9 to theirs. Branch-free, so that the compiler
// vectorizes the read of a 1 MiB blob's 2 M digits.
unsigned HexValue(unsigned char digit)
{
    return (digit & 0xFU) + 9U * (digit >> 6U);
}

// Reads the blob literal X'..' at c into bytes; returns its end, or null
// when it is not one (odd or lower-case digits: the text runs as written).
const char* ReadBlob(const char* c, std::string& bytes)
{
    const char* digits = c + 2;
    const std::size_t count = std::strspn(digits, "0123456789ABCDEF");
    const char* end = digits + count;
    if (*end != '\'' || count % 2 != 0) {
        return nullptr;
    }
    bytes.resize(count / 2);
    const auto* in = reinterpret_cast<const unsigned char*>(digits);
    auto* out = reinterpret_cast<unsigned char*>(bytes.data());
    for (std::size_t i = 0; i < count / 2; ++i) {
        out[i] = static_cast<unsigned char>(HexValue(in[2 * i]) << 4U | HexValue(in[2 * i + 1]));
    }
    return end + 1;
}

// A NULL where a value stands: after "(", "," or "=" (spaces skipped), not
// the NULL of "IS NULL".
bool IsNullValue(const char* c, const std::string& shape)
{
    if (std::strncmp(c, "NULL", 4) != 0 || IsNameByte(static_cast<unsigned char>(c[4]))) {
        return false;
    }
    const std::string::size_type before = shape.find_last_not_of(' ');
    return before != std::string::npos && std::strchr("(,=", shape[before]) != nullptr;
}

// The bytes at which a literal, or a text that runs as written, may begin;
// any other byte is copied into the shape as it is.
bool MayStartSomething(char c)
{
    switch (c) {
    case '\0':
    case 'X':
    case 'N':
    case '\'':
    case '-':
    case '/':
    case ';':
    case '"':
    case '`':
    case '[':
    case '?':
    case ':':
    case '@':
    case '$':
        return true;
    default:
        return c >= '0' && c <= '9';
    }
}

}  // namespace

bool DASplitLiterals(const char* sql, std::string& shape, std::vector<DALiteral>& values)
{
    if (!StartsWithDml(sql)) {
        return false;
    }
    shape.clear();
    shape.reserve(std::strlen(sql));
    values.clear();
    for (const char* c = sql; *c != '\0';) {
        const bool glued = c != sql && (IsNameByte(static_cast<unsigned char>(c[-1])) || c[-1] == '.');
        DALiteral literal;
        if (!glued && c[0] == 'X' && c[1] == '\'') {
            c = ReadBlob(c, literal.text);
            if (c == nullptr) {
                return false;
            }
            literal.kind = DALiteral::Kind::Blob;
        } else if (!glued && IsNullValue(c, shape)) {
            literal.kind = DALiteral::Kind::Null;
            c += 4;
        } else if (*c == '\'') {
            if (glued) {  // x'00' is a blob
                return false;
            }
            for (++c;; ++c) {
                const char* quote = std::strchr(c, '\'');
                if (quote == nullptr) {
                    return false;  // unterminated: SQLite says so
                }
                literal.text.append(c, quote);
                c = quote + 1;
                if (*c != '\'') {
                    break;
                }
                literal.text += '\'';  // a doubled quote
            }
        } else if (*c >= '0' && *c <= '9' && !glued) {
            // The whole number: digits, a fraction, an exponent.
            const char* end = c + std::strspn(c, "0123456789");
            const bool integer = *end != '.' && *end != 'e' && *end != 'E';
            literal.kind = integer ? DALiteral::Kind::Integer : DALiteral::Kind::Text;
            end += *end == '.' ? 1 + std::strspn(end + 1, "0123456789") : 0;
            if (*end == 'e' || *end == 'E') {
                ++end;
                end += *end == '+' || *end == '-' ? 1 : 0;
                end += std::strspn(end, "0123456789");
            }
            literal.text.assign(c, end);
            errno = 0;
            std::strtoll(c, nullptr, 10);
            if (!integer || errno == ERANGE) {
                shape += literal.text;
                c = end;
                continue;
            }
            c = end;
        } else if (std::strchr(";\"`[?:@$", *c) != nullptr || (c[0] == '-' && c[1] == '-') ||
                   (c[0] == '/' && c[1] == '*')) {
            return false;
        } else {
            // This byte starts nothing here, and neither do those after it
            // up to the next that may.
            const char* end = c + 1;
            while (!MayStartSomething(*end)) {
                ++end;
            }
            shape.append(c, end);
            c = end;
            continue;
        }
        if (IsNameByte(static_cast<unsigned char>(*c)) || values.size() == kMaxLiterals) {
            return false;  // a literal glued to a name, or too many
        }
        values.push_back(std::move(literal));
        shape += '?';
    }
    return true;
}

int DABindLiterals(sqlite3_stmt* stmt, const std::vector<DALiteral>& values)
{
    int rc = SQLITE_OK;
    for (std::size_t i = 0; rc == SQLITE_OK && i < values.size(); ++i) {
        const DALiteral& value = values[i];
        const int index = static_cast<int>(i + 1);
        const auto size = static_cast<sqlite3_uint64>(value.text.size());
        switch (value.kind) {
        case DALiteral::Kind::Integer:
            rc = sqlite3_bind_int64(stmt, index, std::strtoll(value.text.c_str(), nullptr, 10));
            break;
        case DALiteral::Kind::Null:
            rc = sqlite3_bind_null(stmt, index);
            break;
        case DALiteral::Kind::Blob:
            rc = sqlite3_bind_blob64(stmt, index, value.text.data(), size, SQLITE_STATIC);
            break;
        case DALiteral::Kind::Text:
            rc = sqlite3_bind_text64(stmt, index, value.text.data(), size, SQLITE_STATIC, SQLITE_UTF8);
            break;
        }
    }
    return rc;
}

sqlite3_stmt* DAStatementCache::Take(const std::string& shape)
{
    for (auto entry = m_entries.begin(); entry != m_entries.end(); ++entry) {
        if (entry->first == shape) {
            sqlite3_stmt* stmt = entry->second.release();
            m_entries.erase(entry);
            return stmt;
        }
    }
    return nullptr;
}

void DAStatementCache::Put(const std::string& shape, sqlite3_stmt* stmt) noexcept
{
    DAStatement owned(stmt);
    sqlite3_reset(stmt);
    sqlite3_clear_bindings(stmt);
    try {
        if (m_entries.size() == kCapacity) {
            m_entries.pop_back();
        }
        m_entries.emplace(m_entries.begin(), shape, std::move(owned));
    } catch (...) {  // std::bad_alloc: the statement goes (owned finalizes it)
    }
}
