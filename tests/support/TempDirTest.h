#ifndef ULO_TESTS_TEMPDIRTEST_H
#define ULO_TESTS_TEMPDIRTEST_H

#include <cstdlib>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>

// Fixture for tests that touch files: each test gets a fresh directory made
// with mkdtemp under $TMPDIR (or /tmp), removed with all its content after
// the test.
class TempDirTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        const char* base = std::getenv("TMPDIR");
        std::string pattern = std::string(base != nullptr && *base != '\0' ? base : "/tmp") + "/ulo_db_test.XXXXXX";
        ASSERT_NE(mkdtemp(&pattern[0]), nullptr) << "mkdtemp failed for " << pattern;
        m_dir = pattern;
    }

    void TearDown() override
    {
        if (!m_dir.empty()) {
            std::error_code ignored;
            std::filesystem::remove_all(m_dir, ignored);
        }
    }

    // The directory, without a trailing "/".
    const std::string& Dir() const { return m_dir; }
    // Dir() + "/" + name.
    std::string PathOf(const std::string& name) const { return m_dir + "/" + name; }
    bool FileExists(const std::string& name) const { return std::filesystem::exists(PathOf(name)); }

private:
    std::string m_dir;
};

#endif  // ULO_TESTS_TEMPDIRTEST_H
