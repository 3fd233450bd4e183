#include "DAQueryRequest.h"

#include <utility>

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

void DAQueryRequest::SetOrderBy(char const* column, bool descending)
{
    if (column == nullptr) {
        DA_LOG(DLOG_ERROR, "NULL COLUMN NAME, SORT KEY NOT STORED");
        return;
    }
    if (!DAIsPlainName(column, true)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, SORT KEY NOT STORED");
        return;
    }
    DAOwnedString name;
    name.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    DA_MEMBER_LOCK(m_orderBy);
    m_orderBy.emplace_back(std::move(name), descending);
}

void DAQueryRequest::SetLimit(int count, int offset)
{
    m_hasLimit = true;
    m_limitCount = count < 0 ? -1 : count;  // SQLite's "no limit"
    m_limitOffset = offset < 0 ? 0 : offset;
}

void DAQueryRequest::GetOrderBy(DAOrderKeys& keys)
{
    if (m_orderBy.empty()) {
        return;
    }
    DAOrderKeys copy;
    copy.reserve(m_orderBy.size());
    for (const auto& key : m_orderBy) {
        copy.emplace_back(key.first.Get(), key.second);
    }
    keys = std::move(copy);
}

void DAQueryRequest::GetLimit(int& count, int& offset)
{
    if (m_hasLimit) {
        count = m_limitCount;
        offset = m_limitOffset;
    }
}

void DAQueryRequest::AddColumn(char const* column)
{
    AddAggregate(DAAggregate::Count, column, nullptr, false, __func__);
}

void DAQueryRequest::AddAggregate(DAAggregate function, char const* column, char const* as)
{
    AddAggregate(function, column, as, true, __func__);
}

void DAQueryRequest::AddAggregate(DAAggregate function, char const* column, char const* as, bool aggregate,
                                  const char* func)
{
    const bool countAll = aggregate && function == DAAggregate::Count && column == nullptr;
    if ((!countAll && !DAIsPlainName(column, true)) || (aggregate && !DAIsPlainName(as))) {
        DA_LOG_AT(DLOG_ERROR, func, "INVALID COLUMN NAME, COLUMN NOT STORED");
        return;
    }
    StoredItem item{aggregate, function, DAOwnedString(), DAOwnedString()};
    item.column.Assign(column);  // copied before the lock: a failed copy leaves the list as it was
    item.as.Assign(as);
    const DAMemberLock lock(&m_columns, DA_FILE_NAME, func, __LINE__);
    m_columns.push_back(std::move(item));
}

void DAQueryRequest::AddGroupBy(char const* column)
{
    if (!DAIsPlainName(column, true)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, GROUP NOT STORED");
        return;
    }
    DAOwnedString name;
    name.Assign(column);
    DA_MEMBER_LOCK(m_groupBy);
    m_groupBy.push_back(std::move(name));
}

void DAQueryRequest::GetColumns(std::vector<SelectItem>& out)
{
    std::vector<SelectItem> copy;
    copy.reserve(m_columns.size());
    for (const StoredItem& item : m_columns) {
        copy.push_back({item.aggregate, item.function, item.column.IsSet() ? item.column.Get() : "",
                        item.as.IsSet() ? item.as.Get() : ""});
    }
    out = std::move(copy);
}

void DAQueryRequest::GetGroupBy(std::vector<std::string>& out)
{
    std::vector<std::string> copy;
    copy.reserve(m_groupBy.size());
    for (const DAOwnedString& name : m_groupBy) {
        copy.emplace_back(name.Get());
    }
    out = std::move(copy);
}

void DAQueryRequest::ClearOrderBy()
{
    DA_MEMBER_LOCK(m_orderBy);
    m_orderBy.clear();
}

void DAQueryRequest::ClearLimit()
{
    m_hasLimit = false;
    m_limitCount = -1;
    m_limitOffset = 0;
}
