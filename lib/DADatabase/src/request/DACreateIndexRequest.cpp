#include "DACreateIndexRequest.h"

#include <utility>

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

void DACreateIndexRequest::SetTable(char const* table)
{
    if (DA_KEEP_NAMES(DAIsPlainName(table))) {
        m_table.Assign(table);
    }
}

void DACreateIndexRequest::SetName(char const* name)
{
    if (DA_KEEP_NAMES(DAIsPlainName(name))) {
        m_name.Assign(name);
    }
}

void DACreateIndexRequest::AddColumn(char const* column, bool descending)
{
    if (!DA_KEEP_NAMES(DAIsPlainName(column))) {
        return;
    }
    DAOwnedString name;
    name.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    DA_MEMBER_LOCK(m_columns);
    m_columns.emplace_back(std::move(name), descending);
}

void DACreateIndexRequest::SetUnique(bool unique)
{
    m_unique = unique;
}

void DACreateIndexRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DACreateIndexRequest::GetName(std::string& name)
{
    m_name.CopyTo(name);
}

void DACreateIndexRequest::GetColumns(DAIndexColumns& columns)
{
    if (m_columns.empty()) {
        return;
    }
    DAIndexColumns copy;
    copy.reserve(m_columns.size());
    for (const auto& column : m_columns) {
        copy.emplace_back(column.first.Get(), column.second);
    }
    columns = std::move(copy);
}
