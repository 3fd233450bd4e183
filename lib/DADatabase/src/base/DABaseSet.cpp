#include "DABaseSet.h"

#include <array>
#include <charconv>
#include <locale>
#include <sstream>
#include <stdexcept>
#include <system_error>

#include "DALog.h"
#include "DAMemberLock.h"

namespace {

std::string ValueText(char const* value)
{
    if (value == nullptr) {
        throw std::logic_error("DABaseSet: a null value cannot be stored");
    }
    return value;
}

// to_chars in the shape of a default stream: integers plain, doubles as %.6g.
template <typename Integer>
std::to_chars_result ClassicChars(char* first, char* last, Integer value)
{
    return std::to_chars(first, last, value);
}

std::to_chars_result ClassicChars(char* first, char* last, double value)
{
    return std::to_chars(first, last, value, std::chars_format::general, 6);
}

// A number's text by to_chars: what a stream writes under the classic
// locale (to_chars is specified as printf's %d and %.6g in the C locale).
template <typename Number>
bool CharsText(Number value, std::string& out)
{
    std::array<char, 32> text{};
    const std::to_chars_result result = ClassicChars(text.data(), text.data() + text.size(), value);
    if (result.ec != std::errc()) {
        return false;
    }
    out.assign(text.data(), result.ptr);
    return true;
}

template <typename Number>
std::string ValueText(Number value)
{
    // Without a stream while the global locale is the classic one: building
    // a stream per value cost more than the rest of a setter, and bulk
    // writes fill many requests.
    std::string text;
    if (std::locale() == std::locale::classic() && CharsText(value, text)) {
        return text;
    }
    std::ostringstream stream;
    stream << value;
    return stream.str();
}

// 64-bit values never go through a stream, so a time stamp never picks up
// the digit grouping of the global locale.
std::string ValueText(std::int64_t value)
{
    std::string text;
    CharsText(value, text);  // 32 characters always suffice
    return text;
}

// The one insertion all the setters make: refuse a null column, then build
// the text and insert it if the key is new, all under the map's lock.
template <typename Value>
void Store(DAValueMap& map, char const* column, Value value, const char* func)
{
    if (column == nullptr) {
        DA_LOG_AT(DLOG_ERROR, func, "NULL COLUMN NAME, VALUE NOT STORED");
        return;
    }
    const DAMemberLock lock(&map, DA_FILE_NAME, func, __LINE__);
    map.emplace(column, ValueText(value));
}

}  // namespace

DABaseSet::DABaseSet()
{
    DA_MEMBER_LOCK(m_dataMap);
    m_dataMap.clear();
    m_whereMap.clear();
}

void DABaseSet::SetData(char const* column, char const* value)
{
    Store(m_dataMap, column, value, __func__);
}

void DABaseSet::SetData(char const* column, int value)
{
    Store(m_dataMap, column, value, __func__);
}

void DABaseSet::SetData(char const* column, double value)
{
    Store(m_dataMap, column, value, __func__);
}

void DABaseSet::SetData(char const* column, std::int64_t value)
{
    Store(m_dataMap, column, value, __func__);
}

void DABaseSet::SetWhere(char const* column, char const* value)
{
    Store(m_whereMap, column, value, __func__);
}

void DABaseSet::SetWhere(char const* column, int value)
{
    Store(m_whereMap, column, value, __func__);
}

void DABaseSet::SetWhere(char const* column, double value)
{
    Store(m_whereMap, column, value, __func__);
}

void DABaseSet::SetWhere(char const* column, std::int64_t value)
{
    Store(m_whereMap, column, value, __func__);
}

void DABaseSet::GetDataMap(DAValueMap& out)
{
    out = m_dataMap;
}

void DABaseSet::GetWhereMap(DAValueMap& out)
{
    out = m_whereMap;
}
