#include "DABasePath.h"

#include <cstring>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

// The parts are copied at the call. An unset directory throws before either
// output is touched; an unset file name throws after the directory was
// assigned; a null part unsets whatever it held.
TEST(DABasePath, GetPathYieldsCopiesOrThrowsForAnUnsetPart)
{
    char dir[] = "/data/notes";
    char file[] = "notes.db";
    DABasePath path;
    std::string outDir = "old dir";
    std::string outFile = "old file";
    EXPECT_THROW(path.GetPath(outDir, outFile), std::logic_error);
    path.SetPath("/old", "old.db");
    path.SetPath(dir, file);
    std::strcpy(dir, "/xxxx/xxxxx");
    std::strcpy(file, "yyyyy.yy");
    path.GetPath(outDir, outFile);
    EXPECT_EQ(outDir + "|" + outFile, "/data/notes|notes.db");
    path.SetPath(nullptr, "b.db");
    outDir = "old dir";
    EXPECT_THROW(path.GetPath(outDir, outFile), std::logic_error);
    EXPECT_EQ(outDir + "|" + outFile, "old dir|notes.db");
    path.SetPath("", nullptr);
    EXPECT_THROW(path.GetPath(outDir, outFile), std::logic_error);
    EXPECT_EQ(outDir + "|" + outFile, "|notes.db");
}
