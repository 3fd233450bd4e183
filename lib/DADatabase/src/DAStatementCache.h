#ifndef DASTATEMENTCACHE_H
#define DASTATEMENTCACHE_H

// A held connection's prepared statements, kept by their shape: the
// generated text with every text literal replaced by a parameter. A
// statement of a known shape is then bound (its literals as text, which
// SQLite treats as it treats the literals) instead of parsed and planned
// again.

#include <cstddef>
#include <string>
#include <vector>

#include <sqlite3.h>

#include "DASqlStatement.h"
#include "DASqliteHandles.h"

// Splits the NUL-terminated sql into shape (each literal replaced by ?) and
// values, for a single SELECT, INSERT, UPDATE or DELETE whose every quote
// opens a literal. Taken out: a quoted text (quotes undoubled), an unquoted
// integer that fits 64 bits, NULL where a value stands (after "(", "," or
// "="; "IS NULL" stays), and X'..' with upper-case hex digits, as the
// generator writes them. Other numbers (reals, integers beyond 64 bits or
// with leading zeros) stay in the shape, as SQLite's reading of them is
// not repeated here.
// Returns false, with shape and values unspecified, for any other text:
// another statement (schema statements take no parameters), an
// unterminated literal, a ';', a comment, a quoted name, a parameter of
// its own, a literal glued to a name (x'00' is a blob, taken out only as
// X'00'), more than kDAMaxParams literals. Such texts run as they are.
bool DASplitLiterals(const char* sql, std::string& shape, DASqlParams& values);

// The split of a piece of a statement, appended to the shape and values
// of what stands before it (so that a NULL after "(" is known); the
// piece's first byte follows no name. False as DASplitLiterals.
bool DASplitAppend(const char* piece, std::string& shape, DASqlParams& values);

// The most literals a text is split into: SQLite's oldest parameter limit.
constexpr std::size_t kDAMaxParams = 999;

// Up to kCapacity statements of one connection by shape (the text each was
// prepared from, which SQLite keeps with it), the most recently used
// first. A statement taken out is the caller's until it is put back, so
// one connection never runs one statement twice at once. Destroy (or
// Clear) the cache before closing its connection.
class DAStatementCache {
public:
    static constexpr std::size_t kCapacity = 8;

    // The statement of shape, removed from the cache; null when none is
    // kept.
    sqlite3_stmt* Take(const char* shape);

    // Keeps stmt (prepared with sqlite3_prepare_v2; reset, its bindings
    // cleared) under its shape, finalizing the least recently used one
    // beyond the capacity. Never throws: when memory runs out the
    // statement is finalized instead.
    void Put(sqlite3_stmt* stmt) noexcept;

    void Clear() { m_entries.clear(); }

private:
    std::vector<DAStatement> m_entries;
};

#endif  // DASTATEMENTCACHE_H
