#include "DASession.h"

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <mutex>
#include <shared_mutex>
#include <string>
#include <utility>
#include <vector>

#include <sqlite3.h>

#include "DABusyRetry.h"
#include "DAFiles.h"
#include "DALocationRule.h"
#include "DALog.h"
#include "DAOperation.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"
#include "DAStatementCache.h"

namespace {

// Idle reader connections kept for the next reads; more are opened when
// more threads read at once, and closed again when they come back.
constexpr std::size_t kIdleReaders = 4;
// Connections are used by one thread at a time (the write mutex, the
// pool), so SQLite's own per-connection mutex is not needed.
constexpr int kWriterFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX;
constexpr int kReaderFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX;

// A reader connection, its kept statements (released before it closes)
// and the schema generation of the session it last ran at (-1: new, its
// schema is read at its first statement).
struct DAReader {
    DAConnection db;
    DAStatementCache statements;
    int generation = -1;
};

}  // namespace

struct DASessionState {
    // Shared by every operation for its whole run; exclusive for Open, Close
    // and the options, which so never pull a connection from under one.
    mutable std::shared_mutex life;
    bool wal = true;
    bool sync = true;
    bool create = true;
    std::int64_t sizeLimit = 0;
    int fileMode = -1;  // -1: DACreateDatabaseFile's default

    DABasePath location;
    std::string path;
    bool walActive = false;
    int checkpointPages = 0;  // 0: SQLite's own automatic checkpoints

    std::mutex writeMutex;  // held for a write's whole lease
    DAConnection writer;
    DAStatementCache writerStatements;  // cleared before the writer closes

    std::mutex poolMutex;
    std::vector<DAReader> idle;  // capacity kIdleReaders, so a return never allocates
    // Counts the writer's schema changes; touched is set while a statement
    // that changes the schema is prepared on the writer.
    std::atomic<int> generation{0};
    bool touched = false;
};

namespace {

// The session whose writer this thread holds, if any.
thread_local const DASessionState* t_writerHeld = nullptr;

// The session's connection source, one per operation (on its stack).
class DASessionSource : public DAConnectionSource {
public:
    DASessionSource(DASessionState& state, int line) : DAConnectionSource(DA_FILE_NAME, line), m_state(state) {}

    int Acquire(DABasePath& location, DAAccess access, const char* func, DALease& lease) override
    {
        if (!m_state.writer) {
            DA_LOG_WHERE(DLOG_ERROR, File(), func, Line(), "SESSION NOT OPEN");
            return SQLITE_MISUSE;
        }
        const int rc = DACheckLocation(m_state.location, location, File(), func, Line(), "session", m_scratch);
        if (rc != SQLITE_OK) {
            return rc;
        }
        if (access == DAAccess::Write || !m_state.walActive) {
            // Only a visit of this thread's own read can get here holding
            // the writer: locking again would never return.
            if (t_writerHeld == &m_state) {
                DA_LOG_WHERE(DLOG_ERROR, File(), func, Line(), "SESSION BUSY ON THIS THREAD");
                return SQLITE_MISUSE;
            }
            m_state.writeMutex.lock();
            t_writerHeld = &m_state;
            lease = DALease(m_state.writer.get(), DALeaseEnd{this});
            return SQLITE_OK;
        }
        {
            const std::lock_guard<std::mutex> guard(m_state.poolMutex);
            if (!m_state.idle.empty()) {
                m_reader = std::move(m_state.idle.back());
                m_state.idle.pop_back();
            }
        }
        if (!m_reader.db) {
            const int rc = OpenConnection(m_state.path, kReaderFlags, func, m_reader.db);
            if (rc != SQLITE_OK) {
                return rc;
            }
        }
        Refresh(m_reader, m_state.generation.load());
        lease = DALease(m_reader.db.get(), DALeaseEnd{this});
        return SQLITE_OK;
    }

    void Release(sqlite3* db) noexcept override
    {
        if (db == m_state.writer.get()) {
            if (std::exchange(m_state.touched, false)) {
                ++m_state.generation;
            }
            t_writerHeld = nullptr;
            m_state.writeMutex.unlock();
            return;
        }
        DAReader reader = std::move(m_reader);
        const std::lock_guard<std::mutex> guard(m_state.poolMutex);
        // A read that met a schema changed elsewhere failed; the reader,
        // whose schema is stale, is not kept.
        if (m_state.idle.size() < m_state.idle.capacity() && sqlite3_errcode(db) != SQLITE_SCHEMA) {
            m_state.idle.push_back(std::move(reader));
        }
    }

    // A reader keeps the schema it loaded, and the library's statements are
    // prepared without re-preparation: after the writer changed the schema, a
    // stale one would fail at its first step. One re-preparing statement
    // makes the reader load the new one.
    static void Refresh(DAReader& reader, int generation)
    {
        if (reader.generation != generation && reader.generation != -1) {
            sqlite3_exec(reader.db.get(), "SELECT 1 FROM sqlite_master LIMIT 0", nullptr, nullptr, nullptr);
        }
        reader.generation = generation;
    }

    // Waits for other connections in short steps (DAShortBusyWait): a held
    // connection's write goes on within a couple of milliseconds of the
    // other's commit, not after a 100 ms pause.
    bool IsRetryLimit(int& count) override { return m_busy.IsRetryLimit(count, DA_FILE_NAME, __LINE__); }

    // Held connections outlive other connections' schema changes.
    bool MayBeStale() const override { return true; }

    // The session's statements are kept by shape (DAStatementCache.h): a
    // text whose shape was seen on this connection is bound, not parsed
    // and planned again. Any other text is prepared as it is.
    int Prepare(sqlite3* db, const char* sql, DAStatementLease& stmt) override
    {
        return Split(db, sql) ? PrepareShaped(db, m_split.c_str(), m_values.View(), stmt)
                              : DAConnectionSource::Prepare(db, sql, stmt);
    }

    // A text of a kept shape is stepped to its end as sqlite3_exec would
    // run it, with exec's code and SQLite's text.
    int Execute(sqlite3* db, const char* sql, DAErrorText& error) override
    {
        return Split(db, sql) ? ExecuteShaped(db, m_split.c_str(), m_values.View(), error)
                              : DAConnectionSource::Execute(db, sql, error);
    }

    bool TakesShapes(sqlite3* db) override { return KeptStatements(db) != nullptr; }

    // Opens path with flags under busy-retry; on failure logs OpenDB's line
    // under func and leaves db empty.
    int OpenConnection(const std::string& path, int flags, const char* func, DAConnection& db)
    {
        const int rc = DARetryWhileBusy(*this, [&] {
            db.reset();
            sqlite3* opened = nullptr;
            const int result = sqlite3_open_v2(path.c_str(), &opened, flags, nullptr);
            db.reset(opened);
            return result;
        });
        return rc == SQLITE_OK ? rc : OpenFailed(rc, db, func);
    }

    // Logs OpenDB's failure line under func, closes db, returns rc.
    int OpenFailed(int rc, DAConnection& db, const char* func)
    {
        DA_LOG_WHERE(DLOG_ERROR, File(), func, Line(), "DB open failed. Error no(%d): %s", rc,
                     db ? sqlite3_errmsg(db.get()) : sqlite3_errstr(rc));
        db.reset();
        return rc;
    }

    // Runs a pragma under busy-retry; its first value (if any) goes to value.
    int Pragma(sqlite3* db, const std::string& sql, std::string& value)
    {
        DAStatement stmt;
        int rc = DARetryWhileBusy(*this, [&] {
            sqlite3_stmt* handle = nullptr;
            const int result = sqlite3_prepare_v2(db, sql.c_str(), -1, &handle, nullptr);
            stmt.reset(handle);
            return result;
        });
        if (rc == SQLITE_OK) {
            rc = DARetryWhileBusy(*this, [&] { return sqlite3_step(stmt.get()); });
        }
        if (rc == SQLITE_ROW) {
            const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt.get(), 0));
            value = text != nullptr ? text : "";
            // The statement's own transaction (a journal mode switch writes
            // the file's header) commits at its last step, which can fail.
            rc = DARetryWhileBusy(*this, [&] { return sqlite3_step(stmt.get()); });
        }
        return rc == SQLITE_DONE ? SQLITE_OK : rc;
    }

protected:
    // The kept statements of db, if this source lent it.
    DAStatementCache* KeptStatements(sqlite3* db) override
    {
        return db == m_state.writer.get() ? &m_state.writerStatements
            : db == m_reader.db.get()     ? &m_reader.statements
                                          : nullptr;
    }

private:
    // Whether sql, on a connection of this source, splits into shape and
    // values (m_split, m_values).
    bool Split(sqlite3* db, const char* sql)
    {
        return KeptStatements(db) != nullptr && DASplitLiterals(sql, m_split, m_values);
    }

    DASessionState& m_state;
    DAShortBusyWait m_busy;
    DAReader m_reader;  // the one this operation holds, if any
    std::string m_scratch[4];
    std::string m_split;  // the shape and values of the last text split
    DASqlParams m_values;
};

// A session operation's source, holding the session's life lock shared for
// the operation's run.
class DASessionCall : public DASessionSource {
public:
    DASessionCall(DASessionState& state, int line) : DASessionSource(state, line), m_life(state.life) {}

private:
    std::shared_lock<std::shared_mutex> m_life;
};

// Notes, on the writer, the preparation of a statement that changes the
// schema (so that the readers reload theirs).
int NoteSchemaChange(void* state, int action, const char* /*a*/, const char* /*b*/, const char* /*c*/,
                     const char* /*d*/)
{
    const bool schema = (action >= SQLITE_CREATE_INDEX && action <= SQLITE_DROP_VIEW && action != SQLITE_DELETE) ||
        action == SQLITE_ALTER_TABLE || action == SQLITE_CREATE_VTABLE || action == SQLITE_DROP_VTABLE;
    static_cast<DASessionState*>(state)->touched |= schema;
    return SQLITE_OK;
}

// After each commit on the writer of a session with a size limit: keeps the
// log within the budget's margin (see SetSizeLimit). Runs outside the
// transaction, on the writer, under the write mutex.
int KeepLogSmall(void* state, sqlite3* db, const char* name, int frames)
{
    const int pages = static_cast<DASessionState*>(state)->checkpointPages;
    if (frames >= pages) {
        // No busy handler: a checkpoint that meets a reader copies what it
        // can and leaves the rest to the next commit.
        const int mode = frames >= 2 * pages ? SQLITE_CHECKPOINT_TRUNCATE : SQLITE_CHECKPOINT_PASSIVE;
        sqlite3_wal_checkpoint_v2(db, name, mode, nullptr, nullptr);
    }
    return SQLITE_OK;
}

}  // namespace

DASession::DASession() : m_state(std::make_unique<DASessionState>())
{
}

DASession::~DASession()
{
    Close();
}

void DASession::SetWal(bool wal)
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    m_state->wal = wal;
}

void DASession::SetSyncOnCommit(bool sync)
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    m_state->sync = sync;
}

void DASession::SetCreate(bool create)
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    m_state->create = create;
}

void DASession::SetSizeLimit(std::int64_t bytes)
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    m_state->sizeLimit = bytes;
}

void DASession::SetFileMode(int mode)
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    m_state->fileMode = mode;
}

int DASession::Open(DABasePath& location)
{
    const char* const func = "Open";
    std::string dir;
    std::string file;
    location.GetPath(dir, file);
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    DASessionState& state = *m_state;
    state.idle.clear();
    state.writerStatements.Clear();
    state.writer.reset();
    DASqlGenerator().GetDBPath(dir, file, state.path);
    state.idle.reserve(kIdleReaders);

    DASessionSource source(state, __LINE__);
    DAConnection writer;
    if (state.create) {
        DACreateDatabaseFile(state.path, state.fileMode);
    }
    int rc = source.OpenConnection(state.path, state.create ? kWriterFlags : kWriterFlags & ~SQLITE_OPEN_CREATE, func,
                                   writer);
    if (rc != SQLITE_OK) {
        return rc;
    }
    // The journal mode is read back: a file system without shared memory
    // keeps the rollback journal, and then reads share the writer.
    std::string mode;
    rc = source.Pragma(writer.get(), state.wal ? "PRAGMA journal_mode=WAL" : "PRAGMA journal_mode=DELETE", mode);
    std::string pageSize;
    if (rc == SQLITE_OK) {
        rc =
            source.Pragma(writer.get(), state.sync ? "PRAGMA synchronous=FULL" : "PRAGMA synchronous=NORMAL", pageSize);
    }
    if (rc == SQLITE_OK) {
        rc = source.Pragma(writer.get(), "PRAGMA page_size", pageSize);
    }
    state.checkpointPages = 0;
    if (rc == SQLITE_OK && state.sizeLimit > 0) {
        const std::int64_t page = std::max<std::int64_t>(std::strtoll(pageSize.c_str(), nullptr, 10), 512);
        const std::int64_t pages = std::max<std::int64_t>(state.sizeLimit / page, 1);
        state.checkpointPages = static_cast<int>(std::clamp<std::int64_t>(pages / 8, 16, 1000));
        std::string ignored;
        rc = source.Pragma(writer.get(), "PRAGMA max_page_count=" + std::to_string(pages), ignored);
        if (rc == SQLITE_OK) {
            rc = source.Pragma(writer.get(),
                               "PRAGMA journal_size_limit=" + std::to_string(state.checkpointPages * page), ignored);
        }
    }
    const char* const wanted = state.wal ? "wal" : "delete";
    if (rc == SQLITE_OK && mode != wanted) {
        // SQLite answers a switch it cannot make at all (a file system
        // without shared memory) with the mode it kept, not with an error.
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(),
                     "DB open failed. Error no(%d): journal mode %s, not %s", SQLITE_IOERR, mode.c_str(), wanted);
        return SQLITE_IOERR;
    }
    if (rc != SQLITE_OK) {
        return source.OpenFailed(rc, writer, func);
    }
    state.walActive = mode == "wal";
    sqlite3_set_authorizer(writer.get(), &NoteSchemaChange, &state);
    if (state.checkpointPages > 0 && state.walActive) {
        sqlite3_wal_hook(writer.get(), &KeepLogSmall, &state);
    }
    state.location.SetPath(dir.c_str(), file.c_str());
    state.writer = std::move(writer);
    return SQLITE_OK;
}

void DASession::Close()
{
    const std::unique_lock<std::shared_mutex> life(m_state->life);
    // The readers first: the writer, closed last, checkpoints the log into
    // the file and removes it.
    m_state->idle.clear();
    m_state->writerStatements.Clear();
    m_state->writer.reset();
}

bool DASession::IsOpen() const
{
    const std::shared_lock<std::shared_mutex> life(m_state->life);
    return m_state->writer != nullptr;
}

int DASession::DropTable(DADropRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::DropTable(source, request);
}

int DASession::Update(DAUpdateRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Update(source, request);
}

int DASession::Delete(DADeleteRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Delete(source, request);
}

int DASession::Upsert(DAUpsertRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Upsert(source, request);
}

int DASession::CreateTable(DACreateRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::CreateTable(source, request);
}

int DASession::ExecuteBatch(DABatchRequest& batch)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::ExecuteBatch(source, batch);
}

int DASession::Select(DASelectRequest& request, DACursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Select(source, request, cursor);
}

int DASession::JoinSelect(DAJoinRequest& request, DACursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::JoinSelect(source, request, cursor);
}

int DASession::Query(DAQueryRequest& request, DACursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Query(source, request, cursor);
}

int DASession::Query(DAQueryRequest& request, DATypedCursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Query(source, request, cursor);
}

int DASession::QueryEach(DAQueryRequest& request, std::function<bool(DARow const&)> const& visit)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::QueryEach(source, request, visit);
}

int DASession::CheckExistTable(char const* tableName, bool& exists)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;  // no location: the session's file
    return DAOperations::CheckExistTable(source, here, tableName, exists);
}

int DASession::CreateIndex(DACreateIndexRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::CreateIndex(source, request);
}

int DASession::AddColumn(DAAddColumnRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::AddColumn(source, request);
}

int DASession::GetVersion(int& version)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::GetVersion(source, here, version);
}

int DASession::Migrate(DABatchRequest& step, int version)
{
    DASessionCall source(*m_state, __LINE__);
    bool applied = false;
    return DAOperations::Migrate(source, step, version, applied);
}

int DASession::Migrate(DABatchRequest& step, int version, bool& applied)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Migrate(source, step, version, applied);
}

int DASession::GetSpace(std::int64_t& fileBytes, std::int64_t& freeBytes)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::GetSpace(source, here, fileBytes, freeBytes);
}

int DASession::Compact()
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    const int rc = DAOperations::Compact(source, here);
    ++m_state->generation;  // the file rewritten: every table may have moved, as no authorizer sees
    return rc;
}

int DASession::Insert(DAInsertRequest& request, std::int64_t& rowId)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Insert(source, request, rowId);
}

int DASession::Update(DAUpdateRequest& request, int& changes)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Update(source, request, changes);
}

int DASession::Delete(DADeleteRequest& request, int& changes)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Delete(source, request, changes);
}

int DASession::CreateSearchIndex(DASearchIndexRequest& request)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::CreateSearchIndex(source, request);
}

int DASession::DropSearchIndex(char const* name)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::DropSearchIndex(source, here, name);
}

int DASession::Search(DASearchRequest& request, DACursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Search(source, request, cursor);
}

int DASession::Search(DASearchRequest& request, DATypedCursor& cursor)
{
    DASessionCall source(*m_state, __LINE__);
    return DAOperations::Search(source, request, cursor);
}

int DASession::Unwatch(char const* table)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::Unwatch(source, here, table);
}

int DASession::Backup(DABasePath& to)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::Backup(source, here, to);
}

int DASession::Restore(DABasePath& from)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    const int rc = DAOperations::Restore(source, from, here);
    ++m_state->generation;  // a new schema, as no authorizer sees
    return rc;
}

int DASession::CheckIntegrity(bool full, std::vector<std::string>& problems)
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    return DAOperations::CheckIntegrity(source, here, full, problems);
}

int DASession::RebuildIndexes()
{
    DASessionCall source(*m_state, __LINE__);
    DABasePath here;
    const int rc = DAOperations::RebuildIndexes(source, here);
    ++m_state->generation;
    return rc;
}
