#include "DAUpsertRequest.h"

#include "DALog.h"
#include "DAMemberLock.h"
#include "DAPlainName.h"

void DAUpsertRequest::SetTable(char const* table)
{
    m_table.Assign(table);
}

void DAUpsertRequest::GetTable(std::string& table)
{
    m_table.CopyTo(table);
}

void DAUpsertRequest::AddConflictKey(char const* column)
{
    if (!DAIsPlainName(column)) {
        DA_LOG(DLOG_ERROR, "INVALID COLUMN NAME, KEY NOT STORED");
        return;
    }
    std::string key(column);  // copied before the lock: a failed copy leaves the list as it was
    DA_MEMBER_LOCK(m_keys);
    m_keys.push_back(std::move(key));
}

void DAUpsertRequest::GetConflictKeys(std::vector<std::string>& keys)
{
    keys = m_keys;
}
