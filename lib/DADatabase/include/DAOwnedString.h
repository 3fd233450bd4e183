#ifndef DAOWNEDSTRING_H
#define DAOWNEDSTRING_H

#include <string>

/// A name a request owns: a NUL-terminated copy made with new[] at the call
/// that supplies it, released with delete[] on replacement and destruction.
/// Every request keeps its names (path parts, tables, join sides, keys) in
/// these, so no request class needs cleanup code of its own.
class DAOwnedString {
public:
    DAOwnedString() = default;
    ~DAOwnedString();

    DAOwnedString(const DAOwnedString&) = delete;
    DAOwnedString& operator=(const DAOwnedString&) = delete;

    /// Takes other's text; other then holds nothing. Never throws, so
    /// owned strings can live in a std::vector (which only appends them).
    DAOwnedString(DAOwnedString&& other) noexcept;
    DAOwnedString& operator=(DAOwnedString&& other) = delete;

    /// Replaces the held text by a fresh copy of text and releases the old
    /// copy. A null text changes nothing. On std::bad_alloc the old text is
    /// kept.
    void Assign(char const* text);

    /// Releases the held text; afterwards nothing is held.
    void Reset();

    /// The held text, or null when none is held.
    char const* Get() const { return m_text; }
    /// Whether a text is held.
    bool IsSet() const { return m_text != nullptr; }

    /// Assigns the held text to out and returns true; returns false and
    /// leaves out untouched when nothing is held.
    bool CopyTo(std::string& out) const;

private:
    char* m_text = nullptr;
};

/// The pair rule of the requests' two-part getters: when both first and
/// second hold a text, assigns them to outFirst and outSecond; otherwise
/// touches neither output.
void DACopyPair(const DAOwnedString& first, const DAOwnedString& second, std::string& outFirst, std::string& outSecond);

#endif  // DAOWNEDSTRING_H
