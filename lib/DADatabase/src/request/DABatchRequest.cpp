#include "DABatchRequest.h"

#include <sqlite3.h>

#include <algorithm>
#include <string>

#include "DALocationRule.h"
#include "DALog.h"
#include "DASqlStatement.h"

int DABatchRequest::CheckLocation(DABasePath& request)
{
    return DACheckLocation(*this, request, DA_FILE_NAME, "Add", __LINE__, "batch", m_scratch);
}

template <typename Request>
int DABatchRequest::AddStatement(Request& request)
{
    const int rc = CheckLocation(request);
    if (rc != SQLITE_OK) {
        return rc;
    }
    // Kept as shape and values where the statement takes them: the run
    // binds them into one statement prepared per shape.
    DASqlStatement statement;
    statement.shaped = true;
    DAWriteSql(request, statement);
    const std::size_t needed = m_texts.size() + DAPackedSize(statement);
    if (needed > m_texts.capacity()) {
        // A quarter more rather than the usual doubling: a full batch then
        // holds at most about 1.25 times its texts. vector::reserve
        // allocates exactly what it is asked for.
        m_texts.reserve(std::max(needed, m_texts.capacity() + m_texts.capacity() / 4));
    }
    DAPackStatement(statement, m_texts);
    ++m_count;
    return SQLITE_OK;
}

int DABatchRequest::Add(DAUpsertRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DAUpdateRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DADeleteRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DACreateRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DADropRequest& request)
{
    return AddStatement(request);
}

void DABatchRequest::Clear()
{
    std::vector<char>().swap(m_texts);
    std::vector<int>().swap(m_inserts);
    m_count = 0;
}

int DABatchRequest::Add(DACreateIndexRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DAAddColumnRequest& request)
{
    return AddStatement(request);
}

int DABatchRequest::Add(DAInsertRequest& request)
{
    m_inserts.reserve(m_inserts.size() + 1);  // so that a failure below leaves the batch as it was
    const int rc = AddStatement(request);
    if (rc == SQLITE_OK) {
        m_inserts.push_back(m_count);
    }
    return rc;
}

int DABatchRequest::Add(DASearchIndexRequest& request)
{
    return AddStatement(request);
}
