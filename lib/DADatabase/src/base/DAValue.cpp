#include "DAValue.h"

#include <cmath>

#include "DASqlLiteral.h"

DAValue::DAValue(std::int64_t value) : m_type(DAValueType::Integer), m_sql(std::to_string(value))
{
}

DAValue::DAValue(double value) : m_type(DAValueType::Real), m_sql(DANumberText(value))
{
    if (!std::isfinite(value)) {
        *this = DAValue();
        m_failure = "INVALID NUMBER, CONDITION NOT STORED";
    }
}

DAValue::DAValue(char const* text)
{
    if (text == nullptr) {
        m_failure = "NULL VALUE, CONDITION NOT STORED";
        return;
    }
    *this = DAValue(std::string(text));
}

DAValue::DAValue(std::string const& text) : m_type(DAValueType::Text), m_sql()
{
    m_sql.reserve(text.size() + 2);
    DAAppendTextLiteral(m_sql, text);
}

DAValue DAValue::Null()
{
    return {};
}

DAValue DAValue::Blob(void const* data, std::size_t size)
{
    DAValue value;
    if (data == nullptr && size > 0) {
        value.m_failure = "NULL BLOB, CONDITION NOT STORED";
        return value;
    }
    value.m_type = DAValueType::Blob;
    value.m_sql.clear();
    DAAppendBlobLiteral(value.m_sql, static_cast<const unsigned char*>(data), size);
    return value;
}

void DAValue::SetUnsigned(std::uint64_t value)
{
    // std::to_string of an unsigned value: its exact decimal digits.
    m_type = value <= static_cast<std::uint64_t>(INT64_MAX) ? DAValueType::Integer : DAValueType::Real;
    m_sql = std::to_string(value);
}
