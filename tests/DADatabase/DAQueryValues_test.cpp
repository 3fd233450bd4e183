// Sorted and paged queries, 64-bit values and run-time column names.

#include <algorithm>
#include <cstdint>
#include <locale>
#include <thread>
#include <tuple>
#include <type_traits>

#include "DAColumnName.h"
#include "DADatabase.h"
#include "DASqlGenerator.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

class DAQueryFile : public TempDirTest {};

// Which overload a call SetData("c", T) picks, found by the compiler: each
// probe hides one overload behind a deleted twin, so a call that picked it
// no longer compiles; kNone: no call compiles (ambiguous).
enum Picked { kNone, kInt, kInt64, kDouble, kText, kWide };
template <typename Value>
struct No : DABaseSet {
    using DABaseSet::SetData;
    void SetData(char const*, Value) = delete;
};
template <typename Set, typename T>
std::true_type CanSet(decltype(std::declval<Set&>().SetData("c", std::declval<T>()))*);
template <typename Set, typename T>
std::false_type CanSet(...);
template <typename Set, typename T>
constexpr bool kCanSet = decltype(CanSet<Set, T>(nullptr))::value;
template <typename T>
constexpr Picked kPicked = !kCanSet<DABaseSet, T> ? kNone
    : !kCanSet<No<int>, T>                        ? kInt
    : !kCanSet<No<std::int64_t>, T>               ? kInt64
    : !kCanSet<No<double>, T>                     ? kDouble
    : !kCanSet<No<char const*>, T>                ? kText
                                                  : kWide;

// The overload table, on the host and on armhf alike (std::int64_t is long
// on x86_64 and long long on armhf): int, double, text and std::int64_t
// keep theirs, bool and the character types what promotion gives them, and
// every other integer type takes the exact-decimal setter.
constexpr bool kLongIs64 = std::is_same<long, std::int64_t>::value;
static_assert(kPicked<int> == kInt && kPicked<bool> == kInt && kPicked<char> == kInt, "int");
static_assert(kPicked<signed char> == kInt && kPicked<unsigned char> == kInt && kPicked<char16_t> == kInt, "chars");
static_assert(kPicked<wchar_t> == (std::is_signed<wchar_t>::value ? kInt : kNone) && kPicked<char32_t> == kNone, "");
static_assert(kPicked<std::int64_t> == kInt64 && kPicked<double> == kDouble && kPicked<float> == kDouble, "int64");
static_assert(kPicked<const char*> == kText && kPicked<char*> == kText, "text");
static_assert(kPicked<long> == (kLongIs64 ? kInt64 : kWide) && kPicked<long long> == (kLongIs64 ? kWide : kInt64), "");
static_assert(kPicked<short> == kWide && kPicked<unsigned short> == kWide && kPicked<unsigned> == kWide, "short");
static_assert(kPicked<unsigned long> == kWide && kPicked<unsigned long long> == kWide, "unsigned long");
static_assert(kPicked<std::size_t> == kWide && kPicked<std::uint32_t> == kWide && kPicked<std::uint64_t> == kWide &&
                  kPicked<std::int16_t> == kWide && kPicked<std::uint8_t> == kInt,
              "aliases");
// Both SetWhere forms and GetInt64 take the same integer types.
template <typename T>
constexpr bool kWhereTakes =
    std::is_same<void,
                 decltype(std::declval<DABaseSet&>().SetWhere("c", std::declval<T>()),
                          std::declval<DABaseSet&>().SetWhere("c", DACompare::Less, std::declval<T>()))>::value;
static_assert(kWhereTakes<short> && kWhereTakes<long> && kWhereTakes<long long> && kWhereTakes<std::uint64_t> &&
                  kWhereTakes<std::size_t> && kWhereTakes<std::uint32_t> && kWhereTakes<int> && kWhereTakes<double>,
              "SetWhere");
static_assert(std::is_same<int, decltype(std::declval<DACursor&>().GetInt64("c", std::declval<long long&>()))>::value,
              "GetInt64");

struct Grouping : std::numpunct<char> {
    char do_thousands_sep() const override { return ','; }
    std::string do_grouping() const override { return "\3"; }
};

// The text SetData stores for value.
template <typename T>
std::string Stored(T value)
{
    DABaseSet set;
    set.SetData("c", value);
    DAValueMap data;
    set.GetDataMap(data);
    return data.begin()->second;
}

// Under a locale that groups digits the int overload's stream groups them
// and the 64-bit overload never does: that tells which one ran. Every other
// integer type writes its exact decimal into both maps and into listed
// conditions.
TEST(DAInt64, EachArgumentTypeKeepsItsOverloadAndOthersAreExact)
{
    const std::locale old = std::locale::global(std::locale(std::locale::classic(), new Grouping));
    EXPECT_EQ("1,234,567", Stored(1234567));
    EXPECT_EQ("1234567", Stored(std::int64_t{1234567}));
    EXPECT_EQ("1.09951e+12", Stored(1099511627776.0));
    EXPECT_EQ("12,345", Stored("12,345"));
    EXPECT_EQ("18446744073709551615", Stored(UINT64_MAX));
    EXPECT_EQ("-9223372036854775808", Stored(static_cast<long long>(INT64_MIN)));
    EXPECT_EQ("-32768", Stored(short{-32768}));
    EXPECT_EQ("4294967295", Stored(std::uint32_t{4294967295U}));
    EXPECT_EQ("1234567", Stored(std::size_t{1234567}));
    DABaseSet set;
    set.SetWhere("c", std::uint16_t{65535});
    set.SetWhere("c", DACompare::Less, 1234567.5);
    std::locale::global(old);
    DAValueMap where;
    std::vector<DABaseSet::Condition> listed;
    set.GetWhereMap(where);
    set.GetConditions(listed);
    EXPECT_EQ("65535 1234567.5", where.begin()->second + " " + listed.at(0).values.at(0));
}

// Names for SQL are plain names: sort keys, select lists, groups and
// interned run-time names refuse anything else with one line each.
TEST(DAQueryRequest, NamesThatAreNotPlainAreRefused)
{
    DAQueryRequest request;
    LogCapture log;
    const auto line = [](const char* function, const char* what) {
        return Logged(6, *function == 'I' ? "DAColumnName.cpp" : "DAQueryRequest.cpp", function,
                      std::string("INVALID COLUMN NAME, ") + what);
    };
    Strings expected;
    for (const char* bad : {"n DESC", "1x", "a;--", "x'"}) {
        request.SetOrderBy(bad);
        request.AddColumn(bad);
        request.AddAggregate(DAAggregate::Max, bad, "m");
        request.AddAggregate(DAAggregate::Max, "ts", bad);
        request.AddGroupBy(bad);
        EXPECT_EQ(nullptr, DAColumnName::Intern(bad));
        expected.insert(expected.end(),
                        {line("SetOrderBy", "SORT KEY NOT STORED"), line("AddColumn", "COLUMN NOT STORED"),
                         line("AddAggregate", "COLUMN NOT STORED"), line("AddAggregate", "COLUMN NOT STORED"),
                         line("AddGroupBy", "GROUP NOT STORED"), line("Intern", "NOT INTERNED")});
    }
    request.SetOrderBy(nullptr);
    expected.push_back(Logged(6, "DAQueryRequest.cpp", "SetOrderBy", "NULL COLUMN NAME, SORT KEY NOT STORED"));
    request.AddAggregate(DAAggregate::Sum, nullptr, "s");  // only COUNT takes no column
    request.AddAggregate(DAAggregate::Count, nullptr, nullptr);
    request.AddAggregate(DAAggregate::Count, "ts", "t.x");  // an alias is not qualified
    expected.insert(expected.end(), 3, line("AddAggregate", "COLUMN NOT STORED"));
    EXPECT_EQ(expected, Described(log));
    EXPECT_STREQ("events.ts", DAColumnName::Intern("events.ts"));
}

// Both ends of the range, one past each, and 13-digit stamps written by
// the library (n is NULL, so first) and by SQLite.
TEST_F(DAQueryFile, GetInt64ReadsTheRangeAndStampsFromEitherWriter)
{
    RawDb(PathOf("q.db"))
        .Run("CREATE TABLE t(n INTEGER, v); INSERT INTO t VALUES (1, -9223372036854775808),"
             "(2, 9223372036854775807), (3, '-9223372036854775809'), (4, '9223372036854775808'),"
             "(5, 1700000000456)");
    DAUpsertRequest upsert;
    upsert.SetPath(Dir().c_str(), "q.db");
    upsert.SetTable("t");
    upsert.SetData("v", std::int64_t{1700000000123});
    ASSERT_EQ(0, DADatabase().Upsert(upsert));
    DAQueryRequest query;
    query.SetPath(Dir().c_str(), "q.db");
    query.SetTable("t");
    query.SetOrderBy("n");
    DACursor cursor;
    ASSERT_EQ(0, DADatabase().Query(query, cursor));
    const std::int64_t reads[] = {1700000000123, INT64_MIN, INT64_MAX, 0, 0, 1700000000456};  // 0: fails
    LogCapture log;
    for (const std::int64_t expected : reads) {
        ASSERT_EQ(0, cursor.MoveToNext());
        std::int64_t value = 42;
        EXPECT_EQ(expected == 0 ? 1 : 0, cursor.GetInt64("v", value));
        EXPECT_EQ(expected == 0 ? 42 : expected, value);
    }
    EXPECT_EQ(Strings(2, "6 DACursor.cpp:GetInt64 > CONVERT TO INT ERROR!!!"), Described(log));
}

// Threads intern the same run-time names at once, each in its own order
// (odd strides over 256): one pointer per text, holding the text.
TEST(DAColumnName, OnePointerPerTextFromManyThreadsNamesEachColumnOnce)
{
    std::vector<std::vector<const char*>> seen(8, std::vector<const char*>(256));
    std::vector<std::thread> threads;
    for (int t = 0; t < 8; ++t) {
        threads.emplace_back([t, &seen] {
            for (int i = 0; i < 256; ++i) {
                const int n = (i * (2 * t + 1)) % 256;
                seen[t][n] = DAColumnName::Intern(("col_" + std::to_string(n)).c_str());
            }
        });
    }
    std::for_each(threads.begin(), threads.end(), [](std::thread& thread) { thread.join(); });
    for (int n = 0; n < 256; ++n) {
        EXPECT_STREQ(("col_" + std::to_string(n)).c_str(), seen[0][n]);
        EXPECT_EQ(8, std::count_if(seen.begin(), seen.end(), [&](const auto& s) { return s[n] == seen[0][n]; }));
    }
    EXPECT_EQ(nullptr, DAColumnName::Intern(nullptr));
    EXPECT_STREQ("", DAColumnName::Intern(""));

    DABaseSet set;  // names rebuilt in every round: each column once, first value kept
    for (int i = 0; i < 9; ++i) {  // three rounds over three columns
        set.SetData(DAColumnName::Intern(("col_" + std::to_string(i % 3)).c_str()), i / 3);
    }
    DAValueMap data;
    set.GetDataMap(data);
    EXPECT_EQ((DAValueMap{{seen[0][0], "0"}, {seen[0][1], "0"}, {seen[0][2], "0"}}), data);
}

}  // namespace
