#ifndef DAROW_H
#define DAROW_H

#include <cstdint>
#include <string>
#include <vector>

#include "DAValue.h"  // DAValueType: the type a value of a result has, as SQLite stored it

struct DATypedStore;

/// One row of a typed result (DATypedCursor::GetRow, or the row a
/// DADatabase/DASession QueryEach visits), its values with their stored
/// type and bytes. Valid while the cursor or the call that gave it lasts;
/// a cursor's row follows the cursor's position. Not copyable, not
/// movable: it is only ever handed out by reference.
///
/// Every read returns 0 and sets its output, or returns 1 with the output
/// untouched:
/// - a NULL value: 1 and no line (NULL is a value: IsNull tells it apart);
/// - no current row (a cursor outside its rows): the error line "CURSOR
///   RANGE ERROR!!!";
/// - an absent column: the error line "NO COLUMN name" (by index: the
///   index);
/// - a stored type the read does not convert: the error line "COLUMN name IS
///   BLOB, NOT CONVERTED" (INTEGER, REAL, TEXT or BLOB).
///
/// What converts: GetInt64 reads Integer, and Real with an exact 64-bit
/// integer value; GetDouble Integer and Real; GetString Text, Integer and
/// Real (the text SQLite gives the number: "42", "0.1", "2.0",
/// "1.0e+300"); GetBlob Blob and Text (its bytes). Texts and blobs keep
/// every byte, zero bytes included. Reads take no lock.
class DARow {
public:
    virtual ~DARow() = default;
    DARow(const DARow&) = delete;
    DARow& operator=(const DARow&) = delete;

    /// The result's columns (0 when it had no row).
    int GetColumnCount() const;
    /// The name of the column at index, as SQLite names it; null when
    /// there is no such column.
    char const* GetColumnName(int index) const;
    /// The index of the first column named column; -1 when absent.
    int GetColumnIndex(char const* column) const;

    ///@{
    /// The stored type of the value; Null also for an absent column or no
    /// current row (no line).
    DAValueType GetType(char const* column) const;
    DAValueType GetType(int index) const;
    ///@}
    ///@{
    /// Whether the value is NULL (false for an absent column, no line).
    bool IsNull(char const* column) const;
    bool IsNull(int index) const;
    ///@}

    ///@{
    /// The reads, by name or by index (see above).
    int GetInt64(char const* column, std::int64_t& value) const;
    int GetInt64(int index, std::int64_t& value) const;
    int GetDouble(char const* column, double& value) const;
    int GetDouble(int index, double& value) const;
    int GetString(char const* column, std::string& value) const;
    int GetString(int index, std::string& value) const;
    int GetBlob(char const* column, std::vector<unsigned char>& value) const;
    int GetBlob(int index, std::vector<unsigned char>& value) const;
    ///@}

private:
    friend struct DATypedStore;
    friend class DATypedCursor;
    explicit DARow(const DATypedStore* store) noexcept : m_store(store) {}

    // The cell of index in the current row, or -1 after logging why there
    // is none (column names the column in the line, or is null).
    long Cell(int index, char const* column, const char* func) const;

    template <typename Out, typename Convert>
    int Read(int index, char const* column, Out& value, const char* func, Convert convert) const;

    const DATypedStore* m_store;
};

#endif  // DAROW_H
