#include "DAUpdateRequest.h"

void DAUpdateRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DAUpdateRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}
