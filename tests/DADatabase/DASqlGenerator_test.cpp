#include "DASqlGenerator.h"

#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace {

// Column names at known addresses: "name" lies below "phone" in kLow, and
// above it in kHigh. Statements follow map order (ascending address).
const char kLow[] = "name\0phone\0groups.title";
const char* const kName = kLow;
const char* const kPhone = kLow + 5;
const char* const kTitle = kLow + 11;
const char kHigh[] = "phone\0name";

using Pairs = std::vector<std::pair<const char*, const char*>>;
struct SqlCase;
using Kind = std::string (*)(const SqlCase&);  // generates the statement of a case

// One request and its statement. first holds the data (upsert, update), the
// keys (create: primary, then composite), the join sides, or the path's
// directory and file; second the conditions, or the created columns.
struct SqlCase {
    Kind kind;
    const char* table;
    Pairs first;
    Pairs second;
    const char* expected;
};

// A request of the table kind: data from first, conditions from second.
template <typename Request>
void Fill(Request& request, const SqlCase& c)
{
    request.SetTable(c.table);
    for (const auto& entry : c.first) {
        request.SetData(entry.first, entry.second);
    }
    for (const auto& entry : c.second) {
        request.SetWhere(entry.first, entry.second);
    }
}

void Fill(DADropRequest& request, const SqlCase& c)
{
    request.SetTable(c.table);
}

void Fill(DACreateRequest& request, const SqlCase& c)
{
    request.SetTable(c.table);
    request.SetPrimaryKey(c.first.at(0).first, c.first.at(0).second);
    request.SetCompositeKey(c.first.at(1).first, c.first.at(1).second);
    for (const auto& column : c.second) {
        request.SetColumnKey(column.first, column.second);
    }
}

void Fill(DAJoinRequest& request, const SqlCase& c)
{
    request.SetLeftJoin(c.first.at(0).first, c.first.at(0).second);
    request.SetRightJoin(c.first.at(1).first, c.first.at(1).second);
    for (const auto& entry : c.second) {
        request.SetWhere(entry.first, entry.second);
    }
}

// The statement of c's request: a fresh request filled from c.
template <typename Request, void (DASqlGenerator::*generate)(Request&, std::string&)>
std::string Generated(const SqlCase& c)
{
    Request request;
    Fill(request, c);
    std::string out = "stale text that must disappear";
    (DASqlGenerator().*generate)(request, out);
    return out;
}

std::string Path(const SqlCase& c)
{
    std::string out = "stale text that must disappear";
    DASqlGenerator().GetDBPath(c.first[0].first, c.first[0].second, out);
    return out;
}

std::string Check(const SqlCase& c)
{
    std::string out = "stale text that must disappear";
    DASqlGenerator().GetCheckTableSql(c.table, out);
    return out;
}

const Kind kPath = Path;
const Kind kCheck = Check;
const Kind kDrop = Generated<DADropRequest, &DASqlGenerator::GetDropTableSql>;
const Kind kCreate = Generated<DACreateRequest, &DASqlGenerator::GetCreateTableSql>;
const Kind kSelect = Generated<DASelectRequest, &DASqlGenerator::GetSelectSql>;
const Kind kJoin = Generated<DAJoinRequest, &DASqlGenerator::GetJoinSql>;
const Kind kUpsert = Generated<DAUpsertRequest, &DASqlGenerator::GetUpsertSql>;
const Kind kUpdate = Generated<DAUpdateRequest, &DASqlGenerator::GetUpdateSql>;
const Kind kDelete = Generated<DADeleteRequest, &DASqlGenerator::GetDeleteSql>;

const char* const kContacts = "contacts";
const Pairs kNameText{{"name", "TEXT"}};
const Pairs kNoKeys{{}, {}};

// clang-format off
const SqlCase kCases[] = {
    {kPath, nullptr, {{"/data/notes", "notes.db"}}, {}, "/data/notes/notes.db"},
    {kPath, nullptr, {{"/data/notes/", "notes.db"}}, {}, "/data/notes/notes.db"},
    {kPath, nullptr, {{"", "notes.db"}}, {}, "notes.db"},
    {kPath, nullptr, {{"/", "notes.db"}}, {}, "/notes.db"},
    {kPath, nullptr, {{"notes", "notes.db"}}, {}, "notes/notes.db"},
    {kCheck, kContacts, {}, {}, "SELECT COUNT(*) from sqlite_master WHERE TYPE='table' AND NAME='contacts'"},
    {kDrop, kContacts, {}, {}, "DROP TABLE contacts"},
    {kCreate, kContacts, kNoKeys, {{"name", "TEXT"}, {"phone", "TEXT"}},
     "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY, name TEXT, phone TEXT)"},
    {kCreate, kContacts, kNoKeys, {}, "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY)"},
    {kCreate, kContacts, {{"phone", "TEXT"}, {}}, kNameText,
     "CREATE TABLE IF NOT EXISTS contacts (phone TEXT NOT NULL PRIMARY KEY, name TEXT)"},
    {kCreate, kContacts, {{"phone", "TEXT"}, {}}, {},
     "CREATE TABLE IF NOT EXISTS contacts (phone TEXT NOT NULL PRIMARY KEY)"},
    {kCreate, kContacts, {{"owner", "TEXT"}, {"phone", "TEXT"}}, kNameText,
     "CREATE TABLE IF NOT EXISTS contacts (owner TEXT, phone TEXT, name TEXT, PRIMARY KEY(owner, phone))"},
    {kCreate, kContacts, {{"owner", "TEXT"}, {"phone", "TEXT"}}, {},
     "CREATE TABLE IF NOT EXISTS contacts (owner TEXT, phone TEXT, PRIMARY KEY(owner, phone))"},
    {kCreate, kContacts, {{}, {"phone", "TEXT"}}, kNameText,
     "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY, name TEXT)"},
    {kCreate, kContacts, kNoKeys, {{"name", "TEXT"}, {"age", "INTEGER DEFAULT 0"}},
     "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY, name TEXT, age INTEGER DEFAULT 0)"},
    {kCreate, kContacts, {{"phone", ""}, {}}, kNameText,
     "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY, name TEXT)"},
    {kCreate, kContacts, kNoKeys, {{"phone", "TEXT"}, {"name", "TEXT"}},
     "CREATE TABLE IF NOT EXISTS contacts (_ID INTEGER PRIMARY KEY, phone TEXT, name TEXT)"},
    {kSelect, kContacts, {}, {}, "SELECT * FROM contacts"},
    {kSelect, kContacts, {}, {{kName, "Kim"}}, "SELECT * FROM contacts WHERE name='Kim'"},
    {kSelect, kContacts, {}, {{kPhone, "010"}, {kName, "Kim"}},
     "SELECT * FROM contacts WHERE name='Kim' AND phone='010'"},
    // The one cut every list shares removes only the last separator.
    {kSelect, kContacts, {}, {{kName, "Kim AND Lee"}}, "SELECT * FROM contacts WHERE name='Kim AND Lee'"},
    {kJoin, nullptr, {{"contacts", "group_id"}, {"groups", "id"}}, {},
     "SELECT  * FROM contacts INNER JOIN groups ON contacts.group_id = groups.id"},
    {kJoin, nullptr, {{"contacts", "group_id"}, {"groups", "id"}}, {{kTitle, "Family"}},
     "SELECT  * FROM contacts INNER JOIN groups ON contacts.group_id = groups.id WHERE groups.title='Family'"},
    {kUpsert, kContacts, {{kPhone, "010"}, {kName, "Kim"}}, {},
     "INSERT OR REPLACE INTO contacts (name, phone) VALUES ('Kim', '010')"},
    {kUpsert, kContacts, {{kName, "Kim"}}, {}, "INSERT OR REPLACE INTO contacts (name) VALUES ('Kim')"},
    {kUpsert, kContacts, {{kHigh + 6, "Kim"}, {kHigh, "010"}}, {},
     "INSERT OR REPLACE INTO contacts (phone, name) VALUES ('010', 'Kim')"},
    // The one quoting rule every literal shares: a quote is doubled.
    {kUpsert, kContacts, {{kName, "Kim's"}, {kPhone, "'"}}, {},
     "INSERT OR REPLACE INTO contacts (name, phone) VALUES ('Kim''s', '''')"},
    {kUpdate, kContacts, {{kName, "Lee"}}, {{kPhone, "010"}}, "UPDATE contacts SET name = 'Lee' WHERE phone='010'"},
    {kUpdate, kContacts, {{kPhone, "011"}, {kName, "Lee"}}, {{kPhone, "010"}, {kName, "Kim"}},
     "UPDATE contacts SET name = 'Lee', phone = '011' WHERE name='Kim' AND phone='010'"},
    {kDelete, kContacts, {}, {{kPhone, "010"}}, "DELETE  FROM contacts WHERE phone='010'"},
    {kDelete, kContacts, {}, {{kPhone, "010"}, {kName, "Kim"}},
     "DELETE  FROM contacts WHERE name='Kim' AND phone='010'"},
    {kDelete, kContacts, {}, {}, "DELETE  FROM contacts"},
};
// clang-format on

// The out-parameter starts with other text: the result must replace it.
TEST(DASqlGenerator, StatementTextIsExactAndReplacesTheOutput)
{
    for (const SqlCase& c : kCases) {
        EXPECT_EQ(c.kind(c), c.expected);
    }
}

}  // namespace
