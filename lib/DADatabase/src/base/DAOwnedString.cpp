#include "DAOwnedString.h"

#include <cstring>
#include <utility>

DAOwnedString::~DAOwnedString()
{
    delete[] m_text;
}

DAOwnedString::DAOwnedString(DAOwnedString&& other) noexcept : m_text(std::exchange(other.m_text, nullptr))
{
}

void DAOwnedString::Assign(char const* text)
{
    if (text == nullptr) {
        return;
    }
    const std::size_t size = std::strlen(text) + 1;
    char* copy = new char[size];  // may throw: the old text is still held
    std::memcpy(copy, text, size);
    delete[] m_text;
    m_text = copy;
}

void DAOwnedString::Reset()
{
    delete[] m_text;
    m_text = nullptr;
}

bool DAOwnedString::CopyTo(std::string& out) const
{
    if (m_text == nullptr) {
        return false;
    }
    out = m_text;
    return true;
}

void DACopyPair(const DAOwnedString& first, const DAOwnedString& second, std::string& outFirst, std::string& outSecond)
{
    if (first.IsSet() && second.IsSet()) {
        first.CopyTo(outFirst);
        second.CopyTo(outSecond);
    }
}
