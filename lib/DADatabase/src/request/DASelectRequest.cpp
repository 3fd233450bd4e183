#include "DASelectRequest.h"

void DASelectRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DASelectRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}
