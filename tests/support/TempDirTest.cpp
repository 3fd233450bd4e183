#include "TempDirTest.h"

#include <ftw.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <vector>

namespace {

int RemoveEntry(const char* path, const struct stat* /*info*/, int /*flag*/, struct FTW* /*ftw*/)
{
    return std::remove(path);
}

}  // namespace

void TempDirTest::SetUp()
{
    const char* base = std::getenv("TMPDIR");
    std::string pattern = std::string(base != nullptr && *base != '\0' ? base : "/tmp") + "/ulo_db_test.XXXXXX";
    std::vector<char> buffer(pattern.begin(), pattern.end());
    buffer.push_back('\0');
    ASSERT_NE(mkdtemp(buffer.data()), nullptr) << "mkdtemp failed for " << pattern;
    m_dir = buffer.data();
}

void TempDirTest::TearDown()
{
    if (!m_dir.empty()) {
        nftw(m_dir.c_str(), RemoveEntry, 16, FTW_DEPTH | FTW_PHYS);
    }
}

std::string TempDirTest::PathOf(const std::string& name) const
{
    return m_dir + "/" + name;
}

bool TempDirTest::FileExists(const std::string& name) const
{
    struct stat info {};
    return stat(PathOf(name).c_str(), &info) == 0;
}
