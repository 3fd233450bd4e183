#include "DAInsertRequest.h"

void DAInsertRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DAInsertRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DAInsertRequest::SetIgnoreExisting(bool ignore)
{
    m_ignoreExisting = ignore;
}
