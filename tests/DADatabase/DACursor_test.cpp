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
const std::string kFirstRow = Line(4, "MoveToPrev", "First Row");
const std::string kInvalid = Line(6, "MoveToPosition", "Invalid Position");
const std::string kRange = Line(6, "GetString", "CURSOR RANGE ERROR!!!");

// One move and what it must give: its result (kVoid for MoveToFirst and
// MoveToLast, which return nothing) and the position afterwards.
enum Move { kNext, kPrev, kFirst, kLast, kTo };
constexpr int kVoid = -100;
struct Step {
    Move move;
    int rc;
    int position;
    int row = 0;  // for kTo
};

void Walk(DACursor& cursor, const std::vector<Step>& steps)
{
    const std::function<int(DACursor&, int)> moves[] = {
        [](DACursor& c, int) { return c.MoveToNext(); },
        [](DACursor& c, int) { return c.MoveToPrev(); },
        [](DACursor& c, int) { return c.MoveToFirst(), kVoid; },
        [](DACursor& c, int) { return c.MoveToLast(), kVoid; },
        [](DACursor& c, int row) { return c.MoveToPosition(row); },
    };
    for (std::size_t i = 0; i < steps.size(); ++i) {
        EXPECT_EQ(steps[i].rc, moves[steps[i].move](cursor, steps[i].row)) << "step " << i;
        EXPECT_EQ(steps[i].position, cursor.GetPosition()) << "step " << i;
    }
}

}  // namespace

TEST(DACursorNavigation, ThreeRowsThenInitialize)
{
    LogCapture log;
    DACursor cursor;
    Load(cursor, {"b", "a"}, {{"b0", "a0"}, {"b1", "a1"}, {"b2", "a2"}});
    Strings names;
    EXPECT_EQ(0, cursor.GetColumn(names));
    EXPECT_EQ((Strings{"b", "a"}), names);  // registration order
    EXPECT_EQ(3, cursor.GetCount());
    Walk(cursor, {{kNext, 0, 0}, {kNext, 0, 1}, {kNext, 0, 2}, {kNext, 3, 2}, {kNext, 3, 2}, {kLast, kVoid, 3}});
    std::string value = "untouched";
    EXPECT_EQ(1, cursor.GetString("a", value));  // after the last row
    EXPECT_EQ("untouched", value);
    Walk(cursor, {{kPrev, 0, 2}, {kPrev, 0, 1}, {kPrev, 0, 0}, {kPrev, 2, 0}, {kFirst, kVoid, -1}, {kPrev, 2, 0}});
    Walk(cursor, {{kLast, kVoid, 3}, {kNext, 3, 2}, {kTo, 0, 1, 1}, {kTo, 1, 1, 3}, {kTo, 1, 1, -1}, {kTo, 0, 2, 2}});
    EXPECT_EQ((Strings{kLastRow, kLastRow, kRange, kFirstRow, kFirstRow, kLastRow, kInvalid, kInvalid}),
              Described(log));
    cursor.Initialize();
    EXPECT_EQ(-1, cursor.GetCount());
    EXPECT_EQ(1, cursor.GetColumn(names));
    EXPECT_EQ(-1, cursor.GetPosition());
}

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
