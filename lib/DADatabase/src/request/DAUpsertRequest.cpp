#include "DAUpsertRequest.h"

void DAUpsertRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DAUpsertRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}
