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
    const auto thrown = [&] {
        try {
            path.GetPath(outDir, outFile);
        } catch (const std::logic_error& error) {
            return std::string(error.what());
        }
        return std::string("nothing thrown");
    };
    const std::string unset = "DABasePath::GetPath: the database ";
    EXPECT_EQ(unset + "directory is not set", thrown());
    path.SetPath("/old", "old.db");
    path.SetPath(dir, file);
    std::strcpy(dir, "/xxxx/xxxxx");
    std::strcpy(file, "yyyyy.yy");
    path.GetPath(outDir, outFile);
    EXPECT_EQ(outDir + "|" + outFile, "/data/notes|notes.db");
    path.SetPath(nullptr, "b.db");
    outDir = "old dir";
    EXPECT_EQ(unset + "directory is not set", thrown());
    EXPECT_EQ(outDir + "|" + outFile, "old dir|notes.db");
    path.SetPath("", nullptr);
    EXPECT_EQ(unset + "file name is not set", thrown());
    EXPECT_EQ(outDir + "|" + outFile, "|notes.db");
}
