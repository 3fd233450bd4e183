#include "DAAddColumnRequest.h"

#include "DALog.h"
#include "DAPlainName.h"

void DAAddColumnRequest::SetTable(char const* table)
{
    if (DA_KEEP_NAMES(DAIsPlainName(table))) {
        m_table.Assign(table);
    }
}

void DAAddColumnRequest::SetColumn(char const* column, char const* type)
{
    if (DA_KEEP_NAMES(DAIsPlainName(column) && DAIsPlainName(type))) {
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
