// Keeping files safe: backups, restores, integrity checks, index rebuilds
// and salvage, in the frame of every operation (DAOperation.h).

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <limits>
#include <string>
#include <vector>

#include "DABusyRetry.h"
#include "DAFiles.h"
#include "DALog.h"
#include "DAOperation.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"

namespace {

// Pages copied per backup step (1 MiB at 4 KiB pages).
constexpr int kBackupStepPages = 256;
// Messages kept from an integrity check.
constexpr int kMaxProblems = 100;
constexpr int kNoAccessForOthers = ~07;

std::string PathOf(DABasePath& location)
{
    std::string dir;
    std::string file;
    std::string path;
    location.GetPath(dir, file);
    DASqlGenerator().GetDBPath(dir, file, path);
    return path;
}

// Opens path with flags under busy-retry: 0 with db open, else the code
// with error set and db empty.
int OpenFile(DAConnectionSource& source, const std::string& path, int flags, DAConnection& db, std::string& error)
{
    const int rc = DARetryWhileBusy(source, [&] {
        db.reset();
        sqlite3* opened = nullptr;
        const int result = sqlite3_open_v2(path.c_str(), &opened, flags, nullptr);
        db.reset(opened);
        return result;
    });
    if (rc != SQLITE_OK) {
        error = db ? sqlite3_errmsg(db.get()) : sqlite3_errstr(rc);
        db.reset();
    }
    return rc;
}

struct NoRows {
    void operator()(sqlite3_stmt* /*stmt*/) const {}
};

// Runs sql to its end on db, preparing and taking the first step under
// busy-retry; each row goes to row(stmt). 0, or the failing step's own code
// (sqlite3_prepare_v2) with error set to SQLite's text.
template <typename Row = NoRows>
int Run(DAConnectionSource& source, sqlite3* db, const std::string& sql, std::string& error, Row row = Row())
{
    DAStatement stmt;
    int rc = DARetryWhileBusy(source, [&] {
        sqlite3_stmt* handle = nullptr;
        const int result = sqlite3_prepare_v2(db, sql.c_str(), -1, &handle, nullptr);
        stmt.reset(handle);
        return result;
    });
    if (rc == SQLITE_OK) {
        rc = DARetryWhileBusy(source, [&] { return sqlite3_step(stmt.get()); });
        while (rc == SQLITE_ROW) {
            row(stmt.get());
            rc = sqlite3_step(stmt.get());
        }
    }
    if (rc == SQLITE_DONE || rc == SQLITE_OK) {
        return SQLITE_OK;
    }
    error = sqlite3_errmsg(db);
    return rc;
}

std::string Text(sqlite3_stmt* stmt, int column)
{
    const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(stmt, column));
    return text != nullptr ? text : "";
}

// The quick (or full) check of db's main file: 0 with the messages (empty
// for a sound file), also when the check itself ends with an error after
// them; else the code with error set.
int Check(DAConnectionSource& source, sqlite3* db, bool full, std::vector<std::string>& problems, std::string& error)
{
    std::vector<std::string> found;
    const int rc = Run(source, db, full ? "PRAGMA integrity_check(100)" : "PRAGMA quick_check(100)", error,
                       [&](sqlite3_stmt* stmt) {
                           // A row may hold several messages, one per line.
                           const std::string text = Text(stmt, 0);
                           std::string::size_type begin = 0;
                           while (begin <= text.size() && found.size() < kMaxProblems) {
                               std::string::size_type end = text.find('\n', begin);
                               end = end == std::string::npos ? text.size() : end;
                               const std::string message = text.substr(begin, end - begin);
                               if (message != "ok" && !message.empty() && message.rfind("*** in database", 0) != 0) {
                                   found.push_back(message);
                               }
                               begin = end + 1;
                           }
                       });
    if (rc != SQLITE_OK && found.empty()) {
        return rc;
    }
    problems = std::move(found);
    return SQLITE_OK;
}

// The integers of sql's first row, read on db.
template <std::size_t N>
int ReadIntegers(DAConnectionSource& source, sqlite3* db, const std::string& sql, std::int64_t (&values)[N],
                 std::string& error)
{
    return Run(source, db, sql, error, [&](sqlite3_stmt* stmt) {
        for (std::size_t i = 0; i < N; ++i) {
            values[i] = sqlite3_column_int64(stmt, static_cast<int>(i));
        }
    });
}

// Whether a failure while writing a file means that there was no room: a
// full disk (ENOSPC, which SQLite reports as 13 itself), a quota, or the
// process's file-size limit (EFBIG, which SQLite reports as an I/O error).
bool OutOfRoom(int rc, int systemErrno)
{
    return rc == SQLITE_FULL ||
        ((rc & 0xff) == SQLITE_IOERR && (systemErrno == EFBIG || systemErrno == EDQUOT || systemErrno == ENOSPC));
}

// A copy of a file in WAL mode says so in its header (bytes 18 and 19 are
// 2), and then every reader, a read-only one too, leaves -wal and -shm
// files beside it. The new file, with no log, becomes a rollback-journal
// file (1 and 1); a restore into a WAL file keeps that file in WAL mode.
void MarkRollbackJournal(int fd)
{
    constexpr off_t kVersionBytes = 18;
    unsigned char version[2] = {};
    if (pread(fd, version, sizeof version, kVersionBytes) == sizeof version && version[0] == 2 && version[1] == 2) {
        const unsigned char legacy[2] = {1, 1};
        (void)!pwrite(fd, legacy, sizeof legacy, kVersionBytes);
    }
}

// Writes a new database file at toPath with exactly mode: beside it first,
// fill(dest, error) writing on a connection of its own (no journal: on a
// failure the whole file goes; synced at its commit), quick-checked,
// closed, then synced and put in place (DANewFile). 0, or the code with
// error set and nothing left behind.
template <typename Fill>
int WriteNewFile(DAConnectionSource& source, const std::string& toPath, int mode, std::string& error, Fill fill)
{
    // A log or journal of to would be applied to the new file by its next
    // opener: to is in use, or was left mid-transaction.
    for (const char* suffix : {"-wal", "-journal"}) {
        if (DAFileModeOf(toPath + suffix) >= 0) {
            error = toPath;
            error.append(" is in use: ").append(toPath).append(suffix).append(" exists");
            return SQLITE_BUSY;
        }
    }
    DANewFile file;
    int rc = file.Create(toPath, mode, error);
    if (rc != SQLITE_OK) {
        return rc;
    }
    {
        DAConnection dest;
        rc = OpenFile(source, file.Path(), SQLITE_OPEN_READWRITE, dest, error);
        if (rc == SQLITE_OK) {
            rc = Run(source, dest.get(), "PRAGMA journal_mode = OFF", error);
        }
        if (rc == SQLITE_OK) {
            rc = Run(source, dest.get(), "PRAGMA synchronous = FULL", error);
        }
        if (rc == SQLITE_OK) {
            rc = fill(dest.get(), error);
        }
        std::vector<std::string> problems;
        if (rc == SQLITE_OK) {
            rc = Check(source, dest.get(), false, problems, error);
        }
        if (rc == SQLITE_OK && !problems.empty()) {
            rc = SQLITE_CORRUPT;
            error = "the new file fails its check: " + problems.front();
        }
        if (rc != SQLITE_OK && dest && OutOfRoom(rc, sqlite3_system_errno(dest.get()))) {
            rc = SQLITE_FULL;
            error = sqlite3_errstr(rc);
        }
    }
    if (rc == SQLITE_OK) {
        MarkRollbackJournal(file.Descriptor());
    }
    return rc == SQLITE_OK ? file.Commit(error) : rc;
}

// The permission bits a copy of path gets: its own, less every permission
// for others.
int CopyModeOf(const std::string& path)
{
    const int mode = DAFileModeOf(path);
    return mode < 0 ? 0600 : mode & kNoAccessForOthers;
}

// Copies src's main file (one committed state) into a new file at toPath.
int CopyDatabase(DAConnectionSource& source, sqlite3* src, const std::string& toPath, long long& pages,
                 std::string& error)
{
    const char* name = sqlite3_db_filename(src, "main");
    const std::string fromPath = name != nullptr ? name : "";
    if (DAIsSameFile(fromPath, toPath)) {
        error = "the copy would replace its own source " + toPath;
        return SQLITE_MISUSE;
    }
    // A read transaction held across the steps: every step copies the same
    // committed state, and commits of other connections never restart the
    // copy. With the write-ahead log writers do not wait for a reader.
    const DARollbackGuard end(src);
    std::int64_t size[3] = {};
    int rc = Run(source, src, "BEGIN", error);
    if (rc == SQLITE_OK) {
        rc =
            ReadIntegers(source, src,
                         "SELECT page_count, page_size, (SELECT count(*) FROM sqlite_master) FROM pragma_page_count(), "
                         "pragma_page_size()",
                         size, error);
    }
    if (rc != SQLITE_OK) {
        return rc;
    }
    const long long room = DAFreeBytes(toPath);
    if (room >= 0 && room < size[0] * size[1]) {
        error = sqlite3_errstr(SQLITE_FULL);
        return SQLITE_FULL;
    }
    return WriteNewFile(source, toPath, CopyModeOf(fromPath), error, [&](sqlite3* dest, std::string& failure) {
        const DABackup backup(sqlite3_backup_init(dest, "main", src, "main"));
        if (!backup) {
            failure = sqlite3_errmsg(dest);
            return sqlite3_errcode(dest);
        }
        int step = SQLITE_OK;
        while (step == SQLITE_OK) {
            step = DARetryWhileBusy(source, [&] { return sqlite3_backup_step(backup.get(), kBackupStepPages); });
        }
        pages = sqlite3_backup_pagecount(backup.get());
        if (step != SQLITE_DONE) {
            failure = sqlite3_errstr(step);
            return step;
        }
        return SQLITE_OK;
    });
}

// Copies the intact database file at fromPath into live's main file, in one
// transaction on live.
int RestoreInto(DAConnectionSource& source, const std::string& fromPath, sqlite3* live, long long& pages,
                std::string& error)
{
    const char* name = sqlite3_db_filename(live, "main");
    if (DAIsSameFile(fromPath, name != nullptr ? name : "")) {
        error = "restore of a file from itself: " + fromPath;
        return SQLITE_MISUSE;
    }
    DAConnection copy;
    int rc = OpenFile(source, fromPath, SQLITE_OPEN_READONLY, copy, error);
    if (rc != SQLITE_OK) {
        return rc;
    }
    const DARollbackGuard end(copy.get());
    std::int64_t size[2] = {};
    rc = Run(source, copy.get(), "BEGIN", error);
    if (rc == SQLITE_OK) {
        rc = ReadIntegers(source, copy.get(),
                          "SELECT page_count, (SELECT count(*) FROM sqlite_master) FROM pragma_page_count()", size,
                          error);
    }
    if (rc == SQLITE_OK && size[0] == 0) {  // an empty file: SQLite's empty database, no backup
        rc = SQLITE_NOTADB;
        error = sqlite3_errstr(rc);
    }
    std::vector<std::string> problems;
    if (rc == SQLITE_OK) {
        rc = Check(source, copy.get(), false, problems, error);
    }
    if (rc == SQLITE_OK && !problems.empty()) {
        rc = SQLITE_CORRUPT;
        error = problems.front();
    }
    if (rc != SQLITE_OK) {
        return rc;
    }
    const DABackup backup(sqlite3_backup_init(live, "main", copy.get(), "main"));
    if (!backup) {
        error = sqlite3_errmsg(live);
        return sqlite3_errcode(live);
    }
    rc = DARetryWhileBusy(source, [&] { return sqlite3_backup_step(backup.get(), -1); });
    pages = sqlite3_backup_pagecount(backup.get());
    if (rc != SQLITE_DONE) {
        error = sqlite3_errstr(rc);
        return rc;
    }
    return SQLITE_OK;
}

// Indexes that REINDEX cannot rebuild (a damaged page: REINDEX, DROP INDEX
// and VACUUM all fail at it) leave the schema and are created anew from
// their statements, all in one transaction; VACUUM then frees the pages
// the old ones held, which nothing refers to any more.
int RecreateIndexes(DAConnectionSource& source, sqlite3* db, int& count, std::string& error)
{
    std::vector<std::string> statements;
    const char* const explicitIndexes = "FROM sqlite_master WHERE type = 'index' AND sql IS NOT NULL";
    int rc = Run(source, db, std::string("SELECT sql ") + explicitIndexes, error,
                 [&](sqlite3_stmt* stmt) { statements.push_back(Text(stmt, 0)); });
    if (rc != SQLITE_OK) {
        return rc;
    }
    {
        const DARollbackGuard rollback(db);
        const std::vector<std::string> before = {"BEGIN IMMEDIATE", "PRAGMA writable_schema = ON",
                                                 std::string("DELETE ") + explicitIndexes,
                                                 "PRAGMA writable_schema = RESET"};
        for (const std::string& sql : before) {
            rc = rc == SQLITE_OK ? Run(source, db, sql, error) : rc;
        }
        for (const std::string& sql : statements) {
            rc = rc == SQLITE_OK ? Run(source, db, sql, error) : rc;
        }
        rc = rc == SQLITE_OK ? Run(source, db, "COMMIT", error) : rc;
    }
    // Never leave a connection able to write the schema; after a rollback
    // the schema is read again.
    std::string ignored;
    Run(source, db, "PRAGMA writable_schema = RESET", ignored);
    count = static_cast<int>(statements.size());
    return rc == SQLITE_OK ? Run(source, db, "VACUUM", error) : rc;
}

// name in quote characters q, each inside doubled: an SQL name ("...") or
// text literal ('...') whatever it holds.
std::string Quoted(const std::string& name, char q = '"')
{
    std::string out(1, q);
    for (const char c : name) {
        out += c == q ? std::string(2, q) : std::string(1, c);
    }
    return out + q;
}

std::string Literal(const std::string& text)
{
    return Quoted(text, '\'');
}

// a + gap, at most INT64_MAX.
std::int64_t Past(std::int64_t a, std::uint64_t gap)
{
    const auto room =
        static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()) - static_cast<std::uint64_t>(a);
    return gap >= room ? std::numeric_limits<std::int64_t>::max()
                       : static_cast<std::int64_t>(a + static_cast<std::int64_t>(gap));
}

// Copies the rows of one table from src to dest by rowid, skipping what
// cannot be read: after a failure the next rowid whose seek works is
// searched (doubling the gap, then halving it), so a damaged leaf or
// subtree costs the rows it holds and little time.
class DATableCopy {
public:
    DATableCopy(DAConnectionSource& source, sqlite3* src, sqlite3* dest, const std::string& table)
        : m_source(source), m_src(src), m_dest(dest), m_name(table), m_table(Quoted(table))
    {
    }

    // 0 with the counts set, or a failure to write dest (its code, error set).
    int Copy(std::int64_t& rows, std::int64_t& lost, std::string& error)
    {
        rows = 0;
        DAStatement select = Prepare(m_src, "SELECT rowid, * FROM " + m_table + " WHERE rowid >= ?1 ORDER BY rowid");
        const bool byRowid = select != nullptr;
        if (!byRowid) {  // WITHOUT ROWID: as far as it reads
            select = Prepare(m_src, "SELECT NULL, * FROM " + m_table);
        }
        if (!select) {
            lost = -1;
            return SQLITE_OK;
        }
        const int columns = sqlite3_column_count(select.get());
        std::string insert = "INSERT INTO " + m_table + "(" + (byRowid ? "rowid" : "");
        std::string values = byRowid ? "?1" : "";
        for (int i = 1; i < columns; ++i) {
            insert += (i > 1 || byRowid ? ", " : "") + Quoted(sqlite3_column_name(select.get(), i));
            values += (i > 1 || byRowid ? ", ?" : "?") + std::to_string(i + 1);
        }
        DAStatement write = Prepare(m_dest, insert + ") VALUES (" + values + ")");
        if (!write) {
            error = sqlite3_errmsg(m_dest);
            return sqlite3_errcode(m_dest);
        }
        bool damaged = false;
        std::int64_t start = std::numeric_limits<std::int64_t>::min();
        for (bool more = true; more;) {
            sqlite3_reset(select.get());
            sqlite3_bind_int64(select.get(), 1, start);
            bool any = false;
            std::int64_t last = start;
            int rc = SQLITE_OK;
            while ((rc = sqlite3_step(select.get())) == SQLITE_ROW) {
                last = sqlite3_column_int64(select.get(), 0);
                any = true;
                for (int i = byRowid ? 0 : 1; i < columns; ++i) {
                    sqlite3_bind_value(write.get(), i + 1, sqlite3_column_value(select.get(), i));
                }
                const int wrote = sqlite3_step(write.get());
                sqlite3_reset(write.get());
                if (wrote != SQLITE_DONE) {
                    error = sqlite3_errmsg(m_dest);
                    return wrote;
                }
                ++rows;
            }
            if (rc == SQLITE_DONE) {
                break;
            }
            damaged = true;
            // bad: every rowid up to it was read, or cannot be; a row that
            // fails at once (a damaged overflow page) is itself skipped.
            std::int64_t bad = last;
            if (!any && Seek(start, bad) != SQLITE_ROW) {
                bad = start;
            }
            more = byRowid && bad < std::numeric_limits<std::int64_t>::max() && NextReadable(bad, start);
        }
        lost = damaged ? LostRows(rows) : 0;
        return SQLITE_OK;
    }

private:
    // The rows count(*) finds beyond rows, through the table or else
    // through one of its full indexes (one entry per row, read in index
    // order so that the index is what is read); -1 when none reads.
    std::int64_t LostRows(std::int64_t rows)
    {
        std::vector<std::string> ways = {"SELECT count(*) FROM " + m_table};
        std::string ignored;
        ::Run(m_source, m_src,
              "SELECT l.name, i.name FROM pragma_index_list(" + Literal(m_name) +
                  ") AS l, pragma_index_info(l.name) AS i WHERE l.partial = 0 AND i.seqno = 0 AND i.name IS NOT NULL",
              ignored, [&](sqlite3_stmt* stmt) {
                  ways.push_back("SELECT count(*) FROM (SELECT 1 FROM " + m_table + " INDEXED BY " +
                                 Quoted(Text(stmt, 0)) + " ORDER BY " + Quoted(Text(stmt, 1)) + ")");
              });
        for (const std::string& way : ways) {
            std::int64_t total[1] = {-1};
            if (ReadIntegers(m_source, m_src, way, total, ignored) == SQLITE_OK && total[0] >= rows) {
                return total[0] - rows;
            }
        }
        return -1;
    }

    static DAStatement Prepare(sqlite3* db, const std::string& sql)
    {
        sqlite3_stmt* stmt = nullptr;
        sqlite3_prepare_v2(db, sql.c_str(), -1, &stmt, nullptr);
        return DAStatement(stmt);
    }

    // Seeks the first rowid >= at: SQLITE_ROW with found set, SQLITE_DONE
    // past the last row, or the failure.
    int Seek(std::int64_t at, std::int64_t& found)
    {
        if (!m_probe) {
            m_probe = Prepare(m_src, "SELECT rowid FROM " + m_table + " WHERE rowid >= ?1 ORDER BY rowid LIMIT 1");
        }
        if (!m_probe) {
            return SQLITE_ERROR;
        }
        sqlite3_reset(m_probe.get());
        sqlite3_bind_int64(m_probe.get(), 1, at);
        const int rc = sqlite3_step(m_probe.get());
        found = rc == SQLITE_ROW ? sqlite3_column_int64(m_probe.get(), 0) : found;
        return rc;
    }

    bool Readable(std::int64_t at)
    {
        std::int64_t found = 0;
        const int rc = Seek(at, found);
        return rc == SQLITE_ROW || rc == SQLITE_DONE;
    }

    // The smallest rowid above bad from which the table reads again (into
    // next); false when there is none.
    bool NextReadable(std::int64_t bad, std::int64_t& next)
    {
        std::uint64_t gap = 1;
        std::int64_t high = Past(bad, gap);
        while (!Readable(high)) {
            if (high == std::numeric_limits<std::int64_t>::max()) {
                return false;
            }
            gap *= 2;
            high = Past(bad, gap);
        }
        std::int64_t low = bad;  // not readable, or read already
        const auto distance = [&] { return static_cast<std::uint64_t>(high) - static_cast<std::uint64_t>(low); };
        while (distance() > 1) {
            const std::int64_t middle = Past(low, distance() / 2);
            (Readable(middle) ? high : low) = middle;
        }
        next = high;
        return true;
    }

    DAConnectionSource& m_source;
    sqlite3* m_src;
    sqlite3* m_dest;
    std::string m_name;
    std::string m_table;
    DAStatement m_probe;
};

}  // namespace

int DAOperations::Backup(DAConnectionSource& source, DABasePath& from, DABasePath& to)
{
    const char* const func = "Backup";
    const std::string toPath = PathOf(to);
    DALease db;
    int rc = source.Acquire(from, DAAccess::Read, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string error;
    long long pages = 0;
    rc = CopyDatabase(source, db.get(), toPath, pages, error);
    if (rc == SQLITE_OK) {
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "Backup SUCCESS[%d]: %lld pages", rc, pages);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "Backup FAILED[%d]: %s", rc, error.c_str());
    }
    return rc;
}

int DAOperations::Restore(DAConnectionSource& source, DABasePath& from, DABasePath& to)
{
    const char* const func = "Restore";
    const std::string fromPath = PathOf(from);
    DALease db;
    int rc = source.Acquire(to, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string error;
    long long pages = 0;
    rc = RestoreInto(source, fromPath, db.get(), pages, error);
    if (rc == SQLITE_OK) {
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "Restore SUCCESS[%d]: %lld pages", rc, pages);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "Restore FAILED[%d]: %s", rc, error.c_str());
    }
    return rc;
}

int DAOperations::CheckIntegrity(DAConnectionSource& source, DABasePath& location, bool full,
                                 std::vector<std::string>& problems)
{
    const char* const func = "CheckIntegrity";
    DALease db;
    int rc = source.Acquire(location, DAAccess::Read, func, db);
    if (rc != SQLITE_OK) {
        problems.assign(1, sqlite3_errstr(rc));
        return rc;
    }
    std::string error;
    std::vector<std::string> found;
    rc = Check(source, db.get(), full, found, error);
    if (rc != SQLITE_OK) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "CheckIntegrity FAILED[%d]: %s", rc,
                     error.c_str());
        problems.assign(1, error);
        return rc;
    }
    DA_LOG_WHERE(found.empty() ? DLOG_INFO : DLOG_ERROR, source.File(), func, source.Line(),
                 "CheckIntegrity SUCCESS[%d]: %d problems", rc, static_cast<int>(found.size()));
    problems = std::move(found);
    return rc;
}

int DAOperations::RebuildIndexes(DAConnectionSource& source, DABasePath& location)
{
    const char* const func = "RebuildIndexes";
    DALease db;
    int rc = source.Acquire(location, DAAccess::Write, func, db);
    if (rc != SQLITE_OK) {
        return rc;
    }
    std::string error;
    rc = Run(source, db.get(), "REINDEX", error);
    int recreated = 0;
    if (rc == SQLITE_CORRUPT) {
        rc = RecreateIndexes(source, db.get(), recreated, error);
    }
    if (rc == SQLITE_OK) {
        DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "RebuildIndexes SUCCESS[%d]: %d recreated", rc,
                     recreated);
    } else {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "RebuildIndexes FAILED[%d]: %s", rc,
                     error.c_str());
    }
    return rc;
}

namespace {

// Salvage's work: from's schema and readable rows into a new file at toPath.
int SalvageInto(DAConnectionSource& source, const std::string& fromPath, const std::string& toPath,
                DASalvageReport& report, std::string& error)
{
    if (DAIsSameFile(fromPath, toPath)) {
        error = "the salvage would replace its own source " + toPath;
        return SQLITE_MISUSE;
    }
    DAConnection src;
    int rc = OpenFile(source, fromPath, SQLITE_OPEN_READONLY, src, error);
    if (rc == SQLITE_OK) {
        // Lets SQLite read a file shorter than its header says (truncated),
        // as far as it goes; the connection is read-only.
        rc = Run(source, src.get(), "PRAGMA writable_schema = ON", error);
    }
    struct Entry {
        std::string type;
        std::string name;
        std::string sql;
    };
    std::vector<Entry> schema;
    if (rc == SQLITE_OK) {
        rc = Run(source, src.get(), "SELECT type, name, sql FROM sqlite_master WHERE sql IS NOT NULL ORDER BY rowid",
                 error, [&](sqlite3_stmt* stmt) {
                     schema.push_back({Text(stmt, 0), Text(stmt, 1), Text(stmt, 2)});
                 });
    }
    std::int64_t settings[2] = {};
    if (rc == SQLITE_OK) {
        rc = ReadIntegers(source, src.get(),
                          "SELECT page_size, user_version FROM pragma_page_size(), pragma_user_version()", settings,
                          error);
    }
    if (rc != SQLITE_OK) {
        return rc;
    }
    const auto isTable = [](const Entry& entry) {
        return entry.type == "table" && entry.sql.compare(0, 20, "CREATE VIRTUAL TABLE") != 0;
    };
    return WriteNewFile(source, toPath, CopyModeOf(fromPath), error, [&](sqlite3* dest, std::string& failure) {
        int result = Run(source, dest, "PRAGMA page_size = " + std::to_string(settings[0]), failure);
        result = result == SQLITE_OK ? Run(source, dest, "BEGIN", failure) : result;
        for (const Entry& entry : schema) {  // tables first (SQLite's own, such as sqlite_sequence, come with them)
            if (result == SQLITE_OK && isTable(entry) && entry.name.compare(0, 7, "sqlite_") != 0) {
                result = Run(source, dest, entry.sql, failure);
            }
        }
        std::vector<DASalvageReport::Table> tables;
        for (const Entry& entry : schema) {
            if (result == SQLITE_OK && isTable(entry) &&
                (entry.name.compare(0, 7, "sqlite_") != 0 || entry.name == "sqlite_sequence")) {
                DASalvageReport::Table table{entry.name, 0, 0};
                result = DATableCopy(source, src.get(), dest, entry.name).Copy(table.rows, table.lost, failure);
                tables.push_back(table);
            }
        }
        for (const Entry& entry : schema) {  // indexes, triggers and views once the rows are in
            if (result == SQLITE_OK && entry.type != "table") {
                result = Run(source, dest, entry.sql, failure);
            }
        }
        result = result == SQLITE_OK
            ? Run(source, dest, "PRAGMA user_version = " + std::to_string(settings[1]), failure)
            : result;
        result = result == SQLITE_OK ? Run(source, dest, "COMMIT", failure) : result;
        if (result == SQLITE_OK) {
            report.tables = std::move(tables);
        }
        return result;
    });
}

}  // namespace

int DAOperations::Salvage(DAConnectionSource& source, DABasePath& from, DABasePath& to, DASalvageReport& report)
{
    const char* const func = "Salvage";
    const std::string fromPath = PathOf(from);
    const std::string toPath = PathOf(to);
    std::string error;
    DASalvageReport found;
    const int rc = SalvageInto(source, fromPath, toPath, found, error);
    if (rc != SQLITE_OK) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, source.Line(), "Salvage FAILED[%d]: %s", rc, error.c_str());
        return rc;
    }
    long long rows = 0;
    long long lost = 0;
    for (const DASalvageReport::Table& table : found.tables) {
        rows += table.rows;
        lost = lost < 0 || table.lost < 0 ? -1 : lost + table.lost;
    }
    DA_LOG_WHERE(DLOG_INFO, source.File(), func, source.Line(), "Salvage SUCCESS[%d]: %lld rows, %lld lost", rc, rows,
                 lost);
    report = std::move(found);
    return rc;
}
