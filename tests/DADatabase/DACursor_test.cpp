#include "DACursor.h"

#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "DatabaseTestUtil.h"

namespace {

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

std::string Line(int priority, const char* function, const char* message)
{
    return Logged(priority, "DACursor.cpp", function, message);
}

const std::string kLastRow = Line(4, "MoveToNext", "Last Row");
const std::string kRange = Line(6, "GetString", "CURSOR RANGE ERROR!!!");

}  // namespace

// The count is the length of the second column in name order, or of the only
// column. A name registered again keeps its values and shows twice; a value
// for an unknown name is dropped.
TEST(DACursorStorage, CountTakesSecondColumnInNameOrder)
{
    const std::vector<std::pair<std::vector<const char*>, int>> cases = {
        {{"only", "only"}, 2}, {{"a", "b", "b", "b"}, 3}, {{"b", "b", "b", "a"}, 3}, {{"c", "b", "b", "a"}, 2}};
    for (const auto& c : cases) {
        DACursor cursor;
        for (const char* name : c.first) {
            cursor.SetColumn(name);
            cursor.SetData(name, "v");
        }
        EXPECT_EQ(c.second, cursor.GetCount()) << c.first.front();
    }
    LogCapture log;
    DACursor cursor;
    Load(cursor, {"a", "id", "z", "id"}, {{"a0", "1", "z0", "7"}, {"a1", "", "z1", "8"}});
    cursor.SetData("nobody", "x");
    EXPECT_EQ(4, cursor.GetCount());
    EXPECT_EQ((Strings{"1", "7", "", "8"}), ColumnValues(cursor, "id"));  // ends on row 3
    std::string value = "untouched";
    EXPECT_EQ(1, cursor.GetString("a", value));
    EXPECT_EQ("untouched", value);
    EXPECT_EQ((Strings{kLastRow, kRange}), Described(log));
}

// Leading blanks are skipped and trailing text ignored; a failed read logs
// its error and leaves the output as it was. The name is checked first.
TEST(DACursorRead, ConversionsAndFailedReads)
{
    LogCapture log;
    DACursor cursor;
    Load(cursor, {"v", "w"}, {{" 42.5abc", "abc"}});
    int number = -99;
    double real = -99.5;
    std::string text = "untouched";
    EXPECT_EQ(1, cursor.GetInt("v", number));  // before the first row
    EXPECT_EQ(1, cursor.GetString("V", text));
    ASSERT_EQ(0, cursor.MoveToNext());
    EXPECT_EQ(0, cursor.GetInt("v", number));
    EXPECT_EQ(0, cursor.GetDouble("v", real));
    EXPECT_EQ(42, number);
    EXPECT_EQ(42.5, real);
    EXPECT_EQ(1, cursor.GetInt("w", number));
    EXPECT_EQ(1, cursor.GetDouble("w", real));
    EXPECT_EQ(1, cursor.GetDouble("zz", real));
    EXPECT_EQ(42, number);
    EXPECT_EQ(42.5, real);
    EXPECT_EQ("untouched", text);
    EXPECT_EQ((Strings{Line(6, "GetInt", "CURSOR RANGE ERROR!!!"), Line(6, "GetString", "NO MATCHED ERROR!!!"),
                       Line(6, "GetInt", "CONVERT TO INT ERROR!!!"), Line(6, "GetDouble", "CONVERT TO DOUBLE ERROR!!!"),
                       Line(6, "GetDouble", "NO MATCHED ERROR!!!")}),
              Described(log));
}
