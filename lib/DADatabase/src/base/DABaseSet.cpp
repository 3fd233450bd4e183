#include "DABaseSet.h"

#include <charconv>
#include <sstream>
#include <stdexcept>

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

template <typename Number>
std::string ValueText(Number value)
{
    std::ostringstream stream;
    stream << value;
    return stream.str();
}

// 64-bit values are written without the stream: to_chars ignores the
// locale, so a time stamp never picks up digit grouping.
std::string ValueText(std::int64_t value)
{
    char text[24];  // "-9223372036854775808" is 20 characters
    const std::to_chars_result end = std::to_chars(text, text + sizeof text, value);
    return {text, end.ptr};
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
