#include "DAWatch.h"

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include <sqlite3.h>

#include "DABusyRetry.h"
#include "DALog.h"
#include "DAOperation.h"
#include "DASqlGenerator.h"
#include "DASqliteHandles.h"
#include "DAWatchSchema.h"

namespace {

constexpr int kOpenFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX;
// The folder tells of the file replaced or deleted and of a log or journal
// appearing; the file and its log tell of every write.
constexpr std::uint32_t kFolderEvents = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO;
constexpr std::uint32_t kFileEvents = IN_MODIFY;
constexpr std::size_t kEventBuffer = 4096;

struct DAWatched {
    std::string table;
    std::int64_t seen = 0;  // its counter at the last Check
    bool missing = false;  // dropped, reported, not created again yet
};

std::string Lower(std::string text)
{
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return text;
}

}  // namespace

struct DAWatchState {
    std::string path;
    std::string folder;
    std::string file;
    DAConnection db;  // declared before the statement, closed after it
    DAStatement counters;  // kept from Check to Check
    DAStatement observe;  // marks every counter seen
    int fd = -1;
    int folderWatch = -1;
    std::vector<DAWatched> tables;  // sorted by name
    std::int64_t schema = -1;  // the schema version the last Check saw
    bool pending = false;  // a wake-up not yet followed by a complete Check
    DAShortBusyWait busy;

    void Close()
    {
        counters.reset();
        observe.reset();
        db.reset();
        if (fd >= 0) {
            close(fd);
        }
        fd = -1;
        tables.clear();
        pending = false;
    }
};

namespace {

// The watch's own connection, lent to the operations of DAOperation.h.
class DAWatchSource : public DAConnectionSource {
public:
    DAWatchSource(DAWatchState& state, int line) : DAConnectionSource(DA_FILE_NAME, line), m_state(state) {}

    int Acquire(DABasePath& /*location*/, DAAccess /*access*/, const char* func, DALease& lease) override
    {
        if (!m_state.db) {
            DA_LOG_WHERE(DLOG_ERROR, File(), func, Line(), "WATCH NOT OPEN");
            return SQLITE_MISUSE;
        }
        lease = DALease(m_state.db.get(), DALeaseEnd{this});
        return SQLITE_OK;
    }

    void Release(sqlite3* /*db*/) noexcept override {}

    bool IsRetryLimit(int& count) override { return m_state.busy.IsRetryLimit(count, DA_FILE_NAME, __LINE__); }

    // Steps stmt from its start under busy-retry, then on through its rows,
    // row(stmt) for each; returns SQLITE_DONE or the failure's code.
    template <typename Row>
    int Rows(sqlite3_stmt* stmt, Row row)
    {
        int rc = DARetryWhileBusy(*this, [&] {
            sqlite3_reset(stmt);
            return sqlite3_step(stmt);
        });
        for (; rc == SQLITE_ROW; rc = sqlite3_step(stmt)) {
            row(stmt);
        }
        sqlite3_reset(stmt);  // ends the read transaction
        return rc;
    }

    // Prepares sql on the watch's connection under busy-retry.
    int PrepareKept(const char* sql, DAStatement& stmt)
    {
        return DARetryWhileBusy(*this, [&] {
            sqlite3_stmt* handle = nullptr;
            const int result = sqlite3_prepare_v2(m_state.db.get(), sql, -1, &handle, nullptr);
            stmt.reset(handle);
            return result;
        });
    }

private:
    DAWatchState& m_state;
};

// Reads every pending event: true when one may come from a commit. gone is
// set when the file itself was created, deleted or moved in its folder: the
// connection no longer holds the file at the path.
bool Drain(DAWatchState& state, bool& gone)
{
    alignas(inotify_event) std::array<char, kEventBuffer> buffer{};
    bool woken = false;
    ssize_t length = 0;
    while ((length = read(state.fd, buffer.data(), buffer.size())) > 0) {
        for (const char* at = buffer.data(); at < buffer.data() + length;) {
            const auto* event = reinterpret_cast<const inotify_event*>(at);
            at += sizeof(inotify_event) + event->len;
            if (event->wd != state.folderWatch || event->len == 0) {
                woken = true;  // the file, its log, or an overflowed queue
                continue;
            }
            const std::string name = event->name;
            if (name == state.file) {
                gone = true;
            } else if (name == state.file + "-wal" || name == state.file + "-journal") {
                woken = true;
                if ((event->mask & (IN_CREATE | IN_MOVED_TO)) != 0 && name.back() == 'l') {
                    inotify_add_watch(state.fd, (state.folder + "/" + name).c_str(), kFileEvents);
                }
            }
        }
    }
    return woken;
}

// The tables and watch triggers of the file, as "table:<name>" and
// "trigger:<name>" in lower case.
int ReadSchema(DAWatchSource& source, sqlite3* db, std::set<std::string>& names)
{
    return DARetryWhileBusy(source, [&] {
        names.clear();
        return sqlite3_exec(
            db, "SELECT type || ':' || name FROM sqlite_master WHERE type IN ('table', 'trigger')",
            [](void* user, int /*columns*/, char** texts, char** /*names*/) {
                static_cast<std::set<std::string>*>(user)->insert(Lower(texts[0] != nullptr ? texts[0] : ""));
                return 0;
            },
            &names, nullptr);
    });
}

// After a schema change: a watched table whose triggers are gone was
// dropped; it is reported, and its triggers are put back once it exists
// again. A table whose counter is gone was unwatched (reported by the
// caller).
int Repair(DAWatchState& state, DAWatchSource& source, std::vector<std::string>& changed)
{
    std::set<std::string> names;
    int rc = ReadSchema(source, state.db.get(), names);
    for (DAWatched& watched : state.tables) {
        if (rc != SQLITE_OK) {
            break;
        }
        const std::string lower = Lower(watched.table);
        const bool triggers = std::all_of(std::begin(kDAWatchEvents), std::end(kDAWatchEvents), [&](const char* event) {
            return names.count("trigger:" + DAWatchTrigger(lower, event)) != 0;
        });
        if (triggers) {
            watched.missing = false;
            continue;
        }
        if (!watched.missing) {
            changed.push_back(watched.table);
        }
        watched.missing = names.count("table:" + lower) == 0;
        if (!watched.missing) {
            DABasePath here;
            rc = DAOperations::Watch(source, here, watched.table.c_str(), watched.seen, state.schema);
        }
    }
    return rc;
}

// Check's work, its lines under func.
int Inspect(DAWatchState& state, const char* func, int line, std::vector<std::string>& changed)
{
    changed.clear();
    DAWatchSource source(state, line);
    if (!state.db) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, line, "WATCH NOT OPEN");
        return SQLITE_MISUSE;
    }
    bool gone = false;
    state.pending = Drain(state, gone) || state.pending;
    if (gone) {
        for (const DAWatched& watched : state.tables) {
            changed.push_back(watched.table);
        }
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, line, "%s FAILED[%d]: %s was deleted or replaced", func,
                     SQLITE_CANTOPEN, state.path.c_str());
        state.Close();
        return SQLITE_CANTOPEN;
    }
    if (state.tables.empty()) {
        state.pending = false;
        return SQLITE_OK;
    }
    DAErrorText error;
    int rc = SQLITE_OK;
    bool locked = false;
    // The write lock is had only once the commit in progress has ended (a
    // wake-up may precede the commit's publication: a log's last write comes
    // before its index is updated), and marking counters seen needs it.
    // Waiting for it is the normal case, not contention: no warning.
    const auto lock = [&] {
        state.busy.SetQuiet(true);
        rc = source.Execute(state.db.get(), "BEGIN IMMEDIATE", error);
        state.busy.SetQuiet(false);
        locked = rc == SQLITE_OK;
    };
    if (state.pending) {
        lock();
    }
    if (rc == SQLITE_OK && !state.counters) {
        const std::string sql = std::string("SELECT s.schema_version, w.name, w.changes, w.seen FROM "
                                            "pragma_schema_version AS s LEFT JOIN \"") +
            kDAWatchTable + "\" AS w";
        rc = source.PrepareKept(sql.c_str(), state.counters);
    }
    std::vector<std::pair<std::string, std::int64_t>> rows;
    std::int64_t schema = state.schema;
    // A value is only taken as seen together with marking it so (the
    // triggers count again only then), which needs the lock.
    bool unseen = false;
    while (rc == SQLITE_OK) {
        rows.clear();
        unseen = false;
        rc = source.Rows(state.counters.get(), [&](sqlite3_stmt* stmt) {
            schema = sqlite3_column_int64(stmt, 0);
            if (sqlite3_column_type(stmt, 1) != SQLITE_NULL) {
                rows.emplace_back(Lower(reinterpret_cast<const char*>(sqlite3_column_text(stmt, 1))),
                                  sqlite3_column_int64(stmt, 2));
                unseen = unseen || rows.back().second != sqlite3_column_int64(stmt, 3);
            }
        });
        rc = rc == SQLITE_DONE ? SQLITE_OK : rc;
        if (rc != SQLITE_OK || !unseen || locked) {
            break;
        }
        lock();
    }
    if (rc == SQLITE_OK && unseen && !state.observe) {
        const std::string sql =
            std::string("UPDATE \"") + kDAWatchTable + "\" SET seen = changes WHERE seen <> changes";
        rc = source.PrepareKept(sql.c_str(), state.observe);
    }
    if (rc == SQLITE_OK && unseen) {
        rc = source.Rows(state.observe.get(), [](sqlite3_stmt* /*stmt*/) {});
        rc = rc == SQLITE_DONE ? SQLITE_OK : rc;
    }
    if (locked) {
        const int end = rc == SQLITE_OK ? source.Execute(state.db.get(), "COMMIT", error) : rc;
        if (end != SQLITE_OK) {
            sqlite3_exec(state.db.get(), "ROLLBACK", nullptr, nullptr, nullptr);
        }
        rc = rc == SQLITE_OK ? end : rc;
    }
    if (rc == SQLITE_ERROR) {
        // No counter table: every watched table was unwatched.
        state.counters.reset();
        rows.clear();
        rc = SQLITE_OK;
    }
    if (rc != SQLITE_OK) {
        DA_LOG_WHERE(DLOG_ERROR, source.File(), func, line, "%s FAILED[%d]: %s", func, rc,
                     error ? error.get() : sqlite3_errmsg(state.db.get()));
        return rc;
    }
    state.pending = false;
    std::vector<DAWatched> kept;
    for (DAWatched& watched : state.tables) {
        const std::string lower = Lower(watched.table);
        const auto row = std::find_if(rows.begin(), rows.end(), [&](const auto& r) { return r.first == lower; });
        if (row == rows.end() || row->second != watched.seen) {
            changed.push_back(watched.table);
        }
        if (row != rows.end()) {
            watched.seen = row->second;
            kept.push_back(std::move(watched));
        }
    }
    state.tables = std::move(kept);
    if (schema != state.schema) {
        state.schema = schema;
        rc = Repair(state, source, changed);
    }
    std::sort(changed.begin(), changed.end());
    changed.erase(std::unique(changed.begin(), changed.end()), changed.end());
    return rc;
}

}  // namespace

DAWatch::DAWatch() : m_state(std::make_unique<DAWatchState>())
{
}

DAWatch::~DAWatch()
{
    Close();
}

int DAWatch::Open(DABasePath& location)
{
    const char* const func = "Open";
    std::string dir;
    std::string file;
    location.GetPath(dir, file);
    Close();
    DAWatchState& state = *m_state;
    DASqlGenerator().GetDBPath(dir, file, state.path);
    const std::size_t slash = state.path.rfind('/');
    state.folder = slash == std::string::npos ? "." : slash == 0 ? "/" : state.path.substr(0, slash);
    state.file = slash == std::string::npos ? state.path : state.path.substr(slash + 1);

    DAWatchSource source(state, __LINE__);
    DAConnection db;
    int rc = DARetryWhileBusy(source, [&] {
        db.reset();
        sqlite3* opened = nullptr;
        const int result = sqlite3_open_v2(state.path.c_str(), &opened, kOpenFlags, nullptr);
        db.reset(opened);
        return result;
    });
    std::int64_t schema = 0;
    if (rc == SQLITE_OK) {  // reads the header: 26 for a file that is not a database
        DAStatement stmt;
        rc = DARetryWhileBusy(source, [&] {
            sqlite3_stmt* handle = nullptr;
            const int result = sqlite3_prepare_v2(db.get(), "PRAGMA schema_version", -1, &handle, nullptr);
            stmt.reset(handle);
            return result;
        });
        rc = rc == SQLITE_OK ? DARetryWhileBusy(source, [&] { return sqlite3_step(stmt.get()); }) : rc;
        if (rc == SQLITE_ROW) {
            schema = sqlite3_column_int64(stmt.get(), 0);
            rc = SQLITE_OK;
        }
        // The watch writes only its marks of counters seen; one lost to a
        // power cut makes the next watches report a change once more, so
        // its commits need not wait for the disk.
        sqlite3_exec(db.get(), "PRAGMA synchronous = NORMAL", nullptr, nullptr, nullptr);
    }
    if (rc != SQLITE_OK) {
        DA_LOG(DLOG_ERROR, "DB open failed. Error no(%d): %s", rc, db ? sqlite3_errmsg(db.get()) : sqlite3_errstr(rc));
        return rc;
    }
    const std::string wal = state.path + "-wal";  // made first: nothing may throw once fd is open
    const int fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    const int folderWatch = fd < 0 ? -1 : inotify_add_watch(fd, state.folder.c_str(), kFolderEvents);
    if (folderWatch < 0 || inotify_add_watch(fd, state.path.c_str(), kFileEvents) < 0) {
        DA_LOG(DLOG_ERROR, "%s FAILED[%d]: inotify: %s", func, SQLITE_CANTOPEN, std::strerror(errno));
        if (fd >= 0) {
            close(fd);
        }
        return SQLITE_CANTOPEN;
    }
    inotify_add_watch(fd, wal.c_str(), kFileEvents);  // if there is one now
    state.db = std::move(db);
    state.fd = fd;
    state.folderWatch = folderWatch;
    state.schema = schema;
    return SQLITE_OK;
}

int DAWatch::AddTable(char const* table)
{
    DAWatchState& state = *m_state;
    DAWatchSource source(state, __LINE__);
    const auto at = std::lower_bound(
        state.tables.begin(), state.tables.end(), table,
        [](const DAWatched& watched, char const* name) { return name != nullptr && watched.table < name; });
    if (state.db && table != nullptr && at != state.tables.end() && at->table == table) {
        return SQLITE_OK;
    }
    DAWatched watched;
    DABasePath here;
    const int rc = DAOperations::Watch(source, here, table, watched.seen, state.schema);
    if (rc == SQLITE_OK) {
        watched.table = table;
        state.tables.insert(at, std::move(watched));
    }
    return rc;
}

int DAWatch::GetFd() const
{
    return m_state->fd;
}

int DAWatch::Check(std::vector<std::string>& changed)
{
    return Inspect(*m_state, "Check", __LINE__, changed);
}

int DAWatch::Wait(int timeoutMs, std::vector<std::string>& changed)
{
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    int rc = Inspect(*m_state, "Wait", __LINE__, changed);
    while (rc == SQLITE_OK && changed.empty()) {
        int remaining = -1;
        if (timeoutMs >= 0) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
            remaining = static_cast<int>(std::max<std::chrono::milliseconds::rep>(left.count(), 0));
        }
        pollfd descriptor{m_state->fd, POLLIN, 0};
        const int ready = poll(&descriptor, 1, remaining);
        if (ready == 0) {
            return SQLITE_OK;
        }
        if (ready < 0 && errno != EINTR) {
            DA_LOG(DLOG_ERROR, "Wait FAILED[%d]: poll: %s", SQLITE_IOERR, std::strerror(errno));
            return SQLITE_IOERR;
        }
        rc = Inspect(*m_state, "Wait", __LINE__, changed);
    }
    return rc;
}

void DAWatch::Close()
{
    m_state->Close();
}
