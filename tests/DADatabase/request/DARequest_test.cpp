#include <cstring>
#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

#include "DACreateRequest.h"
#include "DAJoinRequest.h"
#include "DASelectRequest.h"
#include "DASqlGenerator.h"
#include "DatabaseTestUtil.h"

namespace {

// A table name (each request class keeps it the same way): an unset name
// leaves the output alone, the name is copied at the call, a null name keeps
// it and a new one replaces it.
TEST(TableName, CopiedAtTheCallKeptOnNullReplacedOtherwise)
{
    DASelectRequest request;
    std::string table = "caller's text";
    request.SetTable(nullptr);
    request.GetTable(table);
    EXPECT_EQ(table, "caller's text");
    char buffer[] = "contacts";
    request.SetTable(buffer);
    std::strcpy(buffer, "XXXXXXXX");
    request.SetTable(nullptr);
    request.GetTable(table);
    EXPECT_EQ(table, "contacts");
    request.SetTable("");
    request.GetTable(table);
    EXPECT_EQ(table, "");
}

// A two-part getter reads its own pair once both parts are set (a null part
// keeps what it held), and leaves its outputs alone until then. Each getter
// is one copy of its own pair: which pair each reads is pinned by the
// generated statements.
template <typename Request>
void ExpectPairRule(void (Request::*set)(char const*, char const*), void (Request::*get)(std::string&, std::string&),
                    void (Request::*other)(std::string&, std::string&))
{
    Request request;
    std::string first = "a";
    std::string second = "b";
    (request.*set)("x", nullptr);
    (request.*get)(first, second);
    EXPECT_EQ(first + " " + second, "a b");
    (request.*set)(nullptr, "y");
    (request.*get)(first, second);
    EXPECT_EQ(first + " " + second, "x y");
    first = "a";
    (request.*other)(first, second);
    EXPECT_EQ(first + " " + second, "a y");
}

TEST(PairGetters, ReadOnlyTheirOwnPairOnceBothPartsAreSet)
{
    ExpectPairRule(&DACreateRequest::SetPrimaryKey, &DACreateRequest::GetPrimaryKey, &DACreateRequest::GetCompositeKey);
    ExpectPairRule(&DAJoinRequest::SetRightJoin, &DAJoinRequest::GetRightJoin, &DAJoinRequest::GetLeftJoin);
}

// Columns keep call order and duplicates (pairs compare the name pointers);
// a null name is refused with a line, a null type throws and releases the
// lock, and the getter replaces what its output held.
TEST(DACreateRequest, ColumnsKeepCallOrderNullsAreRefused)
{
    static const char x[] = "x";
    static const char y[] = "y";
    DACreateRequest request;
    LogCapture log;
    request.SetColumnKey(nullptr, "TEXT");
    EXPECT_THROW(request.SetColumnKey(x, nullptr), std::logic_error);
    request.SetColumnKey(x, "TEXT");  // would deadlock if the lock were still held
    request.SetColumnKey(y, "INTEGER");
    request.SetColumnKey(x, "");
    DAColumnList columns{{"stale", "TEXT"}};
    request.GetColumnKey(columns);
    EXPECT_EQ(columns, (DAColumnList{{x, "TEXT"}, {y, "INTEGER"}, {x, ""}}));
    EXPECT_EQ(Strings{Logged(6, "DACreateRequest.cpp", "SetColumnKey", "NULL COLUMN NAME, COLUMN NOT ADDED")},
              Described(log));
}

// Schema requests keep only plain names: anything else (a space, a quote,
// a leading digit, a qualified or empty name, null) is refused with one
// line and leaves what was stored.
TEST(SchemaRequests, KeepOnlyPlainNames)
{
    DACreateIndexRequest index;
    DAAddColumnRequest add;
    index.SetTable("events");
    index.SetName("events_ts");
    index.AddColumn("ts", true);
    add.SetTable("events");
    add.SetColumn("level", "INTEGER");
    LogCapture log;
    for (const char* name : {"ev ents", "ev'ents", "1st", "main.events", "", static_cast<const char*>(nullptr)}) {
        index.SetTable(name), index.SetName(name), index.AddColumn(name);
        add.SetTable(name), add.SetColumn(name, "TEXT"), add.SetColumn("ok", name);
    }
    std::string sql[2];
    DASqlGenerator().GetCreateIndexSql(index, sql[0]);
    DASqlGenerator().GetAddColumnSql(add, sql[1]);
    EXPECT_EQ("CREATE INDEX IF NOT EXISTS events_ts ON events (ts DESC)", sql[0]);
    EXPECT_EQ("ALTER TABLE events ADD COLUMN level INTEGER", sql[1]);
    EXPECT_EQ(36U, log.Lines().size());
    EXPECT_EQ(36, log.Count("INVALID NAME, NOT STORED"));
}

}  // namespace
