#include "DACreateRequest.h"

#include <stdexcept>

#include "DALog.h"
#include "DAMemberLock.h"

DACreateRequest::DACreateRequest()
{
    DA_MEMBER_LOCK(m_columnKeys);
    m_columnKeys.clear();
}

void DACreateRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DACreateRequest::SetPrimaryKey(char const* column, char const* type)
{
    m_primaryKeyColumn.Assign(column);
    m_primaryKeyType.Assign(type);
}

void DACreateRequest::SetCompositeKey(char const* column, char const* type)
{
    m_compositeKeyColumn.Assign(column);
    m_compositeKeyType.Assign(type);
}

void DACreateRequest::SetColumnKey(char const* column, char const* type)
{
    // The generator reads every column name as text: a null one must never
    // get into the list.
    if (column == nullptr) {
        DA_LOG(DLOG_ERROR, "NULL COLUMN NAME, COLUMN NOT ADDED");
        return;
    }
    DA_MEMBER_LOCK(m_columnKeys);
    if (type == nullptr) {
        throw std::logic_error("DACreateRequest::SetColumnKey: the column type is null");
    }
    m_columnKeys.emplace_back(column, type);
}

void DACreateRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DACreateRequest::GetPrimaryKey(std::string& column, std::string& type)
{
    DACopyPair(m_primaryKeyColumn, m_primaryKeyType, column, type);
}

void DACreateRequest::GetCompositeKey(std::string& column, std::string& type)
{
    DACopyPair(m_compositeKeyColumn, m_compositeKeyType, column, type);
}

void DACreateRequest::GetColumnKey(DAColumnList& columns)
{
    columns = m_columnKeys;
}
