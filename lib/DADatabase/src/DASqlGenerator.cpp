#include "DASqlGenerator.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <utility>
#include <vector>

#include "DARequestParts.h"
#include "DASqlLiteral.h"
#include "DASqlStatement.h"
#include "DAStatementCache.h"

namespace {

// Drops the last occurrence of separator and everything after it; keeps the
// text whole when separator does not occur. Lists are built with a
// separator after every item, so this removes exactly the last one.
void CutAtLast(std::string& text, const char* separator)
{
    const std::string::size_type position = text.rfind(separator);
    if (position != std::string::npos) {
        text.erase(position);
    }
}

// Whether out takes a value as a parameter: shaped, and with room for one
// more (beyond the limit the whole statement is written as text again).
bool TakesParam(DASqlStatement& out)
{
    if (out.shaped && out.params.Count() == kDAMaxParams) {
        out.shaped = false;
    }
    return out.shaped;
}

// A text value: a literal in a text, a parameter in a shape.
void AppendLiteral(DASqlStatement& out, const std::string& value)
{
    if (TakesParam(out)) {
        out.sql += '?';
        out.params.AddText(value);
    } else {
        DAAppendTextLiteral(out.sql, value);
    }
}

// A piece of SQL that may hold values (a number, a DAValue's text): as it
// is in a text, split in a shape.
void AppendPiece(DASqlStatement& out, const std::string& piece)
{
    if (!out.shaped) {
        out.sql += piece;
    } else if (!DASplitAppend(piece.c_str(), out.sql, out.params)) {
        out.shaped = false;
    }
}

// A typed value of the data part as it stands in SQL: NULL, a blob, or an
// increment's delta (its value on insert).
void AppendTyped(DASqlStatement& out, const DABaseSet::TypedValue& value)
{
    if (value.increment) {
        AppendPiece(out, std::to_string(value.delta));
    } else if (!TakesParam(out)) {
        if (value.null) {
            out.sql += "NULL";
        } else {
            DAAppendBlobLiteral(out.sql, value.bytes.data(), value.bytes.size());
        }
    } else {
        out.sql += '?';
        if (value.null) {
            out.params.AddNull();
        } else {
            out.params.Add(DAParamKind::Blob, value.bytes.data(), value.bytes.size());
        }
    }
}

// Appends "c = c + 1" ("c = c - 1" for a negative delta; the most
// negative one stays an integer as "c + -9223372036854775808").
void AppendIncrement(DASqlStatement& out, const DABaseSet::TypedValue& value)
{
    out.sql.append(value.column).append(" = ").append(value.column);
    if (value.delta >= 0 || value.delta == INT64_MIN) {
        out.sql += " + ";
        AppendPiece(out, std::to_string(value.delta));
    } else {
        out.sql += " - ";
        AppendPiece(out, std::to_string(-value.delta));
    }
}

// Appends one listed condition: "ts<1700000000000", "k IN ('a', 'b')",
// "v IS NULL".
template <typename Condition>
void AppendCondition(DASqlStatement& out, const char* column, const Condition& condition)
{
    static const char* const kOperators[] = {"=", "<>", "<", "<=", ">", ">=", " LIKE ", " LIKE ", " LIKE ", " LIKE "};
    std::string& sql = out.sql;
    sql += column;
    switch (condition.form) {
    case DABaseSet::Condition::Form::Compare:
        sql += kOperators[static_cast<int>(condition.op)];
        if (condition.number) {
            AppendPiece(out, condition.values.front());
        } else {
            AppendLiteral(out, condition.values.front());
        }
        if (condition.op > DACompare::Like) {  // a text match: its pattern escapes with '\'
            sql += " ESCAPE ";
            AppendLiteral(out, "\\");
        }
        break;
    case DABaseSet::Condition::Form::Row:
        sql += '(';
        for (const std::string& column : condition.columns) {
            sql += column + ", ";
        }
        sql.resize(sql.size() - 2);
        sql += ")";
        sql += kOperators[static_cast<int>(condition.op)];
        sql += '(';
        for (const std::string& value : condition.values) {
            AppendPiece(out, value);
            sql += ", ";
        }
        sql.resize(sql.size() - 2);
        sql += ')';
        break;
    case DABaseSet::Condition::Form::In:
        sql += " IN (";
        for (const std::string& value : condition.values) {
            AppendLiteral(out, value);
            sql += ", ";
        }
        if (!condition.values.empty()) {
            sql.resize(sql.size() - 2);
        }
        sql += ')';
        break;
    case DABaseSet::Condition::Form::Null:
        sql += " IS NULL";
        break;
    case DABaseSet::Condition::Form::NotNull:
        sql += " IS NOT NULL";
        break;
    }
}

// Whether a text value in params holds " AND", which the WHERE builder's
// cut of an update without conditions would find inside its literal.
bool AnyTextHoldsAnd(const DASqlParams& params)
{
    bool found = false;
    params.View().ForEach([&](DAParamKind kind, const char* bytes, std::size_t size) {
        found = found || (kind == DAParamKind::Text && std::string(bytes, size).find(" AND") != std::string::npos);
    });
    return found;
}

// The one WHERE builder: " WHERE " with the equalities in map order, then
// the listed conditions in call order, joined by " AND "; then a cut at the
// last " AND" of the whole text. Without any condition nothing is written,
// unless always (the update's shape), which writes " WHERE " and cuts as
// ever.
void AppendWhere(DASqlStatement& out, DABaseSet& request, bool always)
{
    const DAValueMap& conditions = DARequestParts::Where(request);
    if (conditions.empty() && !DARequestParts::HasConditions(request)) {
        if (!always) {
            return;
        }
        // The cut then reaches back before " WHERE ": into the text's
        // literals, which a shape does not have, or into a name, which
        // would drop values the shape still holds. Either way, text only.
        if (out.shaped && (out.sql.find(" AND") != std::string::npos || AnyTextHoldsAnd(out.params))) {
            out.shaped = false;
            return;
        }
    }
    out.sql += " WHERE ";
    for (const auto& condition : conditions) {
        out.sql += condition.first;
        out.sql += '=';
        AppendLiteral(out, condition.second);
        out.sql += " AND ";
    }
    DARequestParts::ForEachCondition(request, [&](const char* column, const auto& condition) {
        AppendCondition(out, column, condition);
        out.sql += " AND ";
    });
    CutAtLast(out.sql, " AND");
}

// "<head>t (a, b) VALUES ('1', '2')", the data map in map order, then the
// typed values in call order, increments last: the insert statements'
// shared shape.
void WriteInsert(const char* head, DABaseSet& request, const std::string& table, DASqlStatement& out)
{
    const DAValueMap& data = DARequestParts::Data(request);
    const std::vector<DABaseSet::TypedValue>& typed = DARequestParts::Typed(request);

    // The increments' columns come last, their delta as the value.
    std::vector<const DABaseSet::TypedValue*> ordered;
    ordered.reserve(typed.size());
    for (const bool increments : {false, true}) {
        for (const auto& value : typed) {
            if (value.increment == increments) {
                ordered.push_back(&value);
            }
        }
    }
    std::string& sql = out.sql;
    sql.reserve(std::char_traits<char>::length(head) + table.size() + 16 * (data.size() + typed.size()) + 16);
    sql.append(head).append(table).append(" (");
    for (const auto& entry : data) {
        sql.append(entry.first).append(", ");
    }
    for (const auto* value : ordered) {
        sql.append(value->column).append(", ");
    }
    if (!data.empty() || !ordered.empty()) {
        sql.resize(sql.size() - 2);  // the separator after the last name
    }
    sql += ") VALUES (";
    const std::size_t bare = sql.size();
    for (const auto& entry : data) {
        AppendLiteral(out, entry.second);
        sql += ", ";
    }
    for (const auto* value : ordered) {
        AppendTyped(out, *value);
        sql += ", ";
    }
    if (sql.size() != bare) {
        sql.resize(sql.size() - 2);
    }
    sql += ')';
}

// The select list's items, each followed by ", ": "type, COUNT(*) AS n, ".
void AppendSelectList(std::string& text, const std::vector<DAQueryRequest::SelectItem>& items)
{
    static const char* const kFunctions[] = {"COUNT(", "MIN(", "MAX(", "SUM(", "AVG("};
    for (const auto& item : items) {
        if (item.aggregate) {
            text += kFunctions[static_cast<int>(item.function)];
            text += item.column.empty() ? "*" : item.column;
            text += ") AS " + item.as;
        } else {
            text += item.column;
        }
        text += ", ";
    }
}

// " GROUP BY a, b", " ORDER BY a, b DESC" (or by defaultOrder, when given,
// without sort keys), " LIMIT n OFFSET m": the end of every query.
void AppendQueryTail(DASqlStatement& out, DAQueryRequest& request, const char* defaultOrder)
{
    std::string& text = out.sql;
    DAOrderKeys keys;
    int count = -1;
    int offset = 0;
    std::vector<std::string> groups;
    request.GetOrderBy(keys);
    request.GetLimit(count, offset);
    request.GetGroupBy(groups);
    if (!groups.empty()) {
        text += " GROUP BY ";
        for (const auto& group : groups) {
            text += group + ", ";
        }
        text.resize(text.size() - 2);
    }
    if (!keys.empty()) {
        text += " ORDER BY ";
        for (const auto& key : keys) {
            text += key.first;
            text += key.second ? " DESC, " : ", ";
        }
        CutAtLast(text, ", ");
    } else if (defaultOrder != nullptr) {
        text += " ORDER BY ";
        text += defaultOrder;
    }
    if (count >= 0 || offset > 0) {
        text += " LIMIT ";
        AppendPiece(out, std::to_string(count));
        if (offset > 0) {
            text += " OFFSET ";
            AppendPiece(out, std::to_string(offset));
        }
    }
}

}  // namespace

namespace {

constexpr std::size_t kTypicalSize = 120;

// Whether a shape holds nothing a split of its text would read otherwise:
// one "?" per value and none of the bytes that make a split refuse a text
// (a name written as it was given may hold any). Then writing the values
// back into the shape gives the text.
bool StandsAlone(const DASqlStatement& out)
{
    // One pass over the shape, which runs for every statement a session
    // binds: a table of the bytes that stop it, and the pairs checked at
    // their first byte.
    static const auto kStops = [] {
        std::array<bool, 256> stops{};
        for (const unsigned char c : std::string("'\";`[:@$-/?")) {
            stops[c] = true;
        }
        return stops;
    }();
    std::size_t marks = 0;
    const std::string& shape = out.sql;
    for (std::size_t i = 0; i < shape.size(); ++i) {
        const char c = shape[i];
        if (!kStops[static_cast<unsigned char>(c)]) {
            continue;
        }
        if (c == '?') {
            ++marks;
        } else if ((c != '-' && c != '/') || shape[i + 1] == (c == '-' ? '-' : '*')) {
            return false;
        }
    }
    return marks == out.params.Count();
}

// Writes request into out with write, as DAWriteSql promises: from an
// empty out, and as text when the shape could not be written.
template <typename Request>
void WriteWith(void (*write)(Request&, DASqlStatement&), Request& request, DASqlStatement& out)
{
    const bool shaped = out.shaped;
    out.sql.clear();
    out.sql.reserve(kTypicalSize);  // one allocation for most statements
    out.params.Clear();
    write(request, out);
    if (shaped && (!out.shaped || !StandsAlone(out))) {
        out.shaped = false;
        out.sql.clear();
        out.params.Clear();
        write(request, out);
    }
}

// A schema statement: text only.
template <typename Request>
void WriteText(void (*write)(Request&, DASqlStatement&), Request& request, DASqlStatement& out)
{
    out.shaped = false;
    WriteWith(write, request, out);
}

// The published text of a request's statement.
template <typename Request>
void TextOf(Request& request, std::string& sql)
{
    DASqlStatement out;
    DAWriteSql(request, out);
    sql = std::move(out.sql);
}

void WriteDropTable(DADropRequest& request, DASqlStatement& out)
{
    std::string table;
    request.GetTable(table);
    out.sql = "DROP TABLE " + table;
}

void WriteCreateTable(DACreateRequest& request, DASqlStatement& out)
{
    std::string table;
    std::string keyName;
    std::string keyType;
    std::string compositeName;
    std::string compositeType;
    DAColumnList columns;
    request.GetTable(table);
    request.GetPrimaryKey(keyName, keyType);
    request.GetCompositeKey(compositeName, compositeType);
    request.GetColumnKey(columns);

    const bool hasKey = !keyName.empty() && !keyType.empty();
    const bool hasComposite = hasKey && !compositeName.empty() && !compositeType.empty();

    std::string& text = out.sql;
    text = "CREATE TABLE IF NOT EXISTS " + table;
    if (!hasKey) {
        text += " (_ID INTEGER PRIMARY KEY, ";
    } else if (!hasComposite) {
        text += " (" + keyName + " " + keyType + " NOT NULL PRIMARY KEY, ";
    } else {
        text += " (" + keyName + " " + keyType + ", " + compositeName + " " + compositeType + ", ";
    }
    for (const auto& column : columns) {
        text += column.first;
        text += ' ';
        text += column.second;
        text += ", ";
    }
    if (hasComposite) {
        text += "PRIMARY KEY(" + keyName + ", " + compositeName + "), ";
    }
    CutAtLast(text, ", ");
    text += ')';
}

void WriteSelect(DASelectRequest& request, DASqlStatement& out)
{
    std::string table;
    request.GetTable(table);
    out.sql.append("SELECT * FROM ").append(table);
    AppendWhere(out, request, false);
}

void WriteQuery(DAQueryRequest& request, DASqlStatement& out)
{
    std::vector<DAQueryRequest::SelectItem> items;
    request.GetColumns(items);
    if (items.empty()) {
        WriteSelect(request, out);
    } else {
        std::string table;
        request.GetTable(table);
        out.sql += "SELECT ";
        AppendSelectList(out.sql, items);
        out.sql.resize(out.sql.size() - 2);
        out.sql.append(" FROM ").append(table);
        AppendWhere(out, request, false);
    }
    AppendQueryTail(out, request, nullptr);
}

void WriteJoin(DAJoinRequest& request, DASqlStatement& out)
{
    std::string leftTable;
    std::string leftColumn;
    std::string rightTable;
    std::string rightColumn;
    request.GetLeftJoin(leftTable, leftColumn);
    request.GetRightJoin(rightTable, rightColumn);

    out.sql = "SELECT  * FROM " + leftTable + " INNER JOIN " + rightTable + " ON " + leftTable + "." + leftColumn +
        " = " + rightTable + "." + rightColumn;
    AppendWhere(out, request, false);
}

void WriteUpsert(DAUpsertRequest& request, DASqlStatement& out)
{
    std::string table;
    std::vector<std::string> keys;
    request.GetTable(table);
    request.GetConflictKeys(keys);
    if (keys.empty()) {
        WriteInsert("INSERT OR REPLACE INTO ", request, table, out);
        return;
    }
    WriteInsert("INSERT INTO ", request, table, out);
    std::string& text = out.sql;
    text += " ON CONFLICT(";
    for (const std::string& key : keys) {
        text += key + ", ";
    }
    text.resize(text.size() - 2);
    text += ") DO UPDATE SET ";
    // Every column but the keys takes the new row's value, in the insert's
    // column order; the increments add to the row there is.
    const DAValueMap& data = DARequestParts::Data(request);
    const std::vector<DABaseSet::TypedValue>& typed = DARequestParts::Typed(request);
    const auto isKey = [&](const char* column) { return std::find(keys.begin(), keys.end(), column) != keys.end(); };
    const std::size_t bare = text.size();
    for (const auto& entry : data) {
        if (!isKey(entry.first)) {
            text.append(entry.first).append(" = excluded.").append(entry.first).append(", ");
        }
    }
    for (const auto& value : typed) {
        if (!value.increment && !isKey(value.column)) {
            text.append(value.column).append(" = excluded.").append(value.column).append(", ");
        }
    }
    for (const auto& value : typed) {
        if (value.increment) {
            AppendIncrement(out, value);
            text += ", ";
        }
    }
    if (text.size() == bare) {  // only keys: the row there is stays as it is
        text.resize(bare - std::strlen("UPDATE SET "));
        text += "NOTHING";
    } else {
        text.resize(text.size() - 2);
    }
}

void WriteUpdate(DAUpdateRequest& request, DASqlStatement& out)
{
    std::string table;
    request.GetTable(table);
    const DAValueMap& data = DARequestParts::Data(request);
    const std::vector<DABaseSet::TypedValue>& typed = DARequestParts::Typed(request);

    std::string& text = out.sql;
    text.append("UPDATE ").append(table).append(" SET ");
    for (const auto& entry : data) {
        text += entry.first;
        text += " = ";
        AppendLiteral(out, entry.second);
        text += ", ";
    }
    for (const auto& value : typed) {
        if (value.increment) {
            AppendIncrement(out, value);
        } else {
            text += value.column;
            text += " = ";
            AppendTyped(out, value);
        }
        text += ", ";
    }
    CutAtLast(text, ", ");
    AppendWhere(out, request, true);
}

void WriteDelete(DADeleteRequest& request, DASqlStatement& out)
{
    std::string table;
    request.GetTable(table);
    out.sql.append("DELETE  FROM ").append(table);
    AppendWhere(out, request, false);
}

void WriteCreateIndex(DACreateIndexRequest& request, DASqlStatement& out)
{
    std::string table;
    std::string name;
    DAIndexColumns columns;
    request.GetTable(table);
    request.GetName(name);
    request.GetColumns(columns);

    std::string& text = out.sql;
    text = request.IsUnique() ? "CREATE UNIQUE INDEX IF NOT EXISTS " : "CREATE INDEX IF NOT EXISTS ";
    text += name + " ON " + table + " (";
    for (const auto& column : columns) {
        text += column.first;
        text += column.second ? " DESC, " : ", ";
    }
    CutAtLast(text, ", ");
    text += ')';
}

void WriteAddColumn(DAAddColumnRequest& request, DASqlStatement& out)
{
    std::string table;
    std::string column;
    std::string type;
    std::string value;
    request.GetTable(table);
    request.GetColumn(column, type);

    out.sql = "ALTER TABLE " + table + " ADD COLUMN " + column + " " + type;
    if (request.GetDefault(value)) {
        out.sql += " DEFAULT ";
        DAAppendTextLiteral(out.sql, value);
    }
}

void WriteInsertRequest(DAInsertRequest& request, DASqlStatement& out)
{
    std::string table;
    request.GetTable(table);
    WriteInsert(request.GetIgnoreExisting() ? "INSERT OR IGNORE INTO " : "INSERT INTO ", request, table, out);
}

}  // namespace

void DAWriteSql(DAQueryRequest& request, DASqlStatement& out)
{
    WriteWith(WriteQuery, request, out);
}

void DAWriteSql(DASelectRequest& request, DASqlStatement& out)
{
    WriteWith(WriteSelect, request, out);
}

void DAWriteSql(DAJoinRequest& request, DASqlStatement& out)
{
    WriteWith(WriteJoin, request, out);
}

void DAWriteSql(DAUpsertRequest& request, DASqlStatement& out)
{
    WriteWith(WriteUpsert, request, out);
}

void DAWriteSql(DAUpdateRequest& request, DASqlStatement& out)
{
    WriteWith(WriteUpdate, request, out);
}

void DAWriteSql(DADeleteRequest& request, DASqlStatement& out)
{
    WriteWith(WriteDelete, request, out);
}

void DAWriteSql(DAInsertRequest& request, DASqlStatement& out)
{
    WriteWith(WriteInsertRequest, request, out);
}

void DAWriteSql(DACreateRequest& request, DASqlStatement& out)
{
    WriteText(WriteCreateTable, request, out);
}

void DAWriteSql(DADropRequest& request, DASqlStatement& out)
{
    WriteText(WriteDropTable, request, out);
}

void DAWriteSql(DACreateIndexRequest& request, DASqlStatement& out)
{
    WriteText(WriteCreateIndex, request, out);
}

void DAWriteSql(DAAddColumnRequest& request, DASqlStatement& out)
{
    WriteText(WriteAddColumn, request, out);
}

// By-value parameter: the signature of the published interface.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
void DASqlGenerator::GetDBPath(std::string dir, std::string file, std::string& path)
{
    // An empty directory makes size() - 1 wrap to npos, the "no slash"
    // result of rfind: the two compare equal and no "/" is added.
    if (dir.rfind('/') != dir.size() - 1) {
        dir += '/';
    }
    dir += file;
    path = std::move(dir);
}

// By-value parameter: the signature of the published interface.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
void DASqlGenerator::GetCheckTableSql(std::string table, std::string& sql)
{
    std::string text = "SELECT COUNT(*) from sqlite_master WHERE TYPE='table' AND NAME=";
    DAAppendTextLiteral(text, table);
    sql = std::move(text);
}

void DASqlGenerator::GetDropTableSql(DADropRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetCreateTableSql(DACreateRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetSelectSql(DASelectRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetQuerySql(DAQueryRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetJoinSql(DAJoinRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetUpsertSql(DAUpsertRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetUpdateSql(DAUpdateRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetDeleteSql(DADeleteRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetCreateIndexSql(DACreateIndexRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetAddColumnSql(DAAddColumnRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

void DASqlGenerator::GetCompactSql(DABasePath& /*location*/, std::string& sql)
{
    sql = "VACUUM";
}

void DASqlGenerator::GetInsertSql(DAInsertRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

namespace {

// What creating a search index adds is named after it with this prefix.
const char* const kSearchPrefix = "ulo_search_";
// A trigram holds 3 characters: shorter words cannot be looked up.
constexpr std::size_t kTrigram = 3;

// The length of a separator (ASCII white space, U+00A0, U+3000) at text[at],
// 0 when there is none.
std::size_t SeparatorAt(const std::string& text, std::size_t at)
{
    static const char* const kWide[] = {"\xC2\xA0", "\xE3\x80\x80"};
    if (std::strchr(" \t\n\v\f\r", text[at]) != nullptr) {
        return 1;
    }
    for (const char* wide : kWide) {
        if (text.compare(at, std::strlen(wide), wide) == 0) {
            return std::strlen(wide);
        }
    }
    return 0;
}

// The characters of UTF-8 text (bytes that do not continue one).
std::size_t CharacterCount(const std::string& text)
{
    return static_cast<std::size_t>(std::count_if(
        text.begin(), text.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xC0U) != 0x80U; }));
}

// text as one FTS5 string: between double quotes, each one inside doubled,
// so that the engine reads every character as text.
std::string Fts5String(const std::string& text)
{
    std::string out = "\"";
    for (const char c : text) {
        out += c;
        if (c == '"') {
            out += '"';
        }
    }
    return out + '"';
}

// The MATCH operand for typed: its words (split at separators) each as an
// FTS5 string, all required, the last one a prefix when asked. The index
// splits each string as it splits text; a string without a token of its
// own (only punctuation) is left out by the engine, and the query of no
// string, "", matches nothing. A Substrings index cannot find a word
// shorter than a trigram, so when there is one the statement reads the
// index's tokenizer from the schema and, for trigram, looks up the whole
// text as one substring instead (nothing when it is shorter still).
void AppendMatch(std::string& sql, const std::string& typed, bool prefix, const std::string& index)
{
    std::string words;
    std::string::size_type first = std::string::npos;
    std::string::size_type end = 0;
    bool shortWord = false;
    for (std::size_t at = 0; at < typed.size();) {
        std::size_t start = at;
        while (at < typed.size() && SeparatorAt(typed, at) == 0) {
            ++at;
        }
        if (at > start) {
            const std::string word = typed.substr(start, at - start);
            words += (words.empty() ? "" : " ") + Fts5String(word);
            shortWord = shortWord || CharacterCount(word) < kTrigram;
            first = std::min(first, start);
            end = at;
        }
        while (at < typed.size() && SeparatorAt(typed, at) != 0) {
            at += SeparatorAt(typed, at);
        }
    }
    if (words.empty()) {
        words = "\"\"";
    } else if (prefix) {
        words += '*';
    }
    if (!shortWord) {
        DAAppendTextLiteral(sql, words);
        return;
    }
    const std::string whole = typed.substr(first, end - first);
    sql += "CASE WHEN (SELECT sql FROM sqlite_master WHERE name=";
    DAAppendTextLiteral(sql, index);
    sql += ") LIKE '%''trigram''%' THEN ";
    DAAppendTextLiteral(sql, CharacterCount(whole) < kTrigram ? "\"\"" : Fts5String(whole));
    sql += " ELSE ";
    DAAppendTextLiteral(sql, words);
    sql += " END";
}

}  // namespace

namespace {

void WriteCreateSearchIndex(DASearchIndexRequest& request, DASqlStatement& out)
{
    std::string table;
    std::string name;
    std::vector<std::string> columns;
    request.GetTable(table);
    request.GetName(name);
    request.GetColumns(columns);

    const std::string index = kSearchPrefix + name;
    std::string list;
    std::string values;
    std::string changed;
    for (const std::string& column : columns) {
        list += ", " + column;
        values += ", NEW." + column;
        changed.append(" OR OLD.").append(column).append(" IS NOT NEW.").append(column);
    }
    const std::string insert = "INSERT INTO " + index + "(rowid" + list + ") VALUES (NEW.rowid" + values + "); END";
    const std::string trigger = "; CREATE TRIGGER IF NOT EXISTS " + index;
    // The rows already there first: a missing table or column fails here,
    // before any trigger. A row held already (creating again) is skipped.
    // Each trigger deletes before it inserts: an INSERT OR REPLACE of a row
    // deletes the old one without the delete trigger (unless recursive
    // triggers are on), and its entry must not outlive it; a statement's
    // own conflict clause would override one written in the trigger.
    std::string text = "CREATE VIRTUAL TABLE IF NOT EXISTS " + index + " USING fts5(" +
        (list.empty() ? list : list.substr(2)) +
        (request.GetTokens() == DASearchTokens::Substrings
             ? ", tokenize='trigram')"
             : ", tokenize='unicode61 remove_diacritics 2', prefix='2 3')");
    text += "; INSERT INTO " + index + "(rowid" + list + ") SELECT rowid" + list + " FROM " + table +
        " WHERE rowid NOT IN (SELECT rowid FROM " + index + ")";
    text += trigger + "_insert AFTER INSERT ON " + table + " BEGIN DELETE FROM " + index +
        " WHERE rowid = NEW.rowid; " + insert;
    text += trigger + "_update AFTER UPDATE ON " + table + " WHEN OLD.rowid IS NOT NEW.rowid" + changed +
        " BEGIN DELETE FROM " + index + " WHERE rowid IN (OLD.rowid, NEW.rowid); " + insert;
    text +=
        trigger + "_delete AFTER DELETE ON " + table + " BEGIN DELETE FROM " + index + " WHERE rowid = OLD.rowid; END";
    out.sql = std::move(text);
}

void WriteSearch(DASearchRequest& request, DASqlStatement& out)
{
    std::string table;
    std::string name;
    std::string typed;
    std::vector<DAQueryRequest::SelectItem> items;
    std::vector<DASearchRequest::Snippet> snippets;
    request.GetTable(table);
    request.GetIndex(name);
    request.GetText(typed);
    request.GetColumns(items);
    request.GetSnippets(snippets);

    const std::string index = kSearchPrefix + name;
    std::string& text = out.sql;
    text = "SELECT ";
    if (items.empty()) {
        text += table + ".*, ";
    }
    AppendSelectList(text, items);
    for (const auto& snippet : snippets) {
        text += "ulo_hit." + snippet.as + ", ";
    }
    text.resize(text.size() - 2);
    // The hits in a subquery of their own, so that the index's columns
    // (named as the table's) never make the request's names ambiguous;
    // SQLite flattens it into one join.
    text += " FROM " + table + " JOIN (SELECT rowid AS ulo_rowid, rank AS ulo_rank";
    for (const auto& snippet : snippets) {
        // The column's place in the index, from the index itself; one it
        // does not hold is out of range.
        text += ", snippet(" + index + ", IFNULL((SELECT cid FROM pragma_table_info(";
        DAAppendTextLiteral(text, index);
        text += ") WHERE name=";
        DAAppendTextLiteral(text, snippet.column);
        text += "), 32767), ";
        DAAppendTextLiteral(text, snippet.before);
        text += ", ";
        DAAppendTextLiteral(text, snippet.after);
        text += ", '\xE2\x80\xA6', " + std::to_string(snippet.words) + ") AS " + snippet.as;
    }
    text += " FROM " + index + " WHERE " + index + " MATCH ";
    AppendMatch(text, typed, request.GetPrefixLast(), index);
    // Joined by rowid, so an entry whose row is gone (replaced under
    // another key) finds nothing.
    text += ") AS ulo_hit ON " + table + ".rowid = ulo_hit.ulo_rowid";
    AppendWhere(out, request, false);
    AppendQueryTail(out, request, "ulo_hit.ulo_rank");
}

}  // namespace

void DAWriteSql(DASearchIndexRequest& request, DASqlStatement& out)
{
    WriteText(WriteCreateSearchIndex, request, out);
}

void DAWriteSql(DASearchRequest& request, DASqlStatement& out)
{
    WriteText(WriteSearch, request, out);
}

void DASqlGenerator::GetCreateSearchIndexSql(DASearchIndexRequest& request, std::string& sql)
{
    TextOf(request, sql);
}

// By-value parameter: the shape of GetCheckTableSql.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
void DASqlGenerator::GetDropSearchIndexSql(std::string name, std::string& sql)
{
    const std::string index = kSearchPrefix + name;
    std::string text;
    for (const char* trigger : {"_insert", "_update", "_delete"}) {
        text += "DROP TRIGGER IF EXISTS " + index + trigger + "; ";
    }
    sql = text + "DROP TABLE IF EXISTS " + index;
}

void DASqlGenerator::GetSearchSql(DASearchRequest& request, std::string& sql)
{
    TextOf(request, sql);
}
