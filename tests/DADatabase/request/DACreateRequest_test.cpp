#include "DACreateRequest.h"

#include <cstring>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "LogCapture.h"

namespace {

DAColumnList ColumnsOf(DACreateRequest& request)
{
    DAColumnList columns{{"stale", "TEXT"}};  // the getter must replace this
    request.GetColumnKey(columns);
    return columns;
}

TEST(DACreateRequest, KeyIsReadOnlyWhenBothPartsAreSet)
{
    DACreateRequest request;
    std::string column = "c";
    std::string type = "t";
    request.GetPrimaryKey(column, type);
    request.GetCompositeKey(column, type);
    EXPECT_TRUE(ColumnsOf(request).empty());

    request.SetPrimaryKey("phone", nullptr);
    request.GetPrimaryKey(column, type);
    EXPECT_EQ(column + " " + type, "c t");

    char keyType[] = "TEXT";
    request.SetPrimaryKey(nullptr, keyType);
    std::strcpy(keyType, "XXXX");  // the request holds its own copy
    request.GetPrimaryKey(column, type);
    EXPECT_EQ(column + " " + type, "phone TEXT");

    request.GetCompositeKey(column, type);  // still unset: outputs untouched
    EXPECT_EQ(column + " " + type, "phone TEXT");
    request.SetCompositeKey("owner", "TEXT");
    request.SetCompositeKey(nullptr, "INTEGER");
    request.GetCompositeKey(column, type);
    EXPECT_EQ(column + " " + type, "owner INTEGER");
}

TEST(DACreateRequest, ColumnsKeepCallOrderAndDuplicates)
{
    static const char x[] = "x";
    static const char y[] = "y";
    char* type = new char[8];
    std::strcpy(type, "TEXT");
    DACreateRequest request;
    request.SetColumnKey(x, type);
    request.SetColumnKey(y, "INTEGER");
    request.SetColumnKey(x, "");
    std::strcpy(type, "XXXX");
    delete[] type;

    // Pairs compare the name pointers, so both x entries hold x itself.
    EXPECT_EQ(ColumnsOf(request), (DAColumnList{{x, "TEXT"}, {y, "INTEGER"}, {x, ""}}));
}

TEST(DACreateRequest, NullColumnIsRefusedWithOneErrorLine)
{
    DACreateRequest request;
    LogCapture log;
    request.SetColumnKey(nullptr, "TEXT");
    EXPECT_TRUE(ColumnsOf(request).empty());

    const std::vector<LogLine> lines = log.Lines();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].priority, 6);
    EXPECT_EQ(lines[0].tag, "ULO_DB");
    EXPECT_EQ(lines[0].file, "DACreateRequest.cpp");
    EXPECT_EQ(lines[0].function, "SetColumnKey");
    EXPECT_FALSE(lines[0].message.empty());
}

TEST(DACreateRequest, NullTypeThrowsAndReleasesTheLock)
{
    static const char name[] = "name";
    DACreateRequest request;
    LogCapture log;
    EXPECT_THROW(request.SetColumnKey(name, nullptr), std::logic_error);
    EXPECT_TRUE(ColumnsOf(request).empty());
    request.SetColumnKey(name, "TEXT");  // would deadlock if the lock were still held
    EXPECT_EQ(ColumnsOf(request), (DAColumnList{{name, "TEXT"}}));
    EXPECT_TRUE(log.Lines().empty());
}

}  // namespace
