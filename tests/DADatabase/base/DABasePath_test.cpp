#include "DABasePath.h"

#include <cstring>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

namespace {

TEST(DABasePath, GetPathYieldsCopiesMadeAtTheCall)
{
    char dir[] = "/data/notes";
    char file[] = "notes.db";
    DABasePath path;
    path.SetPath("/old", "old.db");
    path.SetPath(dir, file);
    std::strcpy(dir, "/xxxx/xxxxx");
    std::strcpy(file, "yyyyy.yy");

    std::string outDir;
    std::string outFile;
    path.GetPath(outDir, outFile);
    EXPECT_EQ(outDir + "|" + outFile, "/data/notes|notes.db");
    path.SetPath("", "");
    path.GetPath(outDir, outFile);
    EXPECT_EQ(outDir + "|" + outFile, "|");
}

// An unset directory throws before either output is touched; an unset file
// name throws after the directory was assigned.
TEST(DABasePath, UnsetPartThrows)
{
    DABasePath path;
    std::string dir = "old dir";
    std::string file = "old file";
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    path.SetPath("/data", "a.db");
    path.SetPath(nullptr, "b.db");  // a null part is unset, whatever it held
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    EXPECT_EQ(dir + "|" + file, "old dir|old file");
    path.SetPath("/other", nullptr);
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    EXPECT_EQ(dir + "|" + file, "/other|old file");
}

}  // namespace
