#include "DABasePath.h"

#include <cstring>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

#include "DAOwnedString.h"

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

TEST(DABasePath, UnsetDirectoryThrowsBeforeTouchingOutputs)
{
    DABasePath path;
    std::string dir = "old dir";
    std::string file = "old file";
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    path.SetPath("/data", "a.db");
    path.SetPath(nullptr, "b.db");  // a null part is unset, whatever it held
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    EXPECT_EQ(dir + "|" + file, "old dir|old file");
}

TEST(DABasePath, UnsetFileNameThrowsAfterAssigningTheDirectory)
{
    DABasePath path;
    path.SetPath("/data", "a.db");
    path.SetPath("/other", nullptr);
    std::string dir = "old dir";
    std::string file = "old file";
    EXPECT_THROW(path.GetPath(dir, file), std::logic_error);
    EXPECT_EQ(dir + "|" + file, "/other|old file");
}

TEST(DAOwnedString, OwnsACopyAndPairsNeedBothParts)
{
    char text[] = "contacts";
    DAOwnedString first;
    DAOwnedString second;
    first.Assign(text);
    first.Assign(nullptr);  // keeps the text
    text[0] = 'X';
    std::string a = "a";
    std::string b = "b";
    EXPECT_FALSE(DACopyPair(first, second, a, b));
    EXPECT_EQ(a + b, "ab");
    second.Assign("id");
    EXPECT_TRUE(DACopyPair(first, second, a, b));
    EXPECT_EQ(a + "." + b, "contacts.id");

    first.Reset();
    EXPECT_FALSE(first.IsSet());
    EXPECT_FALSE(first.CopyTo(a));
    EXPECT_EQ(a, "contacts");
}

}  // namespace
