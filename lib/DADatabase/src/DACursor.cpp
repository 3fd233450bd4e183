#include "DACursor.h"

#include <iterator>
#include <sstream>

#include "DALog.h"
#include "DAMemberLock.h"

namespace {

// The conversion step of GetInt, GetInt64 and GetDouble, given the current
// value (null when the lookup already failed and logged): formatted
// extraction from a fresh default stream, so leading blanks are skipped,
// trailing text is ignored and end of input alone is no failure. Logs a
// failure under func.
template <typename Number>
int ReadNumber(const std::string* text, Number& out, const char* func, const char* failure)
{
    if (text == nullptr) {
        return 1;
    }
    std::istringstream stream(*text);
    Number number{};
    stream >> number;
    if (stream.fail()) {
        DA_LOG_AT(DLOG_ERROR, func, "%s", failure);
        return 1;
    }
    out = number;
    return 0;
}

}  // namespace

DACursor::DACursor() : m_position(-1)
{
    DA_MEMBER_LOCK(m_columnValues);
    m_columnNames.clear();
    m_columnValues.clear();
}

void DACursor::Initialize()
{
    DA_MEMBER_LOCK(m_columnValues);
    m_position = -1;
    m_columnValues.clear();
    m_columnNames.clear();
}

void DACursor::SetColumn(const char* column)
{
    DA_MEMBER_LOCK(m_columnValues);
    m_columnNames.emplace_back(column);
    m_columnValues.emplace(column, std::vector<std::string>());
}

void DACursor::SetData(const char* column, const char* value)
{
    DA_MEMBER_LOCK(m_columnValues);
    const auto found = m_columnValues.find(column);
    if (found != m_columnValues.end()) {
        found->second.emplace_back(value);
    }
}

int DACursor::GetColumn(std::vector<std::string>& columns)
{
    if (m_columnNames.empty()) {
        return 1;
    }
    columns = m_columnNames;
    return 0;
}

int DACursor::GetCount()
{
    if (m_columnValues.empty()) {
        return -1;
    }
    // The second column in name order; a lone column counts itself.
    auto counted = m_columnValues.begin();
    if (m_columnValues.size() > 1) {
        counted = std::next(counted);
    }
    return static_cast<int>(counted->second.size());
}

void DACursor::ShowDataLog()
{
}

void DACursor::MoveToFirst()
{
    m_position = -1;
}

void DACursor::MoveToLast()
{
    m_position = GetCount();
}

int DACursor::MoveToNext()
{
    ++m_position;
    if (m_position < GetCount()) {
        return 0;
    }
    DA_LOG(DLOG_INFO, "Last Row");
    m_position = GetCount() - 1;
    return 3;
}

int DACursor::MoveToPrev()
{
    --m_position;
    if (m_position >= 0) {
        return 0;
    }
    DA_LOG(DLOG_INFO, "First Row");
    m_position = 0;
    return 2;
}

int DACursor::MoveToPosition(int row)
{
    if (!IsValidPosition(row)) {
        DA_LOG(DLOG_ERROR, "Invalid Position");
        return 1;
    }
    m_position = row;
    return 0;
}

int DACursor::GetPosition()
{
    return m_position;
}

bool DACursor::IsValidPosition(int row)
{
    return row >= 0 && row < GetCount();
}

const std::string* DACursor::CurrentValue(const char* column, const char* func)
{
    const auto found = m_columnValues.find(column);
    if (found == m_columnValues.end()) {
        DA_LOG_AT(DLOG_ERROR, func, "NO MATCHED ERROR!!!");
        return nullptr;
    }
    const std::vector<std::string>& values = found->second;
    if (!IsValidPosition(m_position) || static_cast<std::size_t>(m_position) >= values.size()) {
        DA_LOG_AT(DLOG_ERROR, func, "CURSOR RANGE ERROR!!!");
        return nullptr;
    }
    return &values[static_cast<std::size_t>(m_position)];
}

int DACursor::GetString(const char* column, std::string& value)
{
    const std::string* current = CurrentValue(column, __func__);
    if (current == nullptr) {
        return 1;
    }
    value = *current;
    return 0;
}

int DACursor::GetInt(const char* column, int& value)
{
    return ReadNumber(CurrentValue(column, __func__), value, __func__, "CONVERT TO INT ERROR!!!");
}

int DACursor::GetDouble(const char* column, double& value)
{
    return ReadNumber(CurrentValue(column, __func__), value, __func__, "CONVERT TO DOUBLE ERROR!!!");
}

int DACursor::GetInt64(const char* column, std::int64_t& value)
{
    return ReadNumber(CurrentValue(column, __func__), value, __func__, "CONVERT TO INT ERROR!!!");
}
