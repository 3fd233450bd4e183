#include "DASqlLiteral.h"

#include <array>
#include <charconv>
#include <cstring>

namespace {

constexpr std::size_t kByteValues = 256;

}  // namespace

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
    // Both digits of each byte at once: a 1 MiB blob is 2 M digits.
    static const std::array<char, 2 * kByteValues> kPairs = [] {
        const char* const hex = "0123456789ABCDEF";
        std::array<char, 2 * kByteValues> pairs{};
        for (std::size_t byte = 0; byte < kByteValues; ++byte) {
            pairs[2 * byte] = hex[byte >> 4U];
            pairs[2 * byte + 1] = hex[byte & 0xFU];
        }
        return pairs;
    }();
    const std::size_t start = sql.size();
    sql.resize(start + 2 * size + 3);
    char* out = &sql[start];
    *out++ = 'X';
    *out++ = '\'';
    for (std::size_t i = 0; i < size; ++i, out += 2) {
        std::memcpy(out, &kPairs[2 * static_cast<std::size_t>(bytes[i])], 2);
    }
    *out = '\'';
}

std::string DANumberText(double value)
{
    std::array<char, 32> text{};
    const std::to_chars_result result = std::to_chars(text.data(), text.data() + text.size(), value);
    return {text.data(), result.ptr};  // 24 characters at most
}
