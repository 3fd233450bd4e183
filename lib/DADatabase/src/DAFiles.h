#ifndef DAFILES_H
#define DAFILES_H

// Files the library makes itself: the one rule for the mode of a new
// database file, and new files written beside their place and put there
// whole.

#include <string>

// The directory part of path ("." for a bare name).
std::string DADirectoryOf(const std::string& path);

// Creates path as an empty file (an empty database to SQLite) when nothing
// is there yet; the one place that decides the mode of the database files
// the library creates. mode < 0: 0640 less the umask (SQLite's 0644 less
// the umask, less every permission for others); otherwise exactly mode.
// SQLite gives the -journal, -wal and -shm files the database file's mode.
// An existing file keeps its mode: O_EXCL leaves a file another process
// made meanwhile alone. Failures are left for SQLite's open to meet and
// report; names SQLite does not take as files (":memory:", URIs) are left
// alone.
void DACreateDatabaseFile(const std::string& path, int mode);

// The permission bits of path, or -1 when it cannot be read.
int DAFileModeOf(const std::string& path);

// The bytes free to this process in the directory that holds path, or -1
// when unknown.
long long DAFreeBytes(const std::string& path);

// True when a and b name the same existing file (device and inode).
bool DAIsSameFile(const std::string& a, const std::string& b);

// A file written beside its destination, then put in place whole: created
// as "<to>.XXXXXX" (unique) with exactly mode; Commit syncs it, renames it
// over to and syncs the directory, so that a power cut leaves the old file
// or the whole new one. Until committed, the destructor removes it and any
// "-journal" beside it: a failure leaves nothing behind.
class DANewFile {
public:
    DANewFile() = default;
    ~DANewFile();
    DANewFile(const DANewFile&) = delete;
    DANewFile& operator=(const DANewFile&) = delete;

    // 0, or SQLITE_CANTOPEN (14) with error set (the directory is missing
    // or not writable).
    int Create(const std::string& to, int mode, std::string& error);
    // The temporary file's path and its descriptor (open for writing).
    const std::string& Path() const { return m_path; }
    int Descriptor() const { return m_fd; }
    // 0, or SQLITE_IOERR (10) / SQLITE_CANTOPEN (14) with error set; the
    // temporary file is then removed as on any failure.
    int Commit(std::string& error);

private:
    std::string m_path;
    std::string m_to;
    int m_fd = -1;
};

#endif  // DAFILES_H
