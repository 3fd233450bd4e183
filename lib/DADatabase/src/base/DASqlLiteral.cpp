#include "DASqlLiteral.h"

#include <array>
#include <charconv>

void DAAppendTextLiteral(std::string& sql, const std::string& value)
{
    sql.reserve(sql.size() + value.size() + 2);
    sql += '\'';
    // Copied in runs between quotes: batches write many of these.
    std::string::size_type from = 0;
    for (auto quote = value.find('\''); quote != std::string::npos; quote = value.find('\'', from)) {
        sql.append(value, from, quote + 1 - from) += '\'';
        from = quote + 1;
    }
    sql.append(value, from, std::string::npos) += '\'';
}

void DAAppendBlobLiteral(std::string& sql, const unsigned char* bytes, std::size_t size)
{
    static const char kHex[] = "0123456789ABCDEF";
    const std::size_t start = sql.size();
    sql.resize(start + 2 * size + 3);
    char* out = &sql[start];
    *out++ = 'X';
    *out++ = '\'';
    for (std::size_t i = 0; i < size; ++i) {
        *out++ = kHex[bytes[i] >> 4U];
        *out++ = kHex[bytes[i] & 0xFU];
    }
    *out = '\'';
}

std::string DANumberText(double value)
{
    std::array<char, 32> text{};
    const std::to_chars_result result = std::to_chars(text.data(), text.data() + text.size(), value);
    return {text.data(), result.ptr};  // 24 characters at most
}
