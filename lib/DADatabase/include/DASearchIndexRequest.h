#ifndef DASEARCHINDEXREQUEST_H
#define DASEARCHINDEXREQUEST_H

#include <string>
#include <vector>

#include "DABasePath.h"
#include "DAOwnedString.h"

/// How a search index splits text.
enum class DASearchTokens {
    /// Words (SQLite's unicode61 tokenizer, diacritics removed): "cafe",
    /// "café" and "CAFÉ" match each other; prefixes of 2 and 3 characters
    /// are indexed for searching as the user types.
    Words,
    /// Substrings (SQLite's trigram tokenizer, case-insensitive): any run of
    /// 3 characters or more, for text written without spaces between words.
    Substrings
};

/// A full-text search index over text columns of one table
/// (DADatabase::CreateSearchIndex), kept in step with the table by
/// triggers, whoever writes it.
///
/// What creating index NAME on table T adds to the file, all of it under
/// the reserved prefix "ulo_search_" (no application table may use it):
/// - the FTS5 table ulo_search_NAME holding a copy of the indexed columns
///   of every row under the row's rowid, and SQLite's own tables of it
///   (ulo_search_NAME_data, _idx, _content, _docsize, _config);
/// - the triggers ulo_search_NAME_insert, ulo_search_NAME_update and
///   ulo_search_NAME_delete on T.
/// DADatabase::DropSearchIndex removes all of it. T needs a rowid (a
/// WITHOUT ROWID table fails with SQLite's code and text). A name that
/// makes ulo_search_NAME one of another index's own tables ("x_data" while
/// index "x" is there) fails to be created or dropped with 1 and SQLite's
/// text; index "x" stays whole.
///
/// Every name is copied at the call and must be a plain name (letters,
/// digits, '_' and bytes from 0x80 up, not starting with a digit), since it
/// is written into SQL unquoted. Any other name, null included, is refused:
/// nothing is stored and the error line "INVALID NAME, NOT STORED" is
/// logged.
class DASearchIndexRequest : public DABasePath {
public:
    DASearchIndexRequest() = default;
    ~DASearchIndexRequest() override = default;

    ///@{
    /// Replaces the table whose rows are searched, or the index's own name,
    /// by a copy of the text.
    void SetTable(char const* table);
    void SetName(char const* name);
    ///@}

    /// Appends column as the next indexed column, under the member lock of
    /// the column list. A column given twice is listed twice (and SQLite
    /// refuses the index).
    void AddColumn(char const* column);

    /// Words (the default) or Substrings.
    void SetTokens(DASearchTokens tokens) { m_tokens = tokens; }

    ///@{
    /// Assigns the table, or the index's name; leaves the output untouched
    /// when unset.
    void GetTable(std::string& table);
    void GetName(std::string& name);
    ///@}

    /// Replaces columns by the indexed columns in call order; leaves it
    /// untouched when none is set. No lock.
    void GetColumns(std::vector<std::string>& columns);

    /// The last SetTokens, Words before any.
    DASearchTokens GetTokens() const { return m_tokens; }

private:
    DAOwnedString m_table;
    DAOwnedString m_name;
    std::vector<DAOwnedString> m_columns;
    DASearchTokens m_tokens = DASearchTokens::Words;
};

#endif  // DASEARCHINDEXREQUEST_H
