#include <cstring>
#include <string>
#include <type_traits>

#include <gtest/gtest.h>

#include "DABasePath.h"
#include "DABaseSet.h"
#include "DACreateRequest.h"
#include "DADeleteRequest.h"
#include "DADropRequest.h"
#include "DAJoinRequest.h"
#include "DASelectRequest.h"
#include "DAUpdateRequest.h"
#include "DAUpsertRequest.h"

namespace {

template <typename T>
constexpr bool kNotCopyable = !std::is_copy_constructible<T>::value && !std::is_copy_assignable<T>::value;

static_assert(kNotCopyable<DABasePath> && kNotCopyable<DABaseSet> && kNotCopyable<DASelectRequest> &&
                  kNotCopyable<DAUpsertRequest> && kNotCopyable<DAUpdateRequest> && kNotCopyable<DADeleteRequest> &&
                  kNotCopyable<DADropRequest> && kNotCopyable<DACreateRequest> && kNotCopyable<DAJoinRequest>,
              "requests own raw copies of their names and must not be copied");

// Every request class that names a table follows one SetTable/GetTable rule.
template <typename Request>
class TableName : public ::testing::Test {
};

using TableRequests = ::testing::Types<DASelectRequest, DAUpsertRequest, DAUpdateRequest, DADeleteRequest,
                                       DADropRequest, DACreateRequest>;
TYPED_TEST_SUITE(TableName, TableRequests);

TYPED_TEST(TableName, UnsetNameLeavesTheOutputAlone)
{
    TypeParam request;
    std::string table = "caller's text";
    request.GetTable(table);
    EXPECT_EQ(table, "caller's text");
    request.SetTable(nullptr);
    request.GetTable(table);
    EXPECT_EQ(table, "caller's text");
}

TYPED_TEST(TableName, NullKeepsAndNewNameReplaces)
{
    TypeParam request;
    std::string table;
    request.SetTable("contacts");
    request.SetTable(nullptr);
    request.GetTable(table);
    EXPECT_EQ(table, "contacts");

    request.SetTable("groups");
    request.GetTable(table);
    EXPECT_EQ(table, "groups");

    request.SetTable("");
    request.GetTable(table);
    EXPECT_EQ(table, "");
}

TYPED_TEST(TableName, NameIsCopiedAtTheCall)
{
    TypeParam request;
    char* buffer = new char[16];
    std::strcpy(buffer, "contacts");
    request.SetTable(buffer);
    std::strcpy(buffer, "XXXXXXXX");
    delete[] buffer;

    std::string table;
    request.GetTable(table);
    EXPECT_EQ(table, "contacts");
}

TEST(DAJoinRequest, SideIsReadOnlyWhenBothPartsAreSet)
{
    DAJoinRequest request;
    std::string table = "t";
    std::string column = "c";
    request.GetLeftJoin(table, column);
    request.SetLeftJoin("contacts", nullptr);
    request.GetLeftJoin(table, column);
    EXPECT_EQ(table + "." + column, "t.c");

    char joinColumn[] = "group_id";
    request.SetLeftJoin(nullptr, joinColumn);
    std::strcpy(joinColumn, "XXXXXXXX");  // the request holds its own copy
    request.GetLeftJoin(table, column);
    EXPECT_EQ(table + "." + column, "contacts.group_id");

    request.SetLeftJoin("groups", "id");
    request.GetLeftJoin(table, column);
    EXPECT_EQ(table + "." + column, "groups.id");
}

TEST(DAJoinRequest, SidesAreIndependent)
{
    DAJoinRequest request;
    request.SetLeftJoin("contacts", "group_id");
    std::string table = "t";
    std::string column = "c";
    request.GetRightJoin(table, column);
    EXPECT_EQ(table + "." + column, "t.c");

    request.SetRightJoin("groups", "id");
    request.GetLeftJoin(table, column);
    EXPECT_EQ(table + "." + column, "contacts.group_id");
    request.GetRightJoin(table, column);
    EXPECT_EQ(table + "." + column, "groups.id");
}

}  // namespace
