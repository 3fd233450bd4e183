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
    const std::size_t start = sql.size();
    sql.resize(start + 2 * size + 3);
    auto* out = reinterpret_cast<unsigned char*>(&sql[start]);
    *out++ = 'X';
    *out++ = '\'';
    // Digits computed, not looked up: the loop over a 1 MiB blob vectorizes.
    const auto digit = [](unsigned nibble) {
        return static_cast<unsigned char>(nibble + '0' + (nibble > 9U ? 7U : 0U));
    };
    for (std::size_t i = 0; i < size; ++i) {
        out[2 * i] = digit(bytes[i] >> 4U);
        out[2 * i + 1] = digit(bytes[i] & 0xFU);
    }
    out[2 * size] = '\'';
}

std::string DANumberText(double value)
{
    std::array<char, 32> text{};
    const std::to_chars_result result = std::to_chars(text.data(), text.data() + text.size(), value);
    return {text.data(), result.ptr};  // 24 characters at most
}
