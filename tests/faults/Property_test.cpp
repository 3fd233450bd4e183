// Seeded generated inputs: texts that round-trip through every statement,
// and move sequences checked against a model of the cursor.
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "FaultTestUtil.h"
#include "LogCapture.h"
#include "TempDirTest.h"

namespace {

// Quotes, format and comment characters, UTF-8, control bytes (no NUL),
// SQL; sometimes empty, sometimes long.
std::string RandomText(std::mt19937& random)
{
    static const std::vector<std::string> pieces{"'",    "''",     "\"", "%",     "%s%n", ";--",          "/*", "\\",
                                                 "é",    "日本語", "😀",  "\x01",  "\t",   "\n",           "\r", "\x1f",
                                                 "\x7f", " ",      "a",  " AND ", ", ",   "DROP TABLE t;"};
    const auto pick = [&](std::size_t n) { return std::uniform_int_distribution<std::size_t>(0, n - 1)(random); };
    std::string text;
    const std::size_t length = pick(10) == 0 ? 3000 : pick(12);
    while (text.size() < length) {
        text += pieces[pick(pieces.size())];
    }
    return text;
}

using Property = TempDirTest;

TEST_F(Property, RandomTextsRoundTripAsValuesAndConditions)
{
    std::mt19937 random(1);
    RawDb(PathOf("t.db")).Run("CREATE TABLE t(k TEXT PRIMARY KEY, v TEXT)");
    DADatabase db;
    for (int i = 0; i < 60; ++i) {
        const std::string key = RandomText(random);
        const std::string first = RandomText(random);
        const std::string second = RandomText(random);
        SCOPED_TRACE("texts [" + key + "] [" + first + "] [" + second + "]");
        // The rows a select on the key (and value, if given) finds, as "k=v".
        const auto rows = [&](const std::string* value) {
            DASelectRequest select;
            select.SetPath(Dir().c_str(), "t.db");
            select.SetTable("t");
            select.SetWhere("k", key.c_str());
            if (value != nullptr) {
                select.SetWhere("v", value->c_str());
            }
            DACursor cursor;
            EXPECT_EQ(0, db.Select(select, cursor));
            const Strings keys = ColumnValues(cursor, "k");
            const Strings values = ColumnValues(cursor, "v");
            return keys.empty() ? std::string() : keys.at(0) + "=" + values.at(0) + "#" + std::to_string(keys.size());
        };
        DAUpsertRequest upsert;
        upsert.SetPath(Dir().c_str(), "t.db");
        upsert.SetTable("t");
        upsert.SetData("k", key.c_str());
        upsert.SetData("v", first.c_str());
        ASSERT_EQ(0, db.Upsert(upsert));
        EXPECT_EQ(key + "=" + first + "#1", rows(&first));
        DAUpdateRequest update;
        update.SetPath(Dir().c_str(), "t.db");
        update.SetTable("t");
        update.SetData("v", second.c_str());
        update.SetWhere("k", key.c_str());
        update.SetWhere("v", first.c_str());
        ASSERT_EQ(0, db.Update(update));
        EXPECT_EQ(key + "=" + second + "#1", rows(&second));
        DADeleteRequest remove;
        remove.SetPath(Dir().c_str(), "t.db");
        remove.SetTable("t");
        remove.SetWhere("k", key.c_str());
        remove.SetWhere("v", second.c_str());
        ASSERT_EQ(0, db.Delete(remove));
        EXPECT_EQ("", rows(nullptr));
        EXPECT_EQ("0", RawDb(PathOf("t.db")).Query("SELECT count(*) FROM t"));
    }
}

TEST(CursorProperty, RandomMovesAgreeWithTheModel)
{
    std::mt19937 random(2);
    const LogCapture log;
    std::size_t failures = 0;
    for (int round = 0; round < 100; ++round) {
        const int rows = std::uniform_int_distribution<int>(0, 4)(random);
        DACursor cursor;
        if (rows > 0) {
            cursor.SetColumn("a");
            cursor.SetColumn("b");
        }
        for (int r = 0; r < rows; ++r) {
            cursor.SetData("a", std::to_string(r).c_str());
            cursor.SetData("b", std::to_string(r).c_str());
        }
        // The model: count -1 without columns; every code but 0 logs one line.
        const int count = rows == 0 ? -1 : rows;
        int position = -1;
        for (int step = 0; step < 60; ++step) {
            const int move = std::uniform_int_distribution<int>(0, 5)(random);
            const int row = std::uniform_int_distribution<int>(-2, 5)(random);
            int expected = 0;
            int got = 0;
            if (move == 0) {
                expected = ++position < count ? 0 : (position = count - 1, 3);
                got = cursor.MoveToNext();
            } else if (move == 1) {
                expected = --position >= 0 ? 0 : (position = 0, 2);
                got = cursor.MoveToPrev();
            } else if (move == 2) {
                expected = row >= 0 && row < count ? (position = row, 0) : 1;
                got = cursor.MoveToPosition(row);
            } else if (move == 3 || move == 4) {
                position = move == 3 ? -1 : count;
                move == 3 ? cursor.MoveToFirst() : cursor.MoveToLast();
            } else {
                std::string value = "untouched";
                const bool valid = position >= 0 && position < count;
                expected = valid ? 0 : 1;
                got = cursor.GetString("b", value);
                EXPECT_EQ(valid ? std::to_string(position) : "untouched", value);
            }
            ASSERT_EQ(expected, got) << "round " << round << " step " << step << " move " << move;
            ASSERT_EQ(position, cursor.GetPosition()) << "round " << round << " step " << step;
            failures += expected != 0 ? 1 : 0;
        }
    }
    EXPECT_EQ(failures, log.Lines().size());
}

}  // namespace
