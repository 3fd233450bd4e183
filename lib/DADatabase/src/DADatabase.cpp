#include "DADatabase.h"

#include "DABusyRetry.h"
#include "DAFiles.h"
#include "DALog.h"
#include "DAOperation.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"
#include "DAStatementCache.h"

namespace {

// A per-call visit: every operation opens its request's file and closes it
// when done.
class DAVisit : public DAConnectionSource {
public:
    DAVisit(DADatabase& database, int line) : DAConnectionSource(DA_FILE_NAME, line), m_database(database) {}

    int Acquire(DABasePath& location, DAAccess /*access*/, const char* /*func*/, DALease& lease) override
    {
        std::string dir;
        std::string file;
        location.GetPath(dir, file);
        sqlite3* handle = nullptr;
        const int rc = m_database.OpenDB(handle, dir, file);
        lease = DALease(handle, DALeaseEnd{this});  // null when the open failed
        if (m_keptFor == nullptr) {
            m_keptFor = handle;
        }
        return rc;
    }

    void Release(sqlite3* db) noexcept override
    {
        if (db == m_keptFor) {
            m_kept.Clear();
            m_keptFor = nullptr;
        }
        sqlite3_close(db);
    }

    bool IsRetryLimit(int& count) override { return m_database.IsRetryLimit(count); }

protected:
    // A batch's statements of one shape are prepared once, and kept until
    // the operation's connection closes.
    DAStatementCache* KeptStatements(sqlite3* db) override { return db == m_keptFor ? &m_kept : nullptr; }

private:
    DADatabase& m_database;
    DAStatementCache m_kept;
    sqlite3* m_keptFor = nullptr;  // the connection m_kept holds statements of
};

}  // namespace

int DADatabase::OpenDB(sqlite3*& db, std::string dir, std::string file)
{
    std::string path;
    DASqlGenerator generator;
    generator.GetDBPath(std::move(dir), std::move(file), path);
    DACreateDatabaseFile(path, -1);  // private, before SQLite would create it 0644

    DAConnection handle;
    const int rc = DARetryWhileBusy(*this, [&] {
        handle.reset();  // the handle of a busy attempt is closed before the next
        sqlite3* opened = nullptr;
        const int result = sqlite3_open(path.c_str(), &opened);
        handle.reset(opened);
        return result;
    });
    if (rc != SQLITE_OK) {
        DA_LOG(DLOG_ERROR, "DB open failed. Error no(%d): %s", rc, sqlite3_errmsg(handle.get()));
        handle.reset();
    }
    db = handle.release();
    return rc;
}

bool DADatabase::IsRetryLimit(int& count)
{
    return DAIsRetryLimit(count, DA_FILE_NAME, __LINE__);
}

int DADatabase::DropTable(DADropRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::DropTable(visit, request);
}

int DADatabase::Update(DAUpdateRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Update(visit, request);
}

int DADatabase::Delete(DADeleteRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Delete(visit, request);
}

int DADatabase::Upsert(DAUpsertRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Upsert(visit, request);
}

int DADatabase::CreateTable(DACreateRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::CreateTable(visit, request);
}

int DADatabase::ExecuteBatch(DABatchRequest& batch)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::ExecuteBatch(visit, batch);
}

int DADatabase::Select(DASelectRequest& request, DACursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Select(visit, request, cursor);
}

int DADatabase::JoinSelect(DAJoinRequest& request, DACursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::JoinSelect(visit, request, cursor);
}

int DADatabase::Query(DAQueryRequest& request, DACursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Query(visit, request, cursor);
}

int DADatabase::Query(DAQueryRequest& request, DATypedCursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Query(visit, request, cursor);
}

int DADatabase::QueryEach(DAQueryRequest& request, std::function<bool(DARow const&)> const& visit)
{
    DAVisit source(*this, __LINE__);
    return DAOperations::QueryEach(source, request, visit);
}

int DADatabase::CheckExistTable(DABasePath& location, char const* tableName, bool& exists)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::CheckExistTable(visit, location, tableName, exists);
}

int DADatabase::CreateIndex(DACreateIndexRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::CreateIndex(visit, request);
}

int DADatabase::AddColumn(DAAddColumnRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::AddColumn(visit, request);
}

int DADatabase::GetVersion(DABasePath& location, int& version)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::GetVersion(visit, location, version);
}

int DADatabase::Migrate(DABatchRequest& step, int version)
{
    DAVisit visit(*this, __LINE__);
    bool applied = false;
    return DAOperations::Migrate(visit, step, version, applied);
}

int DADatabase::Migrate(DABatchRequest& step, int version, bool& applied)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Migrate(visit, step, version, applied);
}

int DADatabase::GetSpace(DABasePath& location, std::int64_t& fileBytes, std::int64_t& freeBytes)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::GetSpace(visit, location, fileBytes, freeBytes);
}

int DADatabase::Compact(DABasePath& location)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Compact(visit, location);
}

int DADatabase::Insert(DAInsertRequest& request, std::int64_t& rowId)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Insert(visit, request, rowId);
}

int DADatabase::Update(DAUpdateRequest& request, int& changes)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Update(visit, request, changes);
}

int DADatabase::Delete(DADeleteRequest& request, int& changes)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Delete(visit, request, changes);
}

int DADatabase::CreateSearchIndex(DASearchIndexRequest& request)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::CreateSearchIndex(visit, request);
}

int DADatabase::DropSearchIndex(DABasePath& location, char const* name)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::DropSearchIndex(visit, location, name);
}

int DADatabase::Search(DASearchRequest& request, DACursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Search(visit, request, cursor);
}

int DADatabase::Search(DASearchRequest& request, DATypedCursor& cursor)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Search(visit, request, cursor);
}

int DADatabase::Unwatch(DABasePath& location, char const* table)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Unwatch(visit, location, table);
}

int DADatabase::Backup(DABasePath& from, DABasePath& to)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Backup(visit, from, to);
}

int DADatabase::Restore(DABasePath& from, DABasePath& to)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Restore(visit, from, to);
}

int DADatabase::CheckIntegrity(DABasePath& location, bool full, std::vector<std::string>& problems)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::CheckIntegrity(visit, location, full, problems);
}

int DADatabase::RebuildIndexes(DABasePath& location)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::RebuildIndexes(visit, location);
}

int DADatabase::Salvage(DABasePath& from, DABasePath& to, DASalvageReport& report)
{
    DAVisit visit(*this, __LINE__);
    return DAOperations::Salvage(visit, from, to, report);
}
