#include "DAQueryRequest.h"

#include <utility>

#include "DALog.h"
#include "DAMemberLock.h"

void DAQueryRequest::SetOrderBy(char const* column, bool descending)
{
    if (column == nullptr) {
        DA_LOG(DLOG_ERROR, "NULL COLUMN NAME, SORT KEY NOT STORED");
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
