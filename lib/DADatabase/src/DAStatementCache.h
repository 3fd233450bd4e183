#ifndef DASTATEMENTCACHE_H
#define DASTATEMENTCACHE_H

// A held connection's prepared statements, kept by their shape: the
// generated text with every text literal replaced by a parameter. A
// statement of a known shape is then bound (its literals as text, which
// SQLite treats as it treats the literals) instead of parsed and planned
// again.

#include <cstddef>
#include <string>
#include <utility>
#include <vector>

#include <sqlite3.h>

#include "DASqliteHandles.h"

// A literal taken out of a text: a quoted text (quotes undoubled), an
// unquoted integer that fits 64 bits, a NULL or an X'..' blob (its bytes in
// text), each bound as such.
struct DALiteral {
    enum class Kind { Text, Integer, Null, Blob };
    std::string text;
    Kind kind = Kind::Text;
};

// Splits the NUL-terminated sql into shape (each literal replaced by ?) and
// values, for a single SELECT, INSERT, UPDATE or DELETE whose every quote
// opens a literal. NULL is taken out where a value stands (after "(", ","
// or "="; "IS NULL" stays), and so is X'..' with upper-case hex digits, as
// the generator writes them. Other numbers (reals, integers beyond 64 bits) stay in
// the shape, as SQLite's reading of them is not repeated here. Returns
// false, with shape and values unspecified, for any other text: another
// statement (schema statements take no parameters), an unterminated
// literal, a ';', a comment, a quoted name, a parameter of its own, a
// literal glued to a name (x'00' is a blob, taken
// out only as X'00'), more than 999 literals. Such
// texts run as they are.
bool DASplitLiterals(const char* sql, std::string& shape, std::vector<DALiteral>& values);

// Binds values to stmt's parameters 1..n, each as its kind (a text as
// text, as SQLite reads a text literal); the values must outlive the
// statement's use. Returns 0, or the first binding's failure.
int DABindLiterals(sqlite3_stmt* stmt, const std::vector<DALiteral>& values);

// Up to kCapacity statements of one connection by shape, the most recently
// used first. A statement taken out is the caller's until it is put back,
// so one connection never runs one statement twice at once. Destroy (or
// Clear) the cache before closing its connection.
class DAStatementCache {
public:
    static constexpr std::size_t kCapacity = 8;

    // The statement of shape, removed from the cache; null when none is
    // kept.
    sqlite3_stmt* Take(const std::string& shape);

    // Keeps stmt (reset, its bindings cleared) as shape's, finalizing the
    // least recently used one beyond the capacity. Never throws: when
    // memory runs out the statement is finalized instead.
    void Put(const std::string& shape, sqlite3_stmt* stmt) noexcept;

    void Clear() { m_entries.clear(); }

private:
    std::vector<std::pair<std::string, DAStatement>> m_entries;
};

#endif  // DASTATEMENTCACHE_H
