#include "DABaseSet.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <locale>
#include <sstream>
#include <stdexcept>
#include <system_error>

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

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

std::string ValueText(std::uint64_t value)
{
    std::string text;
    CharsText(value, text);
    return text;
}

// A number in a listed condition: to_chars always, so the SQL never
// depends on the global locale; a double as the shortest text that reads
// back as the same double, so the comparison is exact.
template <typename Integer>
std::string NumberText(Integer value)
{
    std::string text;
    CharsText(value, text);
    return text;
}

std::string NumberText(double value)
{
    std::array<char, 32> text{};
    const std::to_chars_result result = std::to_chars(text.data(), text.data() + text.size(), value);
    return {text.data(), result.ptr};  // 24 characters at most
}

// The checks of every listed condition, in this order: a plain column
// name, then a usable value (valueFailure names what is wrong with it).
bool Accepted(char const* column, const char* valueFailure, const char* func)
{
    if (!DAIsPlainName(column, true)) {
        DA_LOG_AT(DLOG_ERROR, func, "INVALID COLUMN NAME, CONDITION NOT STORED");
        return false;
    }
    if (valueFailure != nullptr) {
        DA_LOG_AT(DLOG_ERROR, func, "%s", valueFailure);
        return false;
    }
    return true;
}

bool HasColumn(const std::vector<DABaseSet::TypedValue>& typed, char const* column)
{
    return std::any_of(typed.begin(), typed.end(),
                       [column](const DABaseSet::TypedValue& value) { return value.column == column; });
}

// The one insertion all the setters make: refuse a null column, then build
// the text and insert it if the key is new, all under the map's lock. A
// data map's column set already by a typed setter (typed holds them, under
// the same lock) keeps that value.
template <typename Value>
void Store(DAValueMap& map, char const* column, Value value, const char* func,
           const std::vector<DABaseSet::TypedValue>* typed = nullptr)
{
    if (column == nullptr) {
        DA_LOG_AT(DLOG_ERROR, func, "NULL COLUMN NAME, VALUE NOT STORED");
        return;
    }
    const DAMemberLock lock(&map, DA_FILE_NAME, func, __LINE__);
    if (typed == nullptr || typed->empty() || !HasColumn(*typed, column)) {
        map.emplace(column, ValueText(value));
    }
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
    Store(m_dataMap, column, value, __func__, &m_typed);
}

void DABaseSet::SetData(char const* column, int value)
{
    Store(m_dataMap, column, value, __func__, &m_typed);
}

void DABaseSet::SetData(char const* column, double value)
{
    Store(m_dataMap, column, value, __func__, &m_typed);
}

void DABaseSet::SetData(char const* column, std::int64_t value)
{
    Store(m_dataMap, column, value, __func__, &m_typed);
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

void DABaseSet::SetWide(Target target, char const* column, DACompare op, std::int64_t value)
{
    if (target == Target::Data) {
        Store(m_dataMap, column, value, "SetData", &m_typed);
    } else if (target == Target::Where) {
        Store(m_whereMap, column, value, "SetWhere");
    } else {
        SetWhere(column, op, value);
    }
}

void DABaseSet::SetWide(Target target, char const* column, DACompare op, std::uint64_t value)
{
    if (target == Target::Data) {
        Store(m_dataMap, column, value, "SetData", &m_typed);
    } else if (target == Target::Where) {
        Store(m_whereMap, column, value, "SetWhere");
    } else if (Accepted(column, nullptr, "SetWhere")) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, "SetWhere");
    }
}

void DABaseSet::AddCondition(char const* column, Condition::Form form, DACompare op, std::vector<std::string> values,
                             bool number, const char* func)
{
    StoredCondition condition{DAOwnedString(), form, op, std::move(values), number};
    condition.column.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    const DAMemberLock lock(&m_conditions, DA_FILE_NAME, func, __LINE__);
    m_conditions.push_back(std::move(condition));
}

void DABaseSet::SetWhere(char const* column, DACompare op, char const* value)
{
    if (Accepted(column, value == nullptr ? "NULL VALUE, CONDITION NOT STORED" : nullptr, __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {value}, false, __func__);
    }
}

void DABaseSet::SetWhere(char const* column, DACompare op, int value)
{
    if (Accepted(column, nullptr, __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhere(char const* column, DACompare op, std::int64_t value)
{
    if (Accepted(column, nullptr, __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhere(char const* column, DACompare op, double value)
{
    if (Accepted(column, std::isfinite(value) ? nullptr : "INVALID NUMBER, CONDITION NOT STORED", __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhereIn(char const* column, std::vector<std::string> const& values)
{
    if (Accepted(column, nullptr, __func__)) {
        AddCondition(column, Condition::Form::In, DACompare::Equal, values, false, __func__);
    }
}

void DABaseSet::SetWhereNull(char const* column, bool isNull)
{
    if (Accepted(column, nullptr, __func__)) {
        AddCondition(column, isNull ? Condition::Form::Null : Condition::Form::NotNull, DACompare::Equal, {}, false,
                     __func__);
    }
}

void DABaseSet::GetConditions(std::vector<Condition>& out)
{
    std::vector<Condition> copy;
    copy.reserve(m_conditions.size());
    for (const StoredCondition& stored : m_conditions) {
        copy.push_back({stored.column.Get(), stored.form, stored.op, stored.values, stored.number});
    }
    out = std::move(copy);
}

void DABaseSet::AddTyped(TypedValue value, const char* func)
{
    const DAMemberLock lock(&m_dataMap, DA_FILE_NAME, func, __LINE__);
    if (m_dataMap.count(value.column) == 0 && !HasColumn(m_typed, value.column)) {
        m_typed.push_back(std::move(value));
    }
}

void DABaseSet::SetNull(char const* column)
{
    if (!DAIsPlainName(column)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, VALUE NOT STORED");
        return;
    }
    AddTyped({column, true, {}}, __func__);
}

void DABaseSet::SetBlob(char const* column, void const* data, std::size_t size)
{
    if (!DAIsPlainName(column)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, VALUE NOT STORED");
        return;
    }
    if (data == nullptr && size > 0) {
        DA_LOG(DLOG_ERROR, "NULL BLOB, NOT STORED");
        return;
    }
    const auto* bytes = static_cast<const unsigned char*>(data);
    AddTyped({column, false, std::vector<unsigned char>(bytes, bytes + size)}, __func__);
}

void DABaseSet::GetTypedData(std::vector<TypedValue>& out)
{
    out = m_typed;
}
