#include "DACursor.h"

#include <string>
#include <type_traits>
#include <vector>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"
#include "LogCapture.h"

namespace {

static_assert(!std::is_copy_constructible<DACursor>::value, "a cursor is not copied");
static_assert(!std::is_copy_assignable<DACursor>::value, "a cursor is not assigned");

// Loads the cursor the way the statement parser does: every name, then for
// each row one value per name, in name order.
void Load(DACursor& cursor, const std::vector<const char*>& names, const std::vector<std::vector<const char*>>& rows)
{
    for (const char* name : names) {
        cursor.SetColumn(name);
    }
    for (const auto& row : rows) {
        for (std::size_t i = 0; i < names.size(); ++i) {
            cursor.SetData(names[i], row[i]);
        }
    }
}

// Three rows of two columns, registered in the order b, a.
void LoadThreeRows(DACursor& cursor)
{
    Load(cursor, {"b", "a"}, {{"b0", "a0"}, {"b1", "a1"}, {"b2", "a2"}});
}

std::string Line(int priority, const char* function, const char* message)
{
    return std::to_string(priority) + " DACursor.cpp:" + function + " > " + message;
}

std::vector<std::string> Names(DACursor& cursor)
{
    std::vector<std::string> names{"stale"};
    cursor.GetColumn(names);
    return names;
}

}  // namespace

TEST(DACursorStorage, EmptyCursor)
{
    LogCapture log;
    DACursor cursor;
    std::vector<std::string> names{"kept"};
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ(1, cursor.GetColumn(names));
    EXPECT_EQ(std::vector<std::string>{"kept"}, names);
    EXPECT_EQ(-1, cursor.GetPosition());
    EXPECT_FALSE(cursor.IsValidPosition(0));
    EXPECT_EQ(1, cursor.MoveToPosition(0));
    EXPECT_EQ(3, cursor.MoveToNext());
    EXPECT_EQ(-2, cursor.GetPosition());
    cursor.MoveToFirst();
    EXPECT_EQ(2, cursor.MoveToPrev());
    EXPECT_EQ(0, cursor.GetPosition());
    cursor.MoveToLast();
    EXPECT_EQ(-1, cursor.GetPosition());
    EXPECT_EQ((std::vector<std::string>{Line(6, "MoveToPosition", "Invalid Position"),
                                        Line(4, "MoveToNext", "Last Row"), Line(4, "MoveToPrev", "First Row")}),
              Described(log));
}

TEST(DACursorStorage, ColumnsInRegistrationOrderUntilInitialize)
{
    DACursor cursor;
    LoadThreeRows(cursor);
    EXPECT_EQ(3, cursor.GetCount());
    EXPECT_EQ((std::vector<std::string>{"b", "a"}), Names(cursor));
    ASSERT_EQ(0, cursor.MoveToPosition(2));
    cursor.Initialize();
    std::vector<std::string> names{"kept"};
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ(1, cursor.GetColumn(names));
    EXPECT_EQ(-1, cursor.GetPosition());
}

// The count is the length of the second column in name order, or of the only
// column; the lists are filled by hand with unequal lengths to tell them apart.
TEST(DACursorStorage, CountTakesSecondColumnInNameOrder)
{
    struct Case {
        std::vector<std::pair<const char*, int>> columns;  // name, number of values
        int count;
    };
    const Case cases[] = {
        {{{"only", 4}}, 4},
        {{{"only", 0}}, 0},
        {{{"a", 1}, {"b", 3}}, 3},
        {{{"b", 3}, {"a", 1}}, 3},
        {{{"c", 3}, {"b", 2}, {"a", 1}}, 2},
        {{{"_ID", 5}, {"name", 2}}, 2},
        {{{"Name", 1}, {"name", 2}}, 2},  // letter case makes two columns
    };
    for (const Case& c : cases) {
        DACursor cursor;
        for (const auto& column : c.columns) {
            cursor.SetColumn(column.first);
            for (int i = 0; i < column.second; ++i) {
                cursor.SetData(column.first, "v");
            }
        }
        EXPECT_EQ(c.count, cursor.GetCount()) << "first column " << c.columns.front().first;
    }
}

TEST(DACursorStorage, NameRegisteredTwiceSortingSecondDoublesCount)
{
    LogCapture log;
    DACursor cursor;
    Load(cursor, {"a", "id", "z", "id"}, {{"a0", "1", "z0", "7"}, {"a1", "2", "z1", "8"}});
    EXPECT_EQ(4, cursor.GetCount());

    ASSERT_EQ(0, cursor.MoveToPosition(3));
    std::string value = "untouched";
    EXPECT_EQ(0, cursor.GetString("id", value));
    EXPECT_EQ("8", value);
    value = "untouched";
    EXPECT_EQ(1, cursor.GetString("a", value));
    EXPECT_EQ("untouched", value);
    EXPECT_EQ((std::vector<std::string>{Line(6, "GetString", "CURSOR RANGE ERROR!!!")}), Described(log));
}

TEST(DACursorStorage, RegisteringAgainKeepsValuesAndUnknownNamesStoreNothing)
{
    LogCapture log;
    DACursor cursor;
    Load(cursor, {"a", "b"}, {{"a0", "b0"}, {"a1", ""}});
    cursor.SetColumn("b");
    cursor.SetData("nobody", "x");
    EXPECT_EQ(2, cursor.GetCount());
    EXPECT_EQ((std::vector<std::string>{"a", "b", "b"}), Names(cursor));

    ASSERT_EQ(0, cursor.MoveToPosition(1));
    std::string value = "untouched";
    EXPECT_EQ(0, cursor.GetString("b", value));
    EXPECT_EQ("", value);  // an empty value is a value
    EXPECT_TRUE(log.Lines().empty());
}

TEST(DACursorNavigation, ForwardWalkStopsOnLastRow)
{
    LogCapture log;
    DACursor cursor;
    LoadThreeRows(cursor);
    for (int row = 0; row < 3; ++row) {
        EXPECT_EQ(0, cursor.MoveToNext());
        EXPECT_EQ(row, cursor.GetPosition());
    }
    EXPECT_TRUE(log.Lines().empty());
    EXPECT_EQ(3, cursor.MoveToNext());
    EXPECT_EQ(2, cursor.GetPosition());
    EXPECT_EQ(3, cursor.MoveToNext());
    EXPECT_EQ(2, cursor.GetPosition());
    EXPECT_EQ((std::vector<std::string>{Line(4, "MoveToNext", "Last Row"), Line(4, "MoveToNext", "Last Row")}),
              Described(log));
}

TEST(DACursorNavigation, BackwardWalkFromAfterTheLastRow)
{
    LogCapture log;
    DACursor cursor;
    LoadThreeRows(cursor);
    cursor.MoveToLast();
    EXPECT_EQ(3, cursor.GetPosition());
    std::string value = "untouched";
    EXPECT_EQ(1, cursor.GetString("a", value));
    EXPECT_EQ("untouched", value);
    EXPECT_EQ(0, cursor.MoveToPrev());
    EXPECT_EQ(2, cursor.GetPosition());
    EXPECT_EQ(0, cursor.MoveToPrev());
    EXPECT_EQ(0, cursor.MoveToPrev());
    EXPECT_EQ(0, cursor.GetPosition());
    EXPECT_EQ(2, cursor.MoveToPrev());
    EXPECT_EQ(0, cursor.GetPosition());

    cursor.MoveToFirst();
    EXPECT_EQ(-1, cursor.GetPosition());
    EXPECT_EQ(2, cursor.MoveToPrev());
    EXPECT_EQ(0, cursor.GetPosition());
    EXPECT_EQ((std::vector<std::string>{Line(6, "GetString", "CURSOR RANGE ERROR!!!"),
                                        Line(4, "MoveToPrev", "First Row"), Line(4, "MoveToPrev", "First Row")}),
              Described(log));

    cursor.MoveToLast();
    EXPECT_EQ(3, cursor.MoveToNext());  // already past the end
    EXPECT_EQ(2, cursor.GetPosition());
}

TEST(DACursorNavigation, MoveToPositionAcceptsOnlyRowsInsideTheCount)
{
    LogCapture log;
    DACursor cursor;
    LoadThreeRows(cursor);
    EXPECT_EQ(0, cursor.MoveToPosition(2));
    EXPECT_EQ(2, cursor.GetPosition());
    EXPECT_EQ(1, cursor.MoveToPosition(3));
    EXPECT_EQ(1, cursor.MoveToPosition(-1));
    EXPECT_EQ(2, cursor.GetPosition());
    EXPECT_EQ((std::vector<std::string>{Line(6, "MoveToPosition", "Invalid Position"),
                                        Line(6, "MoveToPosition", "Invalid Position")}),
              Described(log));
    EXPECT_FALSE(cursor.IsValidPosition(-1));
    EXPECT_TRUE(cursor.IsValidPosition(0));
    EXPECT_FALSE(cursor.IsValidPosition(3));
}

TEST(DACursorRead, NameIsCheckedBeforePosition)
{
    LogCapture log;
    DACursor cursor;
    LoadThreeRows(cursor);
    std::string text = "untouched";
    int number = 17;
    double real = 1.5;
    EXPECT_EQ(1, cursor.GetString("A", text));  // before the first row, wrong case
    EXPECT_EQ(1, cursor.GetInt("a", number));  // right after loading: out of range
    EXPECT_EQ(1, cursor.GetDouble("zz", real));
    EXPECT_EQ("untouched", text);
    EXPECT_EQ(17, number);
    EXPECT_EQ(1.5, real);
    EXPECT_EQ((std::vector<std::string>{Line(6, "GetString", "NO MATCHED ERROR!!!"),
                                        Line(6, "GetInt", "CURSOR RANGE ERROR!!!"),
                                        Line(6, "GetDouble", "NO MATCHED ERROR!!!")}),
              Described(log));
}

struct ConversionCase {
    const char* text;
    bool doubleOk;
    int asInt;
    double asDouble;
};

void PrintTo(const ConversionCase& c, std::ostream* os)
{
    *os << '"' << c.text << '"';
}

class DACursorConversion : public ::testing::TestWithParam<ConversionCase> {};

// Each value is read as int and as double from a one-row cursor; a failed read
// logs its conversion error and leaves the output as it was.
TEST_P(DACursorConversion, IntAndDouble)
{
    const ConversionCase& c = GetParam();
    DACursor cursor;
    Load(cursor, {"v"}, {{c.text}});
    ASSERT_EQ(0, cursor.MoveToNext());
    int number = -99;
    double real = -99.5;
    LogCapture log;

    const int intResult = cursor.GetInt("v", number);
    const int doubleResult = cursor.GetDouble("v", real);

    std::vector<std::string> expectedLog;
    if (c.asInt == -99) {
        EXPECT_EQ(1, intResult);
        expectedLog.push_back(Line(6, "GetInt", "CONVERT TO INT ERROR!!!"));
    } else {
        EXPECT_EQ(0, intResult);
    }
    EXPECT_EQ(c.asInt, number);
    if (c.doubleOk) {
        EXPECT_EQ(0, doubleResult);
    } else {
        EXPECT_EQ(1, doubleResult);
        expectedLog.push_back(Line(6, "GetDouble", "CONVERT TO DOUBLE ERROR!!!"));
    }
    EXPECT_DOUBLE_EQ(c.asDouble, real);
    EXPECT_EQ(expectedLog, Described(log));
}

// asInt -99 / asDouble -99.5 mean "read failed, output untouched".
INSTANTIATE_TEST_SUITE_P(Values, DACursorConversion,
                         ::testing::Values(ConversionCase{"42", true, 42, 42.0}, ConversionCase{" 42", true, 42, 42.0},
                                           ConversionCase{"42abc", true, 42, 42.0},
                                           ConversionCase{"-7", true, -7, -7.0}, ConversionCase{"3.9", true, 3, 3.9},
                                           ConversionCase{"3.5", true, 3, 3.5}, ConversionCase{"1e3", true, 1, 1000.0},
                                           ConversionCase{"2147483648", true, -99, 2147483648.0},
                                           ConversionCase{"abc", false, -99, -99.5},
                                           ConversionCase{"", false, -99, -99.5}));
