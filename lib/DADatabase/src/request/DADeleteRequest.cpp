#include "DADeleteRequest.h"

void DADeleteRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DADeleteRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}
