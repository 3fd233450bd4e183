#include "DABatchRequest.h"

#include <sqlite3.h>

#include <algorithm>
#include <string>

#include "DALog.h"
#include "DASqlGenerator.h"

namespace {

// The joined path of a location, or "(incomplete)" when a part is unset.
std::string JoinedPath(DABasePath& location)
{
    if (!location.IsPathSet()) {
        return "(incomplete)";
    }
    std::string dir;
    std::string file;
    std::string path;
    location.GetPath(dir, file);
    DASqlGenerator().GetDBPath(std::move(dir), std::move(file), path);
    return path;
}

}  // namespace

int DABatchRequest::CheckLocation(DABasePath& request)
{
    if (request.IsPathEmpty()) {
        return SQLITE_OK;
    }
    if (request.IsPathSet() && IsPathSet()) {
        // Equal parts name the same file: the usual case, compared in
        // buffers that keep their capacity from one Add to the next.
        request.GetPath(m_requestDir, m_requestFile);
        GetPath(m_ownDir, m_ownFile);
        if (m_requestDir == m_ownDir && m_requestFile == m_ownFile) {
            return SQLITE_OK;
        }
    }
    const std::string requested = JoinedPath(request);
    const std::string own = JoinedPath(*this);
    if (request.IsPathSet() && IsPathSet() && requested == own) {
        return SQLITE_OK;
    }
    DA_LOG_AT(DLOG_ERROR, "Add", "Add FAILED[%d]: request location %s is not the batch's %s", SQLITE_MISUSE,
              requested.c_str(), own.c_str());
    return SQLITE_MISUSE;
}

template <typename Request, typename Generate>
int DABatchRequest::AddStatement(Request& request, Generate generate)
{
    const int rc = CheckLocation(request);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string sql;
    (DASqlGenerator().*generate)(request, sql);

    const std::size_t needed = m_texts.size() + sql.size() + 1;
    if (needed > m_texts.capacity()) {
        // A quarter more rather than the usual doubling: a full batch then
        // holds at most about 1.25 times its texts. vector::reserve
        // allocates exactly what it is asked for.
        m_texts.reserve(std::max(needed, m_texts.capacity() + m_texts.capacity() / 4));
    }
    m_texts.insert(m_texts.end(), sql.begin(), sql.end());
    m_texts.push_back('\0');
    ++m_count;
    return SQLITE_OK;
}

int DABatchRequest::Add(DAUpsertRequest& request)
{
    return AddStatement(request, &DASqlGenerator::GetUpsertSql);
}

int DABatchRequest::Add(DAUpdateRequest& request)
{
    return AddStatement(request, &DASqlGenerator::GetUpdateSql);
}

int DABatchRequest::Add(DADeleteRequest& request)
{
    return AddStatement(request, &DASqlGenerator::GetDeleteSql);
}

int DABatchRequest::Add(DACreateRequest& request)
{
    return AddStatement(request, &DASqlGenerator::GetCreateTableSql);
}

int DABatchRequest::Add(DADropRequest& request)
{
    return AddStatement(request, &DASqlGenerator::GetDropTableSql);
}

void DABatchRequest::Clear()
{
    std::vector<char>().swap(m_texts);
    m_count = 0;
}
