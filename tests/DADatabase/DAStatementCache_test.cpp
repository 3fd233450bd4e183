#include "DAStatementCache.h"

#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

// A generated text, its shape and its literals, integers marked "#", NULL
// as "null", blobs "x" (an empty shape: the text is not split).
struct SplitCase {
    const char* sql;
    const char* shape;
    std::vector<std::string> values;
};

const SplitCase kSplits[] = {
    {"SELECT * FROM t WHERE a='1' AND b='x''y'", "SELECT * FROM t WHERE a=? AND b=?", {"1", "x'y"}},
    {"INSERT OR REPLACE INTO t (a, b) VALUES ('', '%n;--')",
     "INSERT OR REPLACE INTO t (a, b) VALUES (?, ?)",
     {"", "%n;--"}},
    {"UPDATE t SET v = '''' WHERE k IN ('a', 'b') AND ts<17",
     "UPDATE t SET v = ? WHERE k IN (?, ?) AND ts<?",
     {"'", "a", "b", "#17"}},
    {"SELECT c0 FROM t WHERE r>=2.5 AND e<1e+100 AND u<18446744073709551615 AND z=007 LIMIT -1 OFFSET 20",
     "SELECT c0 FROM t WHERE r>=2.5 AND e<1e+100 AND u<18446744073709551615 AND z=007 LIMIT -? OFFSET ?",
     {"#1", "#20"}},
    {"DELETE  FROM t", "DELETE  FROM t", {}},
    {"INSERT INTO t (a, p, e, f) VALUES ('NULL', X'00FF', NULL, X'')",
     "INSERT INTO t (a, p, e, f) VALUES (?, ?, ?, ?)",
     {"NULL", std::string("x\0\xFF", 3), "null", "x"}},
    {"UPDATE t SET e = NULL, f = NULLS WHERE g IS NULL AND h=NULL",
     "UPDATE t SET e = ?, f = NULLS WHERE g IS NULL AND h=?",
     {"null", "null"}},
    {"SELECT * FROM t WHERE a=X'0'", "", {}},
    {"SELECT * FROM t WHERE a=X'0a'", "", {}},
    {"SELECT * FROM t WHERE a=X'00'b", "", {}},
    {"CREATE INDEX IF NOT EXISTS i ON t (a)", "", {}},
    {"ALTER TABLE t ADD COLUMN c TEXT DEFAULT '0'", "", {}},
    {"SELECT * FROM t WHERE a='1'; DROP TABLE t", "", {}},
    {"SELECT * FROM t WHERE a=x'00'", "", {}},
    {"SELECT * FROM t WHERE a=0x1F", "", {}},
    {"SELECT * FROM \"t\" WHERE a='1'", "", {}},
    {"SELECT * FROM t WHERE a='open", "", {}},
    {"SELECT * FROM t WHERE a=? -- note", "", {}},
    {"SELECT * FROM t /* note */", "", {}},
};

TEST(DASplitLiterals, TakesOutTheLiteralsOfPlainDmlOnly)
{
    const char* const kMarks[] = {"", "#", "null", "x"};
    std::string shape;
    DASqlParams values;  // reused, as a session reuses its own
    for (const SplitCase& c : kSplits) {
        const bool split = DASplitLiterals(c.sql, shape, values);
        EXPECT_EQ(*c.shape != '\0', split) << c.sql;
        if (split) {
            std::vector<std::string> texts;
            values.View().ForEach([&](DAParamKind kind, const char* bytes, std::size_t size) {
                std::int64_t integer = 0;
                std::memcpy(&integer, bytes, sizeof integer);
                texts.push_back(kMarks[static_cast<int>(kind)] +
                                (kind == DAParamKind::Integer ? std::to_string(integer) : std::string(bytes, size)));
            });
            EXPECT_EQ(c.shape, shape);
            EXPECT_EQ(c.values, texts);
        }
    }
    std::string in = "SELECT * FROM t WHERE k IN ('0'";
    for (int i = 1; i < 999; ++i) {
        in += ", '" + std::to_string(i) + "'";
    }
    EXPECT_TRUE(DASplitLiterals((in + ")").c_str(), shape, values));
    EXPECT_FALSE(DASplitLiterals((in + ", '999')").c_str(), shape, values)) << "more literals than parameters";
}

// Kept statements stay within the capacity: the least recently used one is
// finalized, the others are taken back by shape.
TEST(DAStatementCache, KeepsTheMostRecentlyUsedWithinItsCapacity)
{
    sqlite3* db = nullptr;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db));
    {
        DAStatementCache cache;
        for (std::size_t i = 0; i <= DAStatementCache::kCapacity; ++i) {
            const std::string shape = "SELECT " + std::to_string(i);
            sqlite3_stmt* stmt = nullptr;
            ASSERT_EQ(SQLITE_OK, sqlite3_prepare_v2(db, shape.c_str(), -1, &stmt, nullptr));
            cache.Put(stmt);
        }
        int open = 0;
        for (sqlite3_stmt* stmt = sqlite3_next_stmt(db, nullptr); stmt != nullptr; stmt = sqlite3_next_stmt(db, stmt)) {
            ++open;
        }
        EXPECT_EQ(static_cast<int>(DAStatementCache::kCapacity), open);
        EXPECT_EQ(nullptr, cache.Take("SELECT 0"));
        sqlite3_finalize(cache.Take("SELECT 1"));
    }
    EXPECT_EQ(SQLITE_OK, sqlite3_close(db));
}

}  // namespace
