#include "DAAddColumnRequest.h"

#include "DALog.h"
#include "DAPlainName.h"

namespace {

// Names and the type go into the statement unquoted: only plain ones are
// kept.
bool IsAccepted(bool plain, const char* func)
{
    if (!plain) {
        DA_LOG_AT(DLOG_ERROR, func, "INVALID NAME, NOT STORED");
    }
    return plain;
}

}  // namespace

void DAAddColumnRequest::SetTable(char const* table)
{
    if (IsAccepted(DAIsPlainName(table), __func__)) {
        m_table.Assign(table);
    }
}

void DAAddColumnRequest::SetColumn(char const* column, char const* type)
{
    if (IsAccepted(DAIsPlainName(column) && DAIsPlainName(type), __func__)) {
        m_column.Assign(column);
        m_type.Assign(type);
    }
}

void DAAddColumnRequest::SetDefault(char const* value)
{
    m_default.Assign(value);
}

void DAAddColumnRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DAAddColumnRequest::GetColumn(std::string& column, std::string& type)
{
    DACopyPair(m_column, m_type, column, type);
}

bool DAAddColumnRequest::GetDefault(std::string& value)
{
    return m_default.CopyTo(value);
}
