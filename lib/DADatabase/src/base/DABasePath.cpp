#include "DABasePath.h"

#include <stdexcept>

void DABasePath::SetPath(char const* dir, char const* file)
{
    m_directory.Reset();
    m_fileName.Reset();
    m_directory.Assign(dir);
    m_fileName.Assign(file);
}

void DABasePath::GetPath(std::string& dir, std::string& file)
{
    // Thrown explicitly: building a std::string from null is undefined.
    if (!m_directory.CopyTo(dir)) {
        throw std::logic_error("DABasePath::GetPath: the database directory is not set");
    }
    if (!m_fileName.CopyTo(file)) {
        throw std::logic_error("DABasePath::GetPath: the database file name is not set");
    }
}
