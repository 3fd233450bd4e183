#include "DASqlGenerator.h"

#include "DAStatementCache.h"

#include <cstdint>
#include <string>
#include <type_traits>
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
    void (*more)(DABaseSet&) = nullptr;  // listed conditions, select list, ignore
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
    if (c.more != nullptr) {
        c.more(request);
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
    if (c.more != nullptr) {
        c.more(request);
    }
}

// first: the index's name and "UNIQUE" or ""; second: columns and "DESC" or "".
void Fill(DACreateIndexRequest& request, const SqlCase& c)
{
    request.SetTable(c.table);
    request.SetName(c.first.at(0).first);
    request.SetUnique(std::string(c.first.at(0).second) == "UNIQUE");
    for (const auto& column : c.second) {
        request.AddColumn(column.first, std::string(column.second) == "DESC");
    }
}

// first: the column and its type; second: the default, if any.
void Fill(DAAddColumnRequest& request, const SqlCase& c)
{
    request.SetTable(c.table);
    request.SetColumn(c.first.at(0).first, c.first.at(0).second);
    for (const auto& value : c.second) {
        request.SetDefault(value.second);
    }
}

// first: the index's name; second: the columns.
void Fill(DASearchIndexRequest& request, const SqlCase& c)
{
    request.SetTable(c.table);
    request.SetName(c.first.at(0).first);
    request.SetTokens(std::string(c.first.at(0).second) == "Substrings" ? DASearchTokens::Substrings
                                                                        : DASearchTokens::Words);
    for (const auto& column : c.second) {
        request.AddColumn(column.first);
    }
}

void Fill(DABasePath& /*location*/, const SqlCase& /*c*/)
{
}

// The statement of c's request: a fresh request filled from c. Its shape
// and values, as a session binds them, must be what splitting the text
// gives, and write the text back.
template <typename Request, void (DASqlGenerator::*generate)(Request&, std::string&)>
std::string Generated(const SqlCase& c)
{
    Request request;
    Fill(request, c);
    std::string out = "stale text that must disappear";
    (DASqlGenerator().*generate)(request, out);
    if constexpr (!std::is_same_v<Request, DABasePath>) {
        DASqlStatement shaped;
        shaped.shaped = true;
        shaped.sql = "stale";
        DAWriteSql(request, shaped);
        std::string shape;
        DASqlParams values;
        const bool splits = DASplitLiterals(out.c_str(), shape, values);
        EXPECT_EQ(shaped.shaped ? shape : out, shaped.sql) << out;
        EXPECT_EQ(shaped.shaped ? values.Bytes() : "", shaped.params.Bytes()) << out;
        EXPECT_EQ(out, shaped.Text());
        const bool search = std::is_same_v<Request, DASearchRequest>;
        EXPECT_TRUE(shaped.shaped || !splits || search) << out;
    }
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
const Kind kIndex = Generated<DACreateIndexRequest, &DASqlGenerator::GetCreateIndexSql>;
const Kind kAddColumn = Generated<DAAddColumnRequest, &DASqlGenerator::GetAddColumnSql>;
const Kind kCompact = Generated<DABasePath, &DASqlGenerator::GetCompactSql>;
const Kind kQuery = Generated<DAQueryRequest, &DASqlGenerator::GetQuerySql>;
const Kind kInsert = Generated<DAInsertRequest, &DASqlGenerator::GetInsertSql>;
const Kind kSearchIndex = Generated<DASearchIndexRequest, &DASqlGenerator::GetCreateSearchIndexSql>;
const Kind kSearch = Generated<DASearchRequest, &DASqlGenerator::GetSearchSql>;

// Listed conditions and select lists, as the rows below use them.
const auto Q = [](DABaseSet& r) -> DAQueryRequest& { return static_cast<DAQueryRequest&>(r); };
const auto S = [](DABaseSet& r) -> DASearchRequest& { return static_cast<DASearchRequest&>(r); };
const auto U = [](DABaseSet& r) -> DAUpsertRequest& { return static_cast<DAUpsertRequest&>(r); };
const auto TsBefore = [](DABaseSet& r) { r.SetWhere("ts", DACompare::Less, std::int64_t{1700000000000}); };

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
    {kIndex, "events", {{"events_ts", ""}}, {{"ts", "DESC"}, {"type", ""}},
     "CREATE INDEX IF NOT EXISTS events_ts ON events (ts DESC, type)"},
    {kIndex, "events", {{"events_id", "UNIQUE"}}, {{"id", ""}},
     "CREATE UNIQUE INDEX IF NOT EXISTS events_id ON events (id)"},
    {kAddColumn, "events", {{"level", "INTEGER"}}, {}, "ALTER TABLE events ADD COLUMN level INTEGER"},
    {kAddColumn, "events", {{"level", "INTEGER"}}, {{"", "0"}},
     "ALTER TABLE events ADD COLUMN level INTEGER DEFAULT '0'"},
    {kAddColumn, "events", {{"note", "TEXT"}}, {{"", "it's"}},
     "ALTER TABLE events ADD COLUMN note TEXT DEFAULT 'it''s'"},
    {kCompact, nullptr, {}, {}, "VACUUM"},
    {kSelect, "events", {}, {{"type", "alarm"}}, "SELECT * FROM events WHERE type='alarm' AND ts<1700000000000",
     TsBefore},
    {kSelect, "t", {}, {}, "SELECT * FROM t WHERE a=1 AND b<>'x' AND c<=-2.5 AND d>1e+20 AND e>=0.1 AND "
     "f LIKE 'K%''s' AND g IN ('a', 'b''c') AND h IN () AND i IS NULL AND j.k IS NOT NULL", [](DABaseSet& r) {
        r.SetWhere("a", DACompare::Equal, 1), r.SetWhere("b", DACompare::NotEqual, "x");
        r.SetWhere("c", DACompare::LessEqual, -2.5), r.SetWhere("d", DACompare::Greater, 1e20);
        r.SetWhere("e", DACompare::GreaterEqual, 0.1), r.SetWhere("f", DACompare::Like, "K%'s");
        r.SetWhereIn("g", {"a", "b'c"}), r.SetWhereIn("h", {}), r.SetWhereNull("i"), r.SetWhereNull("j.k", false); }},
    {kSelect, "t", {}, {}, "SELECT * FROM t WHERE u<18446744073709551615 AND s>-7 AND t='x AND y'", [](DABaseSet& r) {
        r.SetWhere("u", DACompare::Less, UINT64_MAX), r.SetWhere("s", DACompare::Greater, short{-7});
        r.SetWhere("t", DACompare::Equal, "x AND y"); }},
    {kDelete, "events", {}, {}, "DELETE  FROM events WHERE ts<1700000000000", TsBefore},
    {kDelete, "events", {}, {{"type", "alarm"}}, "DELETE  FROM events WHERE type='alarm' AND ts<1700000000000",
     TsBefore},
    {kUpdate, "settings", {{"v", "1"}}, {}, "UPDATE settings SET v = '1' WHERE k IN ('a', 'b')",
     [](DABaseSet& r) { r.SetWhereIn("k", {"a", "b"}); }},
    {kUpdate, "events", {{"v", "1"}}, {{"type", "alarm"}},
     "UPDATE events SET v = '1' WHERE type='alarm' AND ts<1700000000000", TsBefore},
    {kJoin, nullptr, {{"contacts", "group_id"}, {"groups", "id"}}, {{kTitle, "Family"}},
     "SELECT  * FROM contacts INNER JOIN groups ON contacts.group_id = groups.id WHERE groups.title='Family' AND "
     "ts<1700000000000", TsBefore},
    {kUpsert, "t", {{kName, "Kim"}}, {}, "INSERT OR REPLACE INTO t (name) VALUES ('Kim')", TsBefore},  // ignored
    {kQuery, "events", {}, {}, "SELECT * FROM events WHERE ts<1700000000000 ORDER BY events.ts DESC LIMIT 50",
     [](DABaseSet& r) { TsBefore(r), Q(r).SetOrderBy("events.ts", true), Q(r).SetLimit(50); }},
    // Pages: a negative offset counts as 0, a negative count as no limit; sort keys are copied.
    {kQuery, "t", {}, {}, "SELECT * FROM t ORDER BY phone DESC, name, _ID DESC LIMIT 0 OFFSET 1", [](DABaseSet& r) {
        Q(r).SetOrderBy("phone", true), Q(r).SetOrderBy(std::string("name").c_str()), Q(r).SetOrderBy("_ID", true);
        Q(r).SetLimit(0, 1); }},
    {kQuery, "t", {}, {}, "SELECT * FROM t LIMIT 0", [](DABaseSet& r) { Q(r).SetLimit(0); }},
    {kQuery, "t", {}, {}, "SELECT * FROM t LIMIT 10", [](DABaseSet& r) { Q(r).SetLimit(10, -3); }},
    {kQuery, "t", {}, {}, "SELECT * FROM t LIMIT -1 OFFSET 20", [](DABaseSet& r) { Q(r).SetLimit(-5, 20); }},
    {kQuery, "t", {}, {}, "SELECT * FROM t", [](DABaseSet& r) { Q(r).SetLimit(-5); }},
    {kQuery, "events", {}, {}, "SELECT type, COUNT(*) AS n, MAX(ts) AS newest FROM events WHERE ts>=5 "
     "GROUP BY type ORDER BY n DESC LIMIT 5", [](DABaseSet& r) {
        Q(r).AddColumn("type"), Q(r).AddAggregate(DAAggregate::Count, nullptr, "n");
        Q(r).AddAggregate(DAAggregate::Max, "ts", "newest"), Q(r).AddGroupBy("type"), Q(r).SetOrderBy("n", true);
        Q(r).SetLimit(5), r.SetWhere("ts", DACompare::GreaterEqual, 5); }},
    {kQuery, "t", {}, {}, "SELECT COUNT(v) AS x, MIN(t.v) AS x, SUM(v) AS x, AVG(v) AS x FROM t GROUP BY a, b.c",
     [](DABaseSet& r) { Q(r).AddAggregate(DAAggregate::Count, "v", "x"), Q(r).AddAggregate(DAAggregate::Min, "t.v", "x");
        Q(r).AddAggregate(DAAggregate::Sum, "v", "x"), Q(r).AddAggregate(DAAggregate::Avg, "v", "x");
        Q(r).AddGroupBy("a"), Q(r).AddGroupBy("b.c"); }},
    {kInsert, kContacts, {{kPhone, "010"}, {kName, "Kim's"}}, {},
     "INSERT INTO contacts (name, phone) VALUES ('Kim''s', '010')"},
    {kInsert, "a, b", {}, {}, "INSERT INTO a, b () VALUES ()"},  // the name list alone is cut
    {kInsert, kContacts, {{kName, "Kim"}}, {}, "INSERT OR IGNORE INTO contacts (name) VALUES ('Kim')",
     [](DABaseSet& r) { static_cast<DAInsertRequest&>(r).SetIgnoreExisting(); }},
    {kSearchIndex, "m", {{"i", ""}}, {{"a", ""}, {"b", ""}},
     "CREATE VIRTUAL TABLE IF NOT EXISTS ulo_search_i USING fts5(a, b, tokenize='unicode61 remove_diacritics 2', "
     "prefix='2 3'); INSERT INTO ulo_search_i(rowid, a, b) SELECT rowid, a, b FROM m WHERE rowid NOT IN (SELECT rowid "
     "FROM ulo_search_i); CREATE TRIGGER IF NOT EXISTS ulo_search_i_insert AFTER INSERT ON m BEGIN DELETE FROM "
     "ulo_search_i WHERE rowid = NEW.rowid; INSERT INTO ulo_search_i(rowid, a, b) VALUES (NEW.rowid, NEW.a, NEW.b); "
     "END; CREATE TRIGGER IF NOT EXISTS ulo_search_i_update AFTER UPDATE ON m WHEN OLD.rowid IS NOT NEW.rowid OR "
     "OLD.a IS NOT NEW.a OR OLD.b IS NOT NEW.b BEGIN DELETE FROM ulo_search_i WHERE rowid IN (OLD.rowid, NEW.rowid); "
     "INSERT INTO ulo_search_i(rowid, a, b) VALUES (NEW.rowid, NEW.a, NEW.b); END; CREATE TRIGGER IF NOT EXISTS "
     "ulo_search_i_delete AFTER DELETE ON m BEGIN DELETE FROM ulo_search_i WHERE rowid = OLD.rowid; END"},
    {kSearch, "m", {}, {{"c", "7"}}, "SELECT m.*, ulo_hit.s FROM m JOIN (SELECT rowid AS ulo_rowid, rank AS ulo_rank, "
     "snippet(ulo_search_i, IFNULL((SELECT cid FROM pragma_table_info('ulo_search_i') WHERE name='b'), 32767), "
     "'<''', '>', '\u2026', 64) AS s FROM ulo_search_i WHERE ulo_search_i MATCH '\"Kim''s\" \"\"\"a\"\"\"*') AS ulo_hit "
     "ON m.rowid = ulo_hit.ulo_rowid WHERE c='7' ORDER BY ulo_hit.ulo_rank LIMIT 20",
     [](DABaseSet& r) { S(r).SetIndex("i"), S(r).SetText(" Kim's\t\"a\"\u3000"), S(r).SetPrefixLast();
        S(r).AddSnippet("b", "<'", ">", 99, "s"), S(r).SetLimit(20); }},
    {kSearch, "m", {}, {}, "SELECT _ID FROM m JOIN (SELECT rowid AS ulo_rowid, rank AS ulo_rank FROM ulo_search_i "
     "WHERE ulo_search_i MATCH CASE WHEN (SELECT sql FROM sqlite_master WHERE name='ulo_search_i') LIKE "
     "'%''trigram''%' THEN '\"東京 駅\"' ELSE '\"東京\" \"駅\"' END) AS ulo_hit ON m.rowid = ulo_hit.ulo_rowid "
     "ORDER BY ts DESC", [](DABaseSet& r) { S(r).SetIndex("i"), S(r).SetText("東京 駅 "), Q(r).AddColumn("_ID");
        Q(r).SetOrderBy("ts", true); }},
    {kUpsert, kContacts, {{kName, "Kim"}}, {},
     "INSERT OR REPLACE INTO contacts (name, photo, email) VALUES ('Kim', X'89504E47', NULL)",
     [](DABaseSet& r) { r.SetBlob("photo", "\x89PNG", 4), r.SetNull("email"); }},
    {kUpdate, kContacts, {}, {{kName, "Kim"}}, "UPDATE contacts SET email = NULL WHERE name='Kim'",
     [](DABaseSet& r) { r.SetNull("email"); }},
    {kInsert, "t", {{kName, "a"}}, {}, "INSERT INTO t (name, p, q) VALUES ('a', X'', X'00FF0A')",
     [](DABaseSet& r) { r.SetBlob("p", nullptr, 0), r.SetNull(kName), r.SetBlob("q", "\0\xFF\n", 3), r.SetNull("p"); }},
    {kUpsert, "t", {}, {}, "INSERT OR REPLACE INTO t (name, phone) VALUES ('n', NULL)",  // the first value wins
     [](DABaseSet& r) { r.SetNull(kPhone), r.SetData(kPhone, "1"), r.SetData(kName, "n"); }},
    // Counters, upserts that keep the row, row values, literal text matches, cleared parts.
    {kUpdate, "conversations", {}, {{"id", "7"}}, "UPDATE conversations SET unread = unread + 1, left = left - 1, "
     "low = low + -9223372036854775808 WHERE id='7'", [](DABaseSet& r) {
        r.SetIncrement("unread", 1), r.SetIncrement("left", -1), r.SetIncrement("low", INT64_MIN); }},
    {kUpsert, kContacts, {{kPhone, "010"}, {kName, "Kim"}}, {}, "INSERT INTO contacts (name, phone, email, calls) "
     "VALUES ('Kim', '010', NULL, 1) ON CONFLICT(phone) DO UPDATE SET name = excluded.name, email = excluded.email, "
     "calls = calls + 1", [](DABaseSet& r) {
        U(r).AddConflictKey("phone"), r.SetIncrement("calls", 1), r.SetNull("email"), r.SetIncrement(kName, 5); }},
    {kUpsert, kContacts, {{kPhone, "010"}}, {},
     "INSERT INTO contacts (phone) VALUES ('010') ON CONFLICT(phone, owner) DO NOTHING",
     [](DABaseSet& r) { U(r).AddConflictKey("phone"), U(r).AddConflictKey("owner"); }},
    {kSelect, "t", {}, {}, "SELECT * FROM t WHERE (ts, _ID)<(1700000000123, 42) AND (a, b, c, d, e)>=('x''y', "
     "X'00FF', NULL, 2.5, 18446744073709551615)", [](DABaseSet& r) {
        r.SetWhereRow({"ts", "_ID"}, DACompare::Less, {std::int64_t{1700000000123}, 42});
        r.SetWhereRow({"a", "b", "c", "d", "e"}, DACompare::GreaterEqual,
                      {"x'y", DAValue::Blob("\0\xFF", 2), DAValue::Null(), 2.5, UINT64_MAX}); }},
    {kSelect, "t", {}, {}, "SELECT * FROM t WHERE b LIKE '%50\\%%' ESCAPE '\\' AND s LIKE 'a\\_b%' ESCAPE '\\' AND "
     "e LIKE '%\\\\' ESCAPE '\\'", [](DABaseSet& r) {
        r.SetWhere("b", DACompare::Contains, "50%"), r.SetWhere("s", DACompare::StartsWith, "a_b");
        r.SetWhere("e", DACompare::EndsWith, "\\"); }},
    {kQuery, "t", {{kName, "n"}}, {{kPhone, "1"}}, "SELECT * FROM t WHERE a=1", [](DABaseSet& r) {
        Q(r).SetOrderBy("ts"), Q(r).SetLimit(5, 5), r.SetWhere("x", DACompare::Less, 3), Q(r).ClearOrderBy();
        Q(r).ClearLimit(), r.ClearWhere(), r.ClearData(), r.SetWhere("a", DACompare::Equal, 1); }},
    {kUpdate, "t", {{kName, "a AND b"}}, {}, "UPDATE t SET name = 'a"},
    {kUpdate, "? AND t", {{kName, ""}}, {}, "UPDATE ?"},
    {kSelect, "t--", {}, {{kName, "a"}}, "SELECT * FROM t-- WHERE name='a'"},
    {kUpdate, "t", {{kName, "n"}}, {}, "UPDATE t SET name = 'm', phone = NULL WHERE ", [](DABaseSet& r) {
        r.SetNull(kPhone), r.ClearData(), r.SetData(kName, "m"), r.SetNull(kPhone); }},
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
