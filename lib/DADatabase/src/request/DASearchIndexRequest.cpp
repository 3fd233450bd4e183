#include "DASearchIndexRequest.h"

#include <utility>

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

void DASearchIndexRequest::SetTable(char const* table)
{
    if (DA_KEEP_NAMES(DAIsPlainName(table))) {
        m_table.Assign(table);
    }
}

void DASearchIndexRequest::SetName(char const* name)
{
    if (DA_KEEP_NAMES(DAIsPlainName(name))) {
        m_name.Assign(name);
    }
}

void DASearchIndexRequest::AddColumn(char const* column)
{
    if (!DA_KEEP_NAMES(DAIsPlainName(column))) {
        return;
    }
    DAOwnedString name;
    name.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    DA_MEMBER_LOCK(m_columns);
    m_columns.push_back(std::move(name));
}

void DASearchIndexRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DASearchIndexRequest::GetName(std::string& name)
{
    m_name.CopyTo(name);
}

void DASearchIndexRequest::GetColumns(std::vector<std::string>& columns)
{
    if (m_columns.empty()) {
        return;
    }
    std::vector<std::string> copy;
    copy.reserve(m_columns.size());
    for (const DAOwnedString& column : m_columns) {
        copy.emplace_back(column.Get());
    }
    columns = std::move(copy);
}
