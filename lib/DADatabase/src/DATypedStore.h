#ifndef DATYPEDSTORE_H
#define DATYPEDSTORE_H

// The storage of typed rows, behind DATypedCursor (every row of a result)
// and QueryEach (one row at a time, viewed where SQLite keeps it): per value
// a type byte and 8 bytes (the integer, the double's bits, or for a text or
// blob its offset in the byte arena, where a 4-byte size precedes the
// bytes; in a viewed row its size, its bytes' address in viewed).

#include <cstdint>
#include <string>
#include <vector>

#include <sqlite3.h>

#include "DARow.h"

struct DATypedStore {
    DATypedStore() = default;
    ~DATypedStore() = default;
    // Neither copied nor moved: row points back at the store, which a
    // cursor holds by pointer.
    DATypedStore(const DATypedStore&) = delete;
    DATypedStore& operator=(const DATypedStore&) = delete;

    // Forgets the rows, keeping the buffers' capacity and the names (the
    // first row or TakeNames replaces them).
    void Clear();

    // Appends stmt's current row (taking its column names first, at the
    // first row). Returns SQLITE_ROW, or SQLITE_NOMEM when SQLite could not
    // give a text or blob.
    int Append(sqlite3_stmt* stmt);

    // Makes stmt's current row the only row, its texts and blobs read
    // where SQLite keeps them, so valid until stmt steps on. Returns as
    // Append.
    int View(sqlite3_stmt* stmt);

    // Gives back the buffers' unused capacity once it is worth a copy: a
    // cursor holds its result as long as the app keeps it.
    void Fit();

    // Makes names stmt's column names; names already equal to them stay,
    // so a cursor queried again with the same statement copies none.
    void TakeNames(sqlite3_stmt* stmt);

    std::vector<std::string> names;
    std::vector<unsigned char> types;  // DAValueType per value, row after row
    std::vector<std::uint64_t> values;
    std::vector<unsigned char> arena;
    std::vector<const unsigned char*> viewed;  // per value of a viewed row
    bool live = false;  // the row is viewed, not stored
    int rows = 0;
    int position = -1;
    DARow row{this};
};

#endif  // DATYPEDSTORE_H
