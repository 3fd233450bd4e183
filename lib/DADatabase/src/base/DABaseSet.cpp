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
#include "DASqlLiteral.h"

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
    return DANumberText(value);
}

bool IsTextMatch(DACompare op)
{
    return op == DACompare::Contains || op == DACompare::StartsWith || op == DACompare::EndsWith;
}

// A number compared with a text match is refused: its text would match
// digits, not the number.
const char* NumberFailure(DACompare op)
{
    return IsTextMatch(op) ? "TEXT MATCH OF A NUMBER, CONDITION NOT STORED" : nullptr;
}

// SQLite refuses a LIKE pattern longer than this many bytes.
constexpr std::size_t kLikePatternLimit = 50000;

// The LIKE pattern matching value literally under ESCAPE '\': '%', '_' and
// '\' escaped, '%' added where the match may extend.
std::string TextMatchPattern(DACompare op, const char* value)
{
    std::string pattern = op == DACompare::StartsWith ? "" : "%";
    for (const char* c = value; *c != '\0'; ++c) {
        if (*c == '%' || *c == '_' || *c == '\\') {
            pattern += '\\';
        }
        pattern += *c;
    }
    if (op != DACompare::EndsWith) {
        pattern += '%';
    }
    return pattern;
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
    } else if (Accepted(column, NumberFailure(op), "SetWhere")) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, "SetWhere");
    }
}

void DABaseSet::AddCondition(char const* column, Condition::Form form, DACompare op, std::vector<std::string> values,
                             bool number, const char* func)
{
    StoredCondition condition{DAOwnedString(), form, op, std::move(values), number, {}};
    condition.column.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    const DAMemberLock lock(&m_conditions, DA_FILE_NAME, func, __LINE__);
    m_conditions.push_back(std::move(condition));
}

void DABaseSet::SetWhere(char const* column, DACompare op, char const* value)
{
    if (!Accepted(column, value == nullptr ? "NULL VALUE, CONDITION NOT STORED" : nullptr, __func__)) {
        return;
    }
    if (!IsTextMatch(op)) {
        AddCondition(column, Condition::Form::Compare, op, {value}, false, __func__);
        return;
    }
    std::string pattern = TextMatchPattern(op, value);
    if (pattern.size() > kLikePatternLimit) {
        DA_LOG(DLOG_ERROR, "PATTERN TOO LONG, CONDITION NOT STORED");
        return;
    }
    AddCondition(column, Condition::Form::Compare, op, {std::move(pattern)}, false, __func__);
}

void DABaseSet::SetWhere(char const* column, DACompare op, int value)
{
    if (Accepted(column, NumberFailure(op), __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhere(char const* column, DACompare op, std::int64_t value)
{
    if (Accepted(column, NumberFailure(op), __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhere(char const* column, DACompare op, double value)
{
    const char* failure = std::isfinite(value) ? NumberFailure(op) : "INVALID NUMBER, CONDITION NOT STORED";
    if (Accepted(column, failure, __func__)) {
        AddCondition(column, Condition::Form::Compare, op, {NumberText(value)}, true, __func__);
    }
}

void DABaseSet::SetWhereRow(std::vector<char const*> const& columns, DACompare op, std::vector<DAValue> const& values)
{
    const char* const func = __func__;
    for (char const* column : columns) {
        if (!Accepted(column, nullptr, func)) {
            return;
        }
    }
    const char* failure = nullptr;
    if (columns.empty() || columns.size() != values.size()) {
        failure = "COLUMN AND VALUE COUNTS DIFFER, CONDITION NOT STORED";
    } else if (op > DACompare::GreaterEqual) {
        failure = "INVALID OPERATOR, CONDITION NOT STORED";
    }
    for (std::size_t i = 0; failure == nullptr && i < values.size(); ++i) {
        failure = values[i].GetFailure();
    }
    if (failure != nullptr) {
        DA_LOG_AT(DLOG_ERROR, func, "%s", failure);
        return;
    }
    StoredCondition condition{DAOwnedString(), Condition::Form::Row, op, {}, false, {}};
    for (std::size_t i = 0; i < values.size(); ++i) {
        condition.columns.emplace_back(columns[i]);
        condition.values.push_back(values[i].GetSql());
    }
    const DAMemberLock lock(&m_conditions, DA_FILE_NAME, func, __LINE__);
    m_conditions.push_back(std::move(condition));
}

void DABaseSet::ClearData()
{
    const DAMemberLock lock(&m_dataMap, DA_FILE_NAME, __func__, __LINE__);
    m_dataMap.clear();
    m_typed.clear();
}

void DABaseSet::ClearWhere()
{
    {
        const DAMemberLock lock(&m_whereMap, DA_FILE_NAME, __func__, __LINE__);
        m_whereMap.clear();
    }
    const DAMemberLock lock(&m_conditions, DA_FILE_NAME, __func__, __LINE__);
    m_conditions.clear();
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
        const char* column = stored.column.Get();
        copy.push_back(
            {column != nullptr ? column : "", stored.form, stored.op, stored.values, stored.number, stored.columns});
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

void DABaseSet::SetIncrement(char const* column, std::int64_t delta)
{
    if (!DAIsPlainName(column)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, VALUE NOT STORED");
        return;
    }
    AddTyped({column, false, {}, true, delta}, __func__);
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
