#include <malloc.h>

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <limits>
#include <numeric>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DASession.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

using Bytes = std::vector<unsigned char>;

// Every case runs per call (false) and through a session (true).
class TypedValues : public TempDirTest, public ::testing::WithParamInterface<bool> {
protected:
    // Opens the session on Dir()'s t.db when the case runs through one.
    void Open()
    {
        DABasePath location;
        if (GetParam()) {
            ASSERT_EQ(0, m_session.Open(At(location, Dir())));
        }
    }

    DADatabase m_db;
    DASession m_session;
};
#define ON(operation, ...) (GetParam() ? m_session.operation(__VA_ARGS__) : m_db.operation(__VA_ARGS__))

// A value as every read sees it: its type, then each read's output or "-"
// for a failure (texts with "\0" for a zero byte, blobs in hex). By name
// for the numbers, by index for texts and blobs.
std::string Reads(DARow const& row, const char* column)
{
    static const char* const kTypes[] = {"Null", "Integer", "Real", "Text", "Blob"};
    std::int64_t integer = 0;
    double real = 0;
    std::string text = "untouched";
    Bytes blob{7};
    const int index = row.GetColumnIndex(column);
    std::string out = kTypes[static_cast<int>(row.GetType(column))];
    out += " i:" + (row.GetInt64(column, integer) == 0 ? std::to_string(integer) : "-");
    char number[32] = "-";
    if (row.GetDouble(column, real) == 0) {
        std::snprintf(number, sizeof number, "%.17g", real);
    }
    out += std::string(" d:") + number + " s:";
    for (const char c : row.GetString(index, text) == 0 ? text : "-") {
        out += c == '\0' ? std::string("\\0") : std::string(1, c);
    }
    out += " b:";
    if (row.GetBlob(index, blob) != 0) {
        return out + "-";
    }
    for (const unsigned char byte : blob) {
        out += "0123456789ABCDEF"[byte >> 4U];
        out += "0123456789ABCDEF"[byte & 0xFU];
    }
    return out;
}

// Every type through every writing request, read back exactly by both
// typed reads: integers at both ends of 64 bits, a real, "" beside NULL
// (an update clears a column), all 256 byte values, an empty blob and a
// 10 MB one.
TEST_P(TypedValues, EveryTypeThroughEveryWriteReadsBackExactly)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE v(id INTEGER PRIMARY KEY, lo INTEGER, hi INTEGER, r REAL, e TEXT, "
             "n TEXT, b BLOB, z BLOB)");
    Open();
    Bytes all(256);
    std::iota(all.begin(), all.end(), 0);
    Bytes big(10 << 20);
    for (std::size_t i = 0; i < big.size(); ++i) {
        big[i] = static_cast<unsigned char>(i * 7 + i / 251);
    }
    const auto fill = [&](auto& r, int id) -> auto&
    {
        r.SetData("id", id), r.SetData("lo", std::numeric_limits<std::int64_t>::min());
        r.SetData("hi", std::numeric_limits<std::int64_t>::max()), r.SetData("r", "0.1"), r.SetData("e", "");
        r.SetNull("n"), r.SetBlob("b", id == 3 ? big.data() : all.data(), id == 3 ? big.size() : all.size());
        r.SetBlob("z", nullptr, 0);
        return r;
    };
    DAUpsertRequest upsert;
    DAInsertRequest insert;
    DAInsertRequest third;
    DAUpdateRequest update;
    DAUpsertRequest batched;
    DAInsertRequest batchedInsert;
    DABatchRequest batch;
    std::int64_t rowId = 0;
    At(third, Dir(), "v").SetData("id", 3);
    third.SetData("n", "set");
    At(update, Dir(), "v").SetWhere("id", 3);
    At(batch, Dir());
    EXPECT_EQ(0, ON(Upsert, fill(At(upsert, Dir(), "v"), 1)));
    EXPECT_EQ(0, ON(Insert, fill(At(insert, Dir(), "v"), 2), rowId));
    EXPECT_EQ(0, ON(Insert, third, rowId) + ON(Update, fill(update, 3)));
    EXPECT_EQ(0, batch.Add(fill(At(batched, Dir(), "v"), 4)) + batch.Add(fill(At(batchedInsert, Dir(), "v"), 5)));
    EXPECT_EQ(0, ON(ExecuteBatch, batch));

    const auto check = [&](DARow const& row, std::string& ids) {
        std::string id;
        row.GetString("id", id);
        ids += id;
        EXPECT_EQ("Integer i:-9223372036854775808 d:-9.2233720368547758e+18 s:-9223372036854775808 b:-",
                  Reads(row, "lo"));
        EXPECT_EQ("Integer i:9223372036854775807 d:9.2233720368547758e+18 s:9223372036854775807 b:-", Reads(row, "hi"));
        EXPECT_EQ("Real i:- d:0.10000000000000001 s:0.1 b:-", Reads(row, "r"));
        EXPECT_EQ("Text i:- d:- s: b:", Reads(row, "e"));
        EXPECT_EQ("Null i:- d:- s:- b:-", Reads(row, "n"));
        EXPECT_EQ("Blob i:- d:- s:- b:", Reads(row, "z"));
        Bytes blob;
        EXPECT_EQ(0, row.GetBlob("b", blob));
        EXPECT_TRUE(blob == (id == "3" ? big : all)) << id;
    };
    DAQueryRequest query;
    At(query, Dir(), "v").SetOrderBy("id");
    DATypedCursor cursor;
    std::string ids;
    DAQueryRequest reversed;  // a result the cursor held before, its names too: replaced whole
    At(reversed, Dir(), "v").SetOrderBy("id", true);
    for (const char* column : {"z", "b", "n", "e", "r", "hi", "lo", "id"}) {
        reversed.AddColumn(column);
    }
    ASSERT_EQ(0, ON(Query, reversed, cursor));
    ASSERT_EQ(0, ON(Query, query, cursor));
    while (cursor.MoveToNext() == 0) {
        check(cursor.GetRow(), ids);
    }
    EXPECT_EQ(0, ON(QueryEach, query, [&](DARow const& row) { return check(row, ids), true; }));
    EXPECT_EQ("1234512345", ids);
}

// A file the sqlite3 program wrote: every read of every type, with the
// lines of the reads that fail (NULL fails without one).
TEST_P(TypedValues, ReadsAFileTheSqlite3ProgramWroteExactly)
{
    FILE* program = popen(("sqlite3 " + PathOf("t.db") + " 2>/dev/null").c_str(), "w");
    ASSERT_NE(nullptr, program);
    std::fputs("CREATE TABLE m(k INTEGER PRIMARY KEY, v); INSERT INTO m(v) VALUES (NULL), (42), "
               "(9223372036854775807), (-9223372036854775808), (0.30000000000000004), (2.0), (1e300), "
               "(CAST(X'610062' AS TEXT)), (X'00FF'), (''), ('h\xC3\xA9llo'), (X'');",
               program);
    if (pclose(program) != 0) {
        GTEST_SKIP() << "no sqlite3 program";
    }
    Open();
    const Strings expected = {
        "Null i:- d:- s:- b:-",
        "Integer i:42 d:42 s:42 b:-",
        "Integer i:9223372036854775807 d:9.2233720368547758e+18 s:9223372036854775807 b:-",
        "Integer i:-9223372036854775808 d:-9.2233720368547758e+18 s:-9223372036854775808 b:-",
        "Real i:- d:0.30000000000000004 s:0.3 b:-",
        "Real i:2 d:2 s:2.0 b:-",
        "Real i:- d:1.0000000000000001e+300 s:1.0e+300 b:-",
        "Text i:- d:- s:a\\0b b:610062",
        "Blob i:- d:- s:- b:00FF",
        "Text i:- d:- s: b:",
        "Text i:- d:- s:h\xC3\xA9llo b:68C3A96C6C6F",
        "Blob i:- d:- s:- b:",
    };
    DAQueryRequest query;
    At(query, Dir(), "m").SetOrderBy("k");
    DATypedCursor cursor;
    LogCapture log;
    ASSERT_EQ(0, ON(Query, query, cursor));
    Strings read;
    while (cursor.MoveToNext() == 0) {
        read.push_back(Reads(cursor.GetRow(), "v"));
    }
    EXPECT_EQ(expected, read);
    DARow const& row = cursor.GetRow();  // the last row, then none
    std::int64_t untouched = 5;
    EXPECT_EQ(2, row.GetInt64("nope", untouched) + row.GetInt64(2, untouched));
    EXPECT_EQ(DAValueType::Null, row.GetType("nope"));
    EXPECT_EQ(0, cursor.MoveToPosition(1) + cursor.MoveToPrev());  // moves as DACursor's do
    EXPECT_EQ(21, cursor.MoveToPrev() * 10 + cursor.MoveToPosition(12));
    EXPECT_EQ(0, cursor.GetPosition());
    cursor.MoveToFirst();
    EXPECT_EQ(1, row.GetInt64("k", untouched));
    EXPECT_EQ(5, untouched);
    const auto line = [](const char* function, const std::string& what) {
        return Logged(6, "DARow.cpp", function, what);
    };
    Strings lines;  // each failed read of a value that is not NULL: one line naming what is stored
    for (const std::string& reads : expected) {
        std::string stored = reads.substr(0, reads.find(' '));
        std::transform(stored.begin(), stored.end(), stored.begin(), ::toupper);
        for (const auto& [mark, function] :
             {std::pair{"i:- ", "GetInt64"}, {"d:- ", "GetDouble"}, {"s:- ", "GetString"}, {"b:-", "GetBlob"}}) {
            if (stored != "NULL" && reads.find(mark) != std::string::npos) {
                lines.push_back(line(function, "COLUMN v IS " + stored + ", NOT CONVERTED"));
            }
        }
    }
    lines.insert(lines.end(),
                 {Logged(4, "DATypedCursor.cpp", "MoveToNext", "Last Row"), line("GetInt64", "NO COLUMN nope"),
                  line("GetInt64", "NO COLUMN 2"), Logged(4, "DATypedCursor.cpp", "MoveToPrev", "First Row"),
                  Logged(6, "DATypedCursor.cpp", "MoveToPosition", "Invalid Position"),
                  line("GetInt64", "CURSOR RANGE ERROR!!!")});
    EXPECT_EQ(lines, Described(log));
}

// QueryEach ends when visit says so (0), lets an exception through with the
// connection given back, fails a 1 GiB value with SQLite's code, and over a
// damaged page returns 11 after visiting the rows before it, as many as a
// typed Query keeps (and a Select, which logs the step's failure and
// returns 0).
TEST_P(TypedValues, QueryEachStopsThrowsAndReturnsADamagedPage)
{
    RawDb(PathOf("t.db"))
        .Run("PRAGMA page_size = 4096; CREATE TABLE t(k INTEGER PRIMARY KEY, v TEXT); CREATE VIEW huge AS "
             "SELECT zeroblob(1 << 30) AS b; WITH RECURSIVE "
             "n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 200) INSERT INTO t "
             "SELECT i, printf('%0200d', i) FROM n;");
    Open();
    DAQueryRequest query;
    At(query, Dir(), "t").SetOrderBy("k");
    int visited = 0;
    EXPECT_EQ(0, ON(QueryEach, query, [&](DARow const&) { return ++visited < 3; }));
    EXPECT_EQ(3, visited);
    DADeleteRequest remove;
    At(remove, Dir(), "t").SetWhere("k", 200);
    EXPECT_EQ(0, ON(Delete, remove));
    const int descriptors = OpenDescriptorCount();
    EXPECT_THROW(ON(QueryEach, query, [](DARow const&) -> bool { throw std::runtime_error("stop"); }),
                 std::runtime_error);
    EXPECT_EQ(0, ON(Delete, remove));  // no read left holding the file or the session
    EXPECT_EQ(descriptors, OpenDescriptorCount());
    DAQueryRequest huge;  // a 1 GiB value: more than SQLite hands out, so its code (18), never a crash
    DATypedCursor cursor;
    EXPECT_EQ(18, ON(QueryEach, At(huge, Dir(), "huge"), [](DARow const&) { return true; }));
    EXPECT_EQ(18, ON(Query, huge, cursor));

    m_session.Close();
    DASession journal;  // the read holds the one connection: a write from visit is refused
    DABasePath location;
    journal.SetWal(false);
    ASSERT_EQ(0, journal.Open(At(location, Dir())));
    int nested = 0;
    EXPECT_EQ(0, journal.QueryEach(query, [&](DARow const&) { return (nested = journal.Delete(remove)), false; }));
    EXPECT_EQ(21, nested);
    journal.Close();
    std::fstream(PathOf("t.db"), std::ios::in | std::ios::out | std::ios::binary).seekp(4 * 4096)
        << std::string(4096, '\x7f');
    Open();
    visited = 0;
    LogCapture log;
    EXPECT_EQ(11, ON(QueryEach, query, [&](DARow const&) { return ++visited > 0; }));
    EXPECT_EQ(11, ON(Query, query, cursor));
    EXPECT_TRUE(visited > 0 && visited < 199) << visited;
    EXPECT_EQ(visited, cursor.GetCount());
    DASelectRequest select;  // keeps its rule: the step's failure is logged, not returned
    DACursor plain;
    EXPECT_EQ(0, ON(Select, At(select, Dir(), "t"), plain));
    EXPECT_EQ(visited, plain.GetCount());
    // The step's own line: SQLite's text on a statement a session kept, the
    // generic one per call.
    const std::string step = Logged(6, "DADatabasePasrser.cpp", "ParseDatabase",
                                    std::string("SQLITE STEP ERROR!!! ") +
                                        (GetParam() ? "database disk image is malformed" : "SQL logic error"));
    const std::string file = GetParam() ? "DASession.cpp" : "DADatabase.cpp";
    EXPECT_EQ((Strings{step, Logged(6, file, "QueryEach", "QUERY FAILED[11]: database disk image is malformed"), step,
                       Logged(6, file, "Query", "QUERY FAILED[11]: database disk image is malformed"), step}),
              Described(log));
}

// QueryEach holds one row at a time: the heap in use while it reads 200,000
// rows stays within 1 MiB of what it is at 1,000 (SQLite's page cache, which
// grows by about 2 MiB over that range, aside). A typed result is compact.
TEST_P(TypedValues, QueryEachMemoryDoesNotGrowWithTheRows)
{
    RawDb(PathOf("t.db"))
        .Run("CREATE TABLE m(id INTEGER PRIMARY KEY, conv INTEGER, sender TEXT, body TEXT, ts INTEGER, "
             "flags INTEGER); WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 200000) "
             "INSERT INTO m SELECT i, i % 50, 'user' || (i % 97), printf('%060d', i), 1700000000000 + i, i % 4 "
             "FROM n;");
    Open();
    // The heap in use less SQLite's own; blocks large enough to be mapped on their own count too.
    const auto heap = [] { return std::int64_t(mallinfo2().uordblks + mallinfo2().hblkhd) - sqlite3_memory_used(); };
    const auto peak = [&](int rows) {
        DAQueryRequest query;
        At(query, Dir(), "m").SetLimit(rows);
        std::int64_t most = 0;
        std::string body;
        EXPECT_EQ(0, ON(QueryEach, query, [&](DARow const& row) {
                      row.GetString(3, body);
                      most = std::max<std::int64_t>(most, heap());
                      return true;
                  }));
        return most;
    };
    const std::int64_t small = peak(1000);
    const std::int64_t large = peak(200000);
    EXPECT_LT(large - small, 1 << 20) << small << " " << large;
    // A typed result holds its values (9 bytes an integer), not the room it grew through.
    DAQueryRequest ids;
    At(ids, Dir(), "m").AddColumn("id");
    ids.SetLimit(65537);
    DATypedCursor cursor;
    const std::int64_t before = heap();
    ASSERT_EQ(0, ON(Query, ids, cursor));
    EXPECT_LT(heap() - before, 65537 * 9 + (64 << 10));
}

INSTANTIATE_TEST_SUITE_P(Sources, TypedValues, ::testing::Bool(),
                         [](const auto& info) { return std::string(info.param ? "session" : "per_call"); });

}  // namespace
