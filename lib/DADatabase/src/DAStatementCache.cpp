#include "DAStatementCache.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace {

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

bool DASplitLiterals(const char* sql, std::string& shape, DASqlParams& values)
{
    if (!StartsWithDml(sql)) {
        return false;
    }
    shape.clear();
    shape.reserve(std::strlen(sql));
    values.Clear();
    return DASplitAppend(sql, shape, values);
}

bool DASplitAppend(const char* piece, std::string& shape, DASqlParams& values)
{
    std::string text;
    for (const char* c = piece; *c != '\0';) {
        const bool glued = c != piece && (IsNameByte(static_cast<unsigned char>(c[-1])) || c[-1] == '.');
        DAParamKind kind = DAParamKind::Text;
        std::int64_t integer = 0;
        text.clear();
        if (!glued && c[0] == 'X' && c[1] == '\'') {
            c = ReadBlob(c, text);
            if (c == nullptr) {
                return false;
            }
            kind = DAParamKind::Blob;
        } else if (!glued && IsNullValue(c, shape)) {
            kind = DAParamKind::Null;
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
                text.append(c, quote);
                c = quote + 1;
                if (*c != '\'') {
                    break;
                }
                text += '\'';  // a doubled quote
            }
        } else if (*c >= '0' && *c <= '9' && !glued) {
            // The whole number: digits, a fraction, an exponent.
            const char* end = c + std::strspn(c, "0123456789");
            const bool whole = *end != '.' && *end != 'e' && *end != 'E';
            end += *end == '.' ? 1 + std::strspn(end + 1, "0123456789") : 0;
            if (*end == 'e' || *end == 'E') {
                ++end;
                end += *end == '+' || *end == '-' ? 1 : 0;
                end += std::strspn(end, "0123456789");
            }
            errno = 0;
            integer = std::strtoll(c, nullptr, 10);
            // Leading zeros stay too: a value taken out is written back
            // as the integer's own digits.
            if (!whole || errno == ERANGE || (c[0] == '0' && end - c > 1)) {
                shape.append(c, end);
                c = end;
                continue;
            }
            kind = DAParamKind::Integer;
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
        if (IsNameByte(static_cast<unsigned char>(*c)) || values.Count() == kDAMaxParams) {
            return false;  // a literal glued to a name, or too many
        }
        if (kind == DAParamKind::Integer) {
            values.AddInteger(integer);
        } else {
            values.Add(kind, text.data(), text.size());
        }
        shape += '?';
    }
    return true;
}

sqlite3_stmt* DAStatementCache::Take(const char* shape)
{
    for (auto entry = m_entries.begin(); entry != m_entries.end(); ++entry) {
        if (std::strcmp(sqlite3_sql(entry->get()), shape) == 0) {
            sqlite3_stmt* stmt = entry->release();
            m_entries.erase(entry);
            return stmt;
        }
    }
    return nullptr;
}

void DAStatementCache::Put(sqlite3_stmt* stmt) noexcept
{
    DAStatement owned(stmt);
    sqlite3_reset(stmt);
    sqlite3_clear_bindings(stmt);
    try {
        if (m_entries.size() == kCapacity) {
            m_entries.pop_back();
        }
        m_entries.insert(m_entries.begin(), std::move(owned));
    } catch (...) {  // std::bad_alloc: the statement goes (owned finalizes it)
    }
}
