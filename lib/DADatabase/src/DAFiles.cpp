#include "DAFiles.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include <sqlite3.h>

namespace {

constexpr mode_t kDefaultMode = 0640;

std::string SystemError(const char* what, const std::string& path)
{
    return std::string(what) + " " + path + ": " + std::strerror(errno);
}

}  // namespace

std::string DADirectoryOf(const std::string& path)
{
    const std::string::size_type slash = path.rfind('/');
    return slash == std::string::npos ? "." : slash == 0 ? "/" : path.substr(0, slash);
}

long long DAFreeBytes(const std::string& path)
{
    struct statvfs space {};
    if (statvfs(DADirectoryOf(path).c_str(), &space) != 0) {
        return -1;
    }
    return static_cast<long long>(space.f_bavail) * static_cast<long long>(space.f_frsize);
}

void DACreateDatabaseFile(const std::string& path, int mode)
{
    if (path.empty() || path == ":memory:" || path.compare(0, 5, "file:") == 0) {
        return;
    }
    const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC,
                        mode < 0 ? kDefaultMode : static_cast<mode_t>(mode));
    if (fd < 0) {
        return;
    }
    if (mode >= 0) {
        fchmod(fd, static_cast<mode_t>(mode));  // exactly, whatever the umask
    }
    close(fd);
}

int DAFileModeOf(const std::string& path)
{
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? static_cast<int>(status.st_mode & 0777) : -1;
}

bool DAIsSameFile(const std::string& a, const std::string& b)
{
    struct stat first {};
    struct stat second {};
    return stat(a.c_str(), &first) == 0 && stat(b.c_str(), &second) == 0 && first.st_dev == second.st_dev &&
        first.st_ino == second.st_ino;
}

DANewFile::~DANewFile()
{
    if (m_fd >= 0) {
        close(m_fd);
    }
    if (!m_path.empty()) {
        unlink(m_path.c_str());
        unlink((m_path + "-journal").c_str());
    }
}

int DANewFile::Create(const std::string& to, int mode, std::string& error)
{
    std::string name = to + ".XXXXXX";
    std::vector<char> pattern(name.begin(), name.end());
    pattern.push_back('\0');
    m_fd = mkostemp(pattern.data(), O_CLOEXEC);
    if (m_fd < 0) {
        error = SystemError("cannot create a file beside", to);
        return SQLITE_CANTOPEN;
    }
    m_path = pattern.data();
    m_to = to;
    fchmod(m_fd, static_cast<mode_t>(mode));
    return SQLITE_OK;
}

int DANewFile::Commit(std::string& error)
{
    if (fsync(m_fd) != 0) {
        error = SystemError("cannot sync", m_path);
        return SQLITE_IOERR;
    }
    if (rename(m_path.c_str(), m_to.c_str()) != 0) {
        error = SystemError("cannot rename over", m_to);
        return SQLITE_CANTOPEN;
    }
    m_path.clear();  // in place: no longer ours to remove
    const int dir = open(DADirectoryOf(m_to).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    const bool synced = dir >= 0 && fsync(dir) == 0;
    if (dir >= 0) {
        close(dir);
    }
    if (!synced) {
        error = SystemError("cannot sync the directory of", m_to);
        return SQLITE_IOERR;
    }
    return SQLITE_OK;
}
