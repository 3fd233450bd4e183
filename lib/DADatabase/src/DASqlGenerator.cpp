#include "DASqlGenerator.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <utility>
#include <vector>

#include "DASqlLiteral.h"

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

void AppendLiteral(std::string& sql, const std::string& value)
{
    DAAppendTextLiteral(sql, value);
}

// A typed value of the data part as it stands in SQL: NULL, a blob, or an
// increment's delta (its value on insert).
void AppendTyped(std::string& sql, const DABaseSet::TypedValue& value)
{
    if (value.increment) {
        sql += std::to_string(value.delta);
    } else if (value.null) {
        sql += "NULL";
    } else {
        DAAppendBlobLiteral(sql, value.bytes.data(), value.bytes.size());
    }
}

// Appends "c = c + 1" ("c = c - 1" for a negative delta; the most
// negative one stays an integer as "c + -9223372036854775808").
void AppendIncrement(std::string& sql, const DABaseSet::TypedValue& value)
{
    sql.append(value.column).append(" = ").append(value.column);
    if (value.delta >= 0 || value.delta == INT64_MIN) {
        sql.append(" + ").append(std::to_string(value.delta));
    } else {
        sql.append(" - ").append(std::to_string(-value.delta));
    }
}

// Appends one listed condition: "ts<1700000000000", "k IN ('a', 'b')",
// "v IS NULL".
void AppendCondition(std::string& sql, const DABaseSet::Condition& condition)
{
    static const char* const kOperators[] = {"=", "<>", "<", "<=", ">", ">=", " LIKE ", " LIKE ", " LIKE ", " LIKE "};
    sql += condition.column;
    switch (condition.form) {
    case DABaseSet::Condition::Form::Compare:
        sql += kOperators[static_cast<int>(condition.op)];
        if (condition.number) {
            sql += condition.values.front();
        } else {
            AppendLiteral(sql, condition.values.front());
        }
        if (condition.op > DACompare::Like) {  // a text match: its pattern escapes with '\'
            sql += " ESCAPE '\\'";
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
            sql += value + ", ";
        }
        sql.resize(sql.size() - 2);
        sql += ')';
        break;
    case DABaseSet::Condition::Form::In:
        sql += " IN (";
        for (const std::string& value : condition.values) {
            AppendLiteral(sql, value);
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

// The one WHERE builder: " WHERE " with the equalities in map order, then
// the listed conditions in call order, joined by " AND "; then a cut at the
// last " AND" of the whole text. Without any condition nothing is written,
// unless always (the update's shape), which writes " WHERE " and cuts as
// ever.
void AppendWhere(std::string& sql, DABaseSet& request, bool always)
{
    DAValueMap conditions;
    std::vector<DABaseSet::Condition> listed;
    request.GetWhereMap(conditions);
    request.GetConditions(listed);
    if (conditions.empty() && listed.empty() && !always) {
        return;
    }
    sql += " WHERE ";
    for (const auto& condition : conditions) {
        sql += condition.first;
        sql += '=';
        AppendLiteral(sql, condition.second);
        sql += " AND ";
    }
    for (const auto& condition : listed) {
        AppendCondition(sql, condition);
        sql += " AND ";
    }
    CutAtLast(sql, " AND");
}

// "<head>t (a, b) VALUES ('1', '2')", the data map in map order, then the
// typed values in call order, increments last: the insert statements'
// shared shape.
void WriteInsert(const char* head, DABaseSet& request, const std::string& table, std::string& sql)
{
    DAValueMap data;
    std::vector<DABaseSet::TypedValue> typed;
    request.GetDataMap(data);
    request.GetTypedData(typed);

    std::string columns = " (";
    std::string values = "VALUES (";
    for (const auto& entry : data) {
        columns += entry.first;
        columns += ", ";
        AppendLiteral(values, entry.second);
        values += ", ";
    }
    // The increments' columns come last, their delta as the value.
    for (const bool increments : {false, true}) {
        for (const auto& value : typed) {
            if (value.increment == increments) {
                columns += value.column;
                columns += ", ";
                AppendTyped(values, value);
                values += ", ";
            }
        }
    }
    CutAtLast(columns, ", ");
    columns += ") ";
    CutAtLast(values, ", ");
    values += ')';
    // Built in one buffer of the final size: batches write many of these.
    std::string text;
    text.reserve(std::char_traits<char>::length(head) + table.size() + columns.size() + values.size());
    text.append(head).append(table).append(columns).append(values);
    sql = std::move(text);
}

}  // namespace

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
    AppendLiteral(text, table);
    sql = std::move(text);
}

void DASqlGenerator::GetDropTableSql(DADropRequest& request, std::string& sql)
{
    std::string table;
    request.GetTable(table);
    sql = "DROP TABLE " + table;
}

void DASqlGenerator::GetCreateTableSql(DACreateRequest& request, std::string& sql)
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

    std::string text = "CREATE TABLE IF NOT EXISTS " + table;
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
    sql = std::move(text);
}

void DASqlGenerator::GetSelectSql(DASelectRequest& request, std::string& sql)
{
    std::string table;
    request.GetTable(table);

    std::string text = "SELECT * FROM " + table;
    AppendWhere(text, request, false);
    sql = std::move(text);
}

void DASqlGenerator::GetQuerySql(DAQueryRequest& request, std::string& sql)
{
    DAOrderKeys keys;
    int count = -1;
    int offset = 0;
    request.GetOrderBy(keys);
    request.GetLimit(count, offset);

    std::vector<DAQueryRequest::SelectItem> items;
    std::vector<std::string> groups;
    request.GetColumns(items);
    request.GetGroupBy(groups);

    std::string text;
    if (items.empty()) {
        GetSelectSql(request, text);
    } else {
        static const char* const kFunctions[] = {"COUNT(", "MIN(", "MAX(", "SUM(", "AVG("};
        std::string table;
        request.GetTable(table);
        text = "SELECT ";
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
        text.resize(text.size() - 2);
        text += " FROM " + table;
        AppendWhere(text, request, false);
    }
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
    }
    if (count >= 0 || offset > 0) {
        text += " LIMIT " + std::to_string(count);
        if (offset > 0) {
            text += " OFFSET " + std::to_string(offset);
        }
    }
    sql = std::move(text);
}

void DASqlGenerator::GetJoinSql(DAJoinRequest& request, std::string& sql)
{
    std::string leftTable;
    std::string leftColumn;
    std::string rightTable;
    std::string rightColumn;
    request.GetLeftJoin(leftTable, leftColumn);
    request.GetRightJoin(rightTable, rightColumn);

    std::string text = "SELECT  * FROM " + leftTable + " INNER JOIN " + rightTable + " ON " + leftTable + "." +
        leftColumn + " = " + rightTable + "." + rightColumn;
    AppendWhere(text, request, false);
    sql = std::move(text);
}

void DASqlGenerator::GetUpsertSql(DAUpsertRequest& request, std::string& sql)
{
    std::string table;
    std::vector<std::string> keys;
    request.GetTable(table);
    request.GetConflictKeys(keys);
    if (keys.empty()) {
        WriteInsert("INSERT OR REPLACE INTO ", request, table, sql);
        return;
    }
    WriteInsert("INSERT INTO ", request, table, sql);
    std::string text = " ON CONFLICT(";
    for (const std::string& key : keys) {
        text += key + ", ";
    }
    text.resize(text.size() - 2);
    text += ") DO UPDATE SET ";
    // Every column but the keys takes the new row's value, in the insert's
    // column order; the increments add to the row there is.
    DAValueMap data;
    std::vector<DABaseSet::TypedValue> typed;
    request.GetDataMap(data);
    request.GetTypedData(typed);
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
            AppendIncrement(text, value);
            text += ", ";
        }
    }
    if (text.size() == bare) {  // only keys: the row there is stays as it is
        text.resize(bare - std::strlen("UPDATE SET "));
        text += "NOTHING";
    } else {
        text.resize(text.size() - 2);
    }
    sql += text;
}

void DASqlGenerator::GetUpdateSql(DAUpdateRequest& request, std::string& sql)
{
    std::string table;
    DAValueMap data;
    std::vector<DABaseSet::TypedValue> typed;
    request.GetTable(table);
    request.GetDataMap(data);
    request.GetTypedData(typed);

    std::string text = "UPDATE " + table + " SET ";
    for (const auto& entry : data) {
        text += entry.first;
        text += " = ";
        AppendLiteral(text, entry.second);
        text += ", ";
    }
    for (const auto& value : typed) {
        if (value.increment) {
            AppendIncrement(text, value);
        } else {
            text += value.column;
            text += " = ";
            AppendTyped(text, value);
        }
        text += ", ";
    }
    CutAtLast(text, ", ");
    AppendWhere(text, request, true);
    sql = std::move(text);
}

void DASqlGenerator::GetDeleteSql(DADeleteRequest& request, std::string& sql)
{
    std::string table;
    request.GetTable(table);

    std::string text = "DELETE  FROM " + table;
    AppendWhere(text, request, false);
    sql = std::move(text);
}

void DASqlGenerator::GetCreateIndexSql(DACreateIndexRequest& request, std::string& sql)
{
    std::string table;
    std::string name;
    DAIndexColumns columns;
    request.GetTable(table);
    request.GetName(name);
    request.GetColumns(columns);

    std::string text = request.IsUnique() ? "CREATE UNIQUE INDEX IF NOT EXISTS " : "CREATE INDEX IF NOT EXISTS ";
    text += name + " ON " + table + " (";
    for (const auto& column : columns) {
        text += column.first;
        text += column.second ? " DESC, " : ", ";
    }
    CutAtLast(text, ", ");
    text += ')';
    sql = std::move(text);
}

void DASqlGenerator::GetAddColumnSql(DAAddColumnRequest& request, std::string& sql)
{
    std::string table;
    std::string column;
    std::string type;
    std::string value;
    request.GetTable(table);
    request.GetColumn(column, type);

    std::string text = "ALTER TABLE " + table + " ADD COLUMN " + column + " " + type;
    if (request.GetDefault(value)) {
        text += " DEFAULT ";
        AppendLiteral(text, value);
    }
    sql = std::move(text);
}

void DASqlGenerator::GetCompactSql(DABasePath& /*location*/, std::string& sql)
{
    sql = "VACUUM";
}

void DASqlGenerator::GetInsertSql(DAInsertRequest& request, std::string& sql)
{
    std::string table;
    request.GetTable(table);
    WriteInsert(request.GetIgnoreExisting() ? "INSERT OR IGNORE INTO " : "INSERT INTO ", request, table, sql);
}
