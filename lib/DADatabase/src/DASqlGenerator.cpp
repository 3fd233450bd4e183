#include "DASqlGenerator.h"

#include <utility>

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

// Appends value as an SQL text literal, doubling any single quote in it.
void AppendLiteral(std::string& sql, const std::string& value)
{
    sql += '\'';
    for (const char c : value) {
        if (c == '\'') {
            sql += '\'';
        }
        sql += c;
    }
    sql += '\'';
}

// Appends " WHERE a='1' AND b='2'" in map order, then cuts at the last
// " AND" of the whole text (so an empty map leaves " WHERE ").
void AppendWhere(std::string& sql, const DAValueMap& conditions)
{
    sql += " WHERE ";
    for (const auto& condition : conditions) {
        sql += condition.first;
        sql += '=';
        AppendLiteral(sql, condition.second);
        sql += " AND ";
    }
    CutAtLast(sql, " AND");
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
    DAValueMap conditions;
    request.GetTable(table);
    request.GetWhereMap(conditions);

    std::string text = "SELECT * FROM " + table;
    if (!conditions.empty()) {
        AppendWhere(text, conditions);
    }
    sql = std::move(text);
}

void DASqlGenerator::GetQuerySql(DAQueryRequest& request, std::string& sql)
{
    DAOrderKeys keys;
    int count = -1;
    int offset = 0;
    request.GetOrderBy(keys);
    request.GetLimit(count, offset);

    std::string text;
    GetSelectSql(request, text);
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
    DAValueMap conditions;
    request.GetLeftJoin(leftTable, leftColumn);
    request.GetRightJoin(rightTable, rightColumn);
    request.GetWhereMap(conditions);

    std::string text = "SELECT  * FROM " + leftTable + " INNER JOIN " + rightTable + " ON " + leftTable + "." +
        leftColumn + " = " + rightTable + "." + rightColumn;
    if (!conditions.empty()) {
        AppendWhere(text, conditions);
    }
    sql = std::move(text);
}

void DASqlGenerator::GetUpsertSql(DAUpsertRequest& request, std::string& sql)
{
    std::string table;
    DAValueMap data;
    request.GetTable(table);
    request.GetDataMap(data);

    std::string columns = " (";
    std::string values = "VALUES (";
    for (const auto& entry : data) {
        columns += entry.first;
        columns += ", ";
        AppendLiteral(values, entry.second);
        values += ", ";
    }
    CutAtLast(columns, ", ");
    columns += ") ";
    CutAtLast(values, ", ");
    values += ')';
    // Built in one buffer of the final size: batches write many of these.
    const char* const head = "INSERT OR REPLACE INTO ";
    std::string text;
    text.reserve(std::char_traits<char>::length(head) + table.size() + columns.size() + values.size());
    text.append(head).append(table).append(columns).append(values);
    sql = std::move(text);
}

void DASqlGenerator::GetUpdateSql(DAUpdateRequest& request, std::string& sql)
{
    std::string table;
    DAValueMap data;
    DAValueMap conditions;
    request.GetTable(table);
    request.GetDataMap(data);
    request.GetWhereMap(conditions);

    std::string text = "UPDATE " + table + " SET ";
    for (const auto& entry : data) {
        text += entry.first;
        text += " = ";
        AppendLiteral(text, entry.second);
        text += ", ";
    }
    CutAtLast(text, ", ");
    AppendWhere(text, conditions);
    sql = std::move(text);
}

void DASqlGenerator::GetDeleteSql(DADeleteRequest& request, std::string& sql)
{
    std::string table;
    DAValueMap conditions;
    request.GetTable(table);
    request.GetWhereMap(conditions);

    std::string text = "DELETE  FROM " + table;
    if (!conditions.empty()) {
        AppendWhere(text, conditions);
    }
    sql = std::move(text);
}
