#ifndef ULO_TESTS_TEMPDIRTEST_H
#define ULO_TESTS_TEMPDIRTEST_H

#include <string>

#include <gtest/gtest.h>

// Fixture for tests that touch files: each test gets a fresh directory made
// with mkdtemp under $TMPDIR (or /tmp), removed with all its content after
// the test.
class TempDirTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    // The directory, without a trailing "/".
    const std::string& Dir() const { return m_dir; }
    // Dir() + "/" + name.
    std::string PathOf(const std::string& name) const;
    bool FileExists(const std::string& name) const;

private:
    std::string m_dir;
};

#endif  // ULO_TESTS_TEMPDIRTEST_H
