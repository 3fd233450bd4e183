#ifndef ULO_TESTS_DATABASETESTUTIL_H
#define ULO_TESTS_DATABASETESTUTIL_H

// Helpers shared by the tests: a compact view of the captured log lines, a
// raw SQLite connection for seeding and checking files, the open-descriptor
// count of the process, and child processes.

#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sqlite3.h>

#include "DACursor.h"
#include "LogCapture.h"

using Strings = std::vector<std::string>;

// Points request at table in the file "t.db" of dir.
template <typename Request>
Request& At(Request& request, const std::string& dir, const char* table)
{
    request.SetPath(dir.c_str(), "t.db");
    request.SetTable(table);
    return request;
}

// Points location (a batch, a session's file) at the file "t.db" of dir.
template <typename Location>
Location& At(Location& location, const std::string& dir)
{
    location.SetPath(dir.c_str(), "t.db");
    return location;
}

// The bytes of a file, to see that it is unchanged.
inline std::string FileBytes(const std::string& path)
{
    std::ostringstream bytes;
    bytes << std::ifstream(path, std::ios::binary).rdbuf();
    return bytes.str();
}

// One log line as Described shows it: "priority file:function > message".
inline std::string Logged(int priority, const std::string& file, const std::string& function,
                          const std::string& message)
{
    return std::to_string(priority) + " " + file + ":" + function + " > " + message;
}

// Every captured line as Logged shows it, so a whole log can be compared at
// once with a readable difference.
inline Strings Described(const LogCapture& log)
{
    Strings out;
    for (const LogLine& line : log.Lines()) {
        out.push_back(Logged(line.priority, line.file, line.function, line.message));
    }
    return out;
}

// text with every from replaced by to.
inline std::string Replaced(std::string text, const std::string& from, const std::string& to)
{
    for (std::size_t at = text.find(from); at != std::string::npos; at = text.find(from, at + to.size())) {
        text.replace(at, from.size(), to);
    }
    return text;
}

// The busy warnings "SQLITE BUSY[1]".."SQLITE BUSY[n]" written from file.
inline Strings BusyWarnings(const std::string& file, int n)
{
    Strings out;
    for (int i = 1; i <= n; ++i) {
        out.push_back(Logged(5, file, "IsRetryLimit", "SQLITE BUSY[" + std::to_string(i) + "]"));
    }
    return out;
}

// The values of column row by row, walking the cursor from its start.
inline Strings ColumnValues(DACursor& cursor, const char* column)
{
    Strings values;
    cursor.MoveToFirst();
    while (cursor.MoveToNext() == 0) {
        std::string value;
        EXPECT_EQ(0, cursor.GetString(column, value));
        values.push_back(value);
    }
    return values;
}

// The cursor's names, then its values column by column.
inline Strings Dump(DACursor& cursor)
{
    Strings out;
    cursor.GetColumn(out);
    for (const std::string& name : Strings(out)) {
        const Strings values = ColumnValues(cursor, name.c_str());
        out.insert(out.end(), values.begin(), values.end());
    }
    return out;
}

// The descriptors the process has open.
inline int OpenDescriptorCount()
{
    return static_cast<int>(std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {}));
}

// Runs body in a child process, its log discarded, which exits with what
// body returns; the child's pid.
inline pid_t Spawn(const std::function<int()>& body)
{
    const pid_t pid = fork();
    if (pid == 0) {
        dlog_set_sink(&dlog_discard_sink, nullptr);
        _exit(body());
    }
    return pid;
}

// Waits for child: its exit code, or -1 when it did not exit on its own.
inline int ExitOf(pid_t child)
{
    int status = -1;
    return waitpid(child, &status, 0) == child && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A plain connection to a database file, independent of the library.
class RawDb {
public:
    explicit RawDb(const std::string& path) { EXPECT_EQ(SQLITE_OK, sqlite3_open(path.c_str(), &m_db)) << path; }
    ~RawDb() { sqlite3_close(m_db); }
    RawDb(const RawDb&) = delete;
    RawDb& operator=(const RawDb&) = delete;

    sqlite3* Handle() const { return m_db; }

    // Runs sql and expects it to succeed.
    void Run(const std::string& sql)
    {
        EXPECT_EQ(SQLITE_OK, sqlite3_exec(m_db, sql.c_str(), nullptr, nullptr, nullptr))
            << sql << ": " << sqlite3_errmsg(m_db);
    }

    // The rows of sql, columns joined by "|" and rows by ";", NULL as "NULL".
    std::string Query(const std::string& sql)
    {
        char** cells = nullptr;
        int rows = 0;
        int columns = 0;
        EXPECT_EQ(SQLITE_OK, sqlite3_get_table(m_db, sql.c_str(), &cells, &rows, &columns, nullptr)) << sql;
        std::string out;
        for (int i = columns; i < (rows + 1) * columns; ++i) {
            out += (i == columns ? "" : i % columns == 0 ? ";" : "|") + std::string(cells[i] ? cells[i] : "NULL");
        }
        sqlite3_free_table(cells);
        return out;
    }

private:
    sqlite3* m_db = nullptr;
};

#endif  // ULO_TESTS_DATABASETESTUTIL_H
