#ifndef DASEARCHREQUEST_H
#define DASEARCHREQUEST_H

#include <string>
#include <vector>

#include "DAOwnedString.h"
#include "DAQueryRequest.h"

/// A search of a table through one of its search indexes
/// (DADatabase::Search): the rows whose indexed columns hold every word the
/// user typed, best match first. Everything of DAQueryRequest applies: the
/// table (SetTable: the index's table), conditions on the table's own
/// columns, the select list (else every column of the table), sort keys
/// (which replace the best-match order), groups and the page.
///
/// Any text is a valid search (DASqlGenerator::GetSearchSql says how it is
/// read): quotes, '*', '-', ':', '(', NEAR, AND, OR, NOT and every other
/// character are matched as text, never as syntax. An empty text, or one
/// of separators only, matches no row.
class DASearchRequest : public DAQueryRequest {
public:
    DASearchRequest() = default;
    ~DASearchRequest() override = default;

    /// Replaces the index searched (DASearchIndexRequest::SetName) by a copy
    /// of name. A name that is not plain (see DASearchIndexRequest), null
    /// included, is refused: nothing is stored and the error line "INVALID
    /// NAME, NOT STORED" is logged.
    void SetIndex(char const* name);

    /// Replaces the text searched for by a copy of text, what the user
    /// typed; null is the empty text.
    void SetText(char const* text);

    /// Whether the last word matches as a prefix ("caf" finds "café"), for
    /// searching as the user types; false until set. Substrings indexes
    /// match any substring anyway.
    void SetPrefixLast(bool prefix = true) { m_prefixLast = prefix; }

    /// Appends to the select list the column as holding the text of the
    /// indexed column column around the matched words, each match between
    /// before and after (null: nothing), about words words (1..64; clamped)
    /// around them, "…" where the text is cut. column and as must be plain
    /// unqualified names, else the snippet is refused with the line
    /// "INVALID NAME, NOT STORED". Under the member lock of the snippet
    /// list. A column the index does not hold fails the search at its
    /// first hit with SQLite's 25 "column index out of range".
    void AddSnippet(char const* column, char const* before, char const* after, int words, char const* as);

    /// One snippet of the select list, as AddSnippet stored it.
    struct Snippet {
        std::string column;  ///< the indexed column
        std::string before;  ///< the text before each match
        std::string after;  ///< the text after each match
        int words = 0;  ///< the words shown, 1..64
        std::string as;  ///< the result column's name
    };

    /// Assigns the index's name; leaves the output untouched when unset.
    void GetIndex(std::string& name);

    /// Assigns the text ("" when never set).
    void GetText(std::string& text) { text = m_text; }

    /// The last SetPrefixLast, false before any.
    bool GetPrefixLast() const { return m_prefixLast; }

    /// Replaces out by the snippets in call order.
    void GetSnippets(std::vector<Snippet>& out);

private:
    DAOwnedString m_index;
    std::string m_text;
    bool m_prefixLast = false;
    std::vector<Snippet> m_snippets;
};

#endif  // DASEARCHREQUEST_H
