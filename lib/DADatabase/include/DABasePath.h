#ifndef DABASEPATH_H
#define DABASEPATH_H

#include <string>

#include "DAOwnedString.h"

/// The database file a request applies to, as a directory and a file name.
/// Root class of every request; also used on its own for
/// DADatabase::CheckExistTable. Not copyable.
class DABasePath {
public:
    DABasePath() = default;
    virtual ~DABasePath() = default;

    DABasePath(const DABasePath&) = delete;
    DABasePath& operator=(const DABasePath&) = delete;

    /// Replaces the whole location with copies of dir and file. A null
    /// argument leaves its part unset, whatever it held before.
    void SetPath(char const* dir, char const* file);

    /// Assigns the directory to dir, then the file name to file.
    /// Throws std::logic_error when the directory is unset (before touching
    /// either output) or when the file name is unset (dir then already
    /// holds the directory).
    void GetPath(std::string& dir, std::string& file);

    /// True when both the directory and the file name are set, that is when
    /// GetPath will not throw. Reads only; never locks.
    bool IsPathSet() const { return m_directory.IsSet() && m_fileName.IsSet(); }

    /// True when neither the directory nor the file name is set.
    bool IsPathEmpty() const { return !m_directory.IsSet() && !m_fileName.IsSet(); }

private:
    DAOwnedString m_directory;
    DAOwnedString m_fileName;
};

#endif  // DABASEPATH_H
