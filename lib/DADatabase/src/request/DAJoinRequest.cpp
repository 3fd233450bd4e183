#include "DAJoinRequest.h"

void DAJoinRequest::SetLeftJoin(char const* table, char const* column)
{
    m_leftTable.Assign(table);
    m_leftColumn.Assign(column);
}

void DAJoinRequest::SetRightJoin(char const* table, char const* column)
{
    m_rightTable.Assign(table);
    m_rightColumn.Assign(column);
}

void DAJoinRequest::GetLeftJoin(std::string& table, std::string& column)
{
    DACopyPair(m_leftTable, m_leftColumn, table, column);
}

void DAJoinRequest::GetRightJoin(std::string& table, std::string& column)
{
    DACopyPair(m_rightTable, m_rightColumn, table, column);
}
