#ifndef DATYPEDCURSOR_H
#define DATYPEDCURSOR_H

#include <memory>

#include "DARow.h"

/// The whole result of a query, typed and compact: each value is kept with
/// its stored type (8 bytes and a type byte per value; texts and blobs in
/// one byte arena), beside DACursor, which keeps everything as text.
/// Filled by DADatabase::Query and DASession::Query; owned by the caller.
///
/// Not copyable; cheap to move (one pointer): the moved-to cursor has the
/// rows, position and row of the moved-from one, which is left empty
/// (count 0, no columns) until a Query fills it again.
///
/// Moving and reading take no lock: one thread at a time per cursor.
class DATypedCursor {
public:
    DATypedCursor();
    virtual ~DATypedCursor();
    DATypedCursor(const DATypedCursor&) = delete;
    DATypedCursor& operator=(const DATypedCursor&) = delete;
    ///@{
    /// Takes other's rows and position; other keeps no rows (count 0).
    DATypedCursor(DATypedCursor&& other) noexcept;
    DATypedCursor& operator=(DATypedCursor&& other) noexcept;
    ///@}

    /// The rows; 0 for an empty result (not -1).
    int GetCount() const;

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
    /// Moves to row and returns 0 when 0 <= row < GetCount(); otherwise
    /// error line "Invalid Position", position unchanged, 1.
    int MoveToPosition(int row);
    /// The current position (-1 after a Query).
    int GetPosition() const;

    /// The current row; it follows the position, and its reads fail with 1
    /// outside the rows. Valid as long as the cursor (or the cursor it is
    /// moved to).
    DARow const& GetRow() const;

private:
    friend struct DAOperations;
    std::unique_ptr<DATypedStore> m_store;
};

#endif  // DATYPEDCURSOR_H
