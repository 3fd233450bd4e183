#include "DADropRequest.h"

void DADropRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DADropRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}
