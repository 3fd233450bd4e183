#include "DASqlStatement.h"

#include "DASqlLiteral.h"

void DASqlParams::Add(DAParamKind kind, const void* bytes, std::size_t size)
{
    char head[1 + (sizeof size * 8 + 6) / 7];
    std::size_t length = 0;
    head[length++] = static_cast<char>(kind);
    for (std::size_t rest = size;; rest >>= 7U) {
        head[length++] = static_cast<char>((rest & 0x7FU) | (rest > 0x7FU ? 0x80U : 0U));
        if (rest <= 0x7FU) {
            break;
        }
    }
    m_bytes.append(head, length).append(static_cast<const char*>(bytes), size);
    ++m_count;
}

int DASqlParamsView::Bind(sqlite3_stmt* stmt) const
{
    int rc = SQLITE_OK;
    int index = 0;
    ForEach([&](DAParamKind kind, const char* bytes, std::size_t size) {
        if (rc != SQLITE_OK) {
            return;
        }
        ++index;
        const auto length = static_cast<sqlite3_uint64>(size);
        switch (kind) {
        case DAParamKind::Integer: {
            std::int64_t value = 0;
            std::memcpy(&value, bytes, sizeof value);
            rc = sqlite3_bind_int64(stmt, index, value);
            break;
        }
        case DAParamKind::Null:
            rc = sqlite3_bind_null(stmt, index);
            break;
        case DAParamKind::Blob:
            rc = sqlite3_bind_blob64(stmt, index, bytes, length, SQLITE_STATIC);
            break;
        case DAParamKind::Text:
            rc = sqlite3_bind_text64(stmt, index, bytes, length, SQLITE_STATIC, SQLITE_UTF8);
            break;
        }
    });
    return rc;
}

void DASqlParamsView::Render(const char* shape, std::string& text) const
{
    const char* at = shape;
    ForEach([&](DAParamKind kind, const char* bytes, std::size_t size) {
        const char* mark = std::strchr(at, '?');
        text.append(at, mark);
        at = mark + 1;
        switch (kind) {
        case DAParamKind::Integer: {
            std::int64_t value = 0;
            std::memcpy(&value, bytes, sizeof value);
            text += std::to_string(value);
            break;
        }
        case DAParamKind::Null:
            text += "NULL";
            break;
        case DAParamKind::Blob:
            DAAppendBlobLiteral(text, reinterpret_cast<const unsigned char*>(bytes), size);
            break;
        case DAParamKind::Text:
            DAAppendTextLiteral(text, std::string(bytes, size));
            break;
        }
    });
    text += at;
}

std::string DASqlStatement::Text() const
{
    if (!shaped) {
        return sql;
    }
    std::string text;
    params.View().Render(sql.c_str(), text);
    return text;
}

std::size_t DAPackedSize(const DASqlStatement& statement)
{
    return 1 + statement.sql.size() + 1 +
        (statement.shaped ? sizeof(std::uint64_t) + statement.params.Bytes().size() : 0);
}

void DAPackStatement(const DASqlStatement& statement, std::vector<char>& buffer)
{
    buffer.push_back(statement.shaped ? 1 : 0);
    buffer.insert(buffer.end(), statement.sql.c_str(), statement.sql.c_str() + statement.sql.size() + 1);
    if (statement.shaped) {
        const std::string& values = statement.params.Bytes();
        const std::uint64_t size = values.size();
        const auto* bytes = reinterpret_cast<const char*>(&size);
        buffer.insert(buffer.end(), bytes, bytes + sizeof size);
        buffer.insert(buffer.end(), values.begin(), values.end());
    }
}

DASqlView DAUnpackStatement(const char* at, const char*& next)
{
    const bool shaped = *at++ != 0;
    const char* sql = at;
    at += std::strlen(sql) + 1;
    std::uint64_t size = 0;
    if (shaped) {
        std::memcpy(&size, at, sizeof size);
        at += sizeof size;
    }
    next = at + size;
    return {sql, shaped, DASqlParamsView(at, next)};
}
