#ifndef DACURSOR_H
#define DACURSOR_H

#include <cstdint>
#include <map>
#include <string>
#include <type_traits>
#include <vector>

/// The whole result of a query, held as text column by column, with a
/// current-row position. Owned by the caller; filled by DADatabase::Select
/// and JoinSelect. Not copyable.
///
/// Row r is the r-th value of every column's list. The row count is the
/// length of the second column in name order (of the only column when there
/// is one), -1 when no column is registered.
///
/// Loading (constructor, Initialize, SetColumn, SetData) holds the cursor's
/// member lock, a DAMutex named after the address of its column map, so
/// several threads may fill one cursor. Reading and moving take no lock: do
/// not read a cursor while another thread fills it.
///
/// Result codes: 0 done; 1 failed (invalid position, unknown column, out of
/// range, not convertible, no column); 2 MoveToPrev went before the first
/// row; 3 MoveToNext went past the last row.
class DACursor {
public:
    DACursor();
    virtual ~DACursor() = default;

    DACursor(const DACursor&) = delete;
    DACursor& operator=(const DACursor&) = delete;

    /// Empties the cursor and sets the position to -1.
    void Initialize();

    /// Lists name (repeats included) and gives it an empty value list unless
    /// it already has one; an existing list keeps its values.
    void SetColumn(const char* column);

    /// Appends value to column's list. For a column never registered nothing
    /// is stored and nothing is logged: the parser only passes registered
    /// names, and a caller filling by hand can check GetColumn.
    void SetData(const char* column, const char* value);

    /// Replaces columns by the registered names in registration order and
    /// returns 0; returns 1 and leaves columns untouched when none.
    int GetColumn(std::vector<std::string>& columns);

    /// The row count (see above).
    int GetCount();

    /// Does nothing.
    void ShowDataLog();

    /// Position -1, before the first row.
    void MoveToFirst();
    /// Position GetCount(), after the last row.
    void MoveToLast();
    /// One row forward: 0; past the end: info line "Last Row", position
    /// count-1, 3.
    int MoveToNext();
    /// One row back: 0; before the start: info line "First Row", position 0,
    /// 2.
    int MoveToPrev();
    ///@{
    /// Moves to row and returns 0 when it is valid; otherwise error line
    /// "Invalid Position", position unchanged, 1.
    int MoveToPosition(int row);
    int GetPosition();
    ///@}
    /// 0 <= row < GetCount().
    bool IsValidPosition(int row);

    ///@{
    /// Read column's value in the current row. Checked in this order, each
    /// failing with an error line and 1, out untouched: unknown column
    /// ("NO MATCHED ERROR!!!"), invalid position or beyond the column's list
    /// ("CURSOR RANGE ERROR!!!"), and for GetInt/GetDouble a value that does
    /// not begin with a number of the type ("CONVERT TO INT ERROR!!!",
    /// "CONVERT TO DOUBLE ERROR!!!"). Numbers are read as an
    /// std::istringstream does: leading blanks skipped, trailing text
    /// ignored ("42abc" is 42, "3.9" as int is 3).
    int GetString(const char* column, std::string& value);
    int GetInt(const char* column, int& value);
    int GetDouble(const char* column, double& value);
    ///@}
    /// GetInt over the 64-bit range: the same checks, codes and lines in the
    /// same order (a value outside the range fails with "CONVERT TO INT
    /// ERROR!!!"), value untouched on failure. Reads back what
    /// DABaseSet::SetData(column, std::int64_t) stored.
    int GetInt64(const char* column, std::int64_t& value);
    /// GetInt64 into a long long where that is not std::int64_t (x86_64,
    /// whose std::int64_t is long): the same checks, codes and lines.
    template <typename LongLong,
              std::enable_if_t<std::is_same<LongLong, long long>::value && !std::is_same<LongLong, std::int64_t>::value,
                               int> = 0>
    int GetInt64(const char* column, LongLong& value)
    {
        std::int64_t read = 0;
        const int rc = GetInt64(column, read);
        if (rc == 0) {
            value = read;
        }
        return rc;
    }

private:
    /// The value of column in the current row, or null after logging the
    /// failure under func.
    const std::string* CurrentValue(const char* column, const char* func);

    std::map<std::string, std::vector<std::string>> m_columnValues;
    std::vector<std::string> m_columnNames;
    int m_position;
};

#endif  // DACURSOR_H
