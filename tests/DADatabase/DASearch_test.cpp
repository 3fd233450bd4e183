#include <cstdint>
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include "DADatabase.h"
#include "DatabaseTestUtil.h"
#include "TempDirTest.h"

namespace {

const char* const kSeed =
    "CREATE TABLE messages(_ID INTEGER PRIMARY KEY, conversation INTEGER, ts INTEGER, body TEXT, key TEXT UNIQUE);"
    "INSERT INTO messages VALUES (1, 7, 1, 'Café au lait at 50% off', 'a'), (2, 7, 2, 'CAFÉ NOIR by e-mail', 'b'),"
    "(3, 8, 3, 'cafe \"quoted\" NEAR the station', 'c'), (4, 8, 4, '東京駅で会いましょう', 'd'),"
    "(5, 7, 5, '서울역에서 만나요', 'e'), (6, 8, 6, '我们在北京火车站见面', 'f');";

// t.db holds messages, with the index "words" (Words) and "subs"
// (Substrings) over its body.
class SearchTest : public TempDirTest {
protected:
    void SetUp() override
    {
        TempDirTest::SetUp();
        RawDb(PathOf("t.db")).Run(kSeed);
        for (const char* name : {"words", "subs"}) {
            DASearchIndexRequest index;
            At(index, Dir(), "messages").SetName(name);
            index.AddColumn("body");
            index.SetTokens(name[0] == 'w' ? DASearchTokens::Words : DASearchTokens::Substrings);
            ASSERT_EQ(0, m_db.CreateSearchIndex(index));
        }
        m_log.Clear();
    }

    // The code, then the ids of the rows found in id order: "0: 1 3".
    std::string Ids(const char* index, const std::string& text, bool prefix = false)
    {
        DASearchRequest search;
        At(search, Dir(), "messages").SetIndex(index);
        search.SetText(text.c_str());
        search.SetPrefixLast(prefix);
        search.AddColumn("_ID");
        search.SetOrderBy("_ID");
        DACursor cursor;
        const int rc = m_db.Search(search, cursor);
        std::string out = std::to_string(rc) + ":";
        for (const std::string& id : rc == 0 ? ColumnValues(cursor, "_ID") : Strings()) {
            out += " " + id;
        }
        return out;
    }

    DADatabase m_db;
    LogCapture m_log;
};

struct FindCase {
    const char* index;
    std::string text;
    bool prefix;
    const char* expected;
};

// Folded words, prefixes while typing, substrings of text without spaces,
// and hostile texts: every one is a search that runs (0), never syntax.
const FindCase kFinds[] = {
    {"words", "café", false, "0: 1 2 3"},
    {"words", "CAFE", false, "0: 1 2 3"},
    {"words", "noir cafe", false, "0: 2"},
    {"words", "caf", false, "0:"},
    {"words", "caf", true, "0: 1 2 3"},
    {"words", "cafe n", true, "0: 2 3"},
    {"words", "e-mail", false, "0: 2"},
    {"words", "50%", false, "0: 1"},
    {"subs", "東京駅", false, "0: 4"},
    {"subs", "서울역", false, "0: 5"},
    {"subs", "北京火车", false, "0: 6"},
    {"subs", "北京", false, "0:"},
    {"subs", "CAFÉ", false, "0: 1 2"},
    {"subs", "会いま　東京駅", false, "0: 4"},
    {"subs", "会い 東京駅", false, "0:"},
    {"subs", " 駅で会い ", true, "0: 4"},
    {"words", "", false, "0:"},
    {"words", " \t\n", true, "0:"},
    {"words", "\"", false, "0:"},
    {"words", "\"cafe", true, "0: 1 2 3"},
    {"words", "cafe\" OR \"noir", false, "0:"},
    {"words", "NEAR(cafe noir)", false, "0:"},
    {"words", "cafe AND noir", false, "0:"},
    {"words", "NOT OR AND", false, "0:"},
    {"words", "-cafe * : ( ) ^ + {body}:x", false, "0:"},
    {"words", "'; DROP TABLE messages; --", false, "0:"},
    {"words", "\xff\xfe\x80 cafe", false, "0: 1 2 3"},
    {"subs", "\"\"\"", false, "0:"},
    {"words", std::string("cafe\0noir", 9), false, "0: 1 2 3"},
    {"words", std::string(1 << 20, 'a'), true, "0:"},
};

TEST_F(SearchTest, AnyTextIsASearch)
{
    for (const FindCase& c : kFinds) {
        EXPECT_EQ(c.expected, Ids(c.index, c.text, c.prefix)) << c.index << " " << c.text.substr(0, 40);
    }
    std::string words;  // 10,000 words, quotes among them
    for (int i = 0; i < 10000; ++i) {
        words += "cafe" + std::to_string(i) + (i % 7 == 0 ? "\" " : " ");
    }
    EXPECT_EQ("0:", Ids("words", words, true));
    EXPECT_EQ("0: 1 2 3", Ids("words", std::string(1 << 20, ' ') + "cafe"));
}

// Written by another process, with or without recursive triggers (without
// them a replaced row leaves without its delete trigger): replaced by
// rowid and by another key, that rowid then reused, updated, deleted. Old
// words never find a row; new ones do at once.
class SearchWriter : public SearchTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(SearchWriter, OldWordsFindNothing)
{
    const std::string sql = std::string("PRAGMA recursive_triggers=") + GetParam() +
        "; INSERT OR REPLACE INTO messages(_ID, body, key) VALUES (1, 'thé vert', 'a');"
        "INSERT OR REPLACE INTO messages(body, key) VALUES ('chocolat chaud', 'b');"
        "INSERT INTO messages(_ID, body) VALUES (2, 'lait frais'); UPDATE messages SET body='bière' WHERE _ID=3;"
        "DELETE FROM messages WHERE _ID=4;";
    if (std::system("command -v sqlite3 >/dev/null") != 0) {
        GTEST_SKIP() << "no sqlite3 program";
    }
    ASSERT_EQ(0, std::system(("sqlite3 " + PathOf("t.db") + " \"" + sql + "\"").c_str()));
    const std::string found = Ids("words", "cafe") + Ids("words", "noir") + Ids("words", "station") +
        Ids("subs", "東京駅") + Ids("words", "THE") + Ids("words", "lait") + Ids("subs", "bière") +
        Ids("words", "choc", true);
    EXPECT_EQ("0:0:0:0:0: 10: 20: 30: 7", found);
}

INSTANTIATE_TEST_SUITE_P(Recursive, SearchWriter, ::testing::Values("0", "1"),
                         [](const auto& info) { return std::string("recursive_triggers_") + info.param; });

// Best first, with snippets; conditions on the table's columns narrow,
// sort keys replace the rank, the page applies.
TEST_F(SearchTest, RanksSnipsNarrowsAndPages)
{
    DASearchRequest search;
    At(search, Dir(), "messages").SetIndex("words");
    search.SetText("cafe");
    search.AddSnippet("body", "[", "]", 3, "excerpt");
    search.SetWhere("conversation", 7);
    DACursor cursor;
    EXPECT_EQ(0, m_db.Search(search, cursor));
    EXPECT_EQ(
        (Strings{"_ID", "conversation", "ts", "body", "key", "excerpt", "2", "1", "7", "7", "2", "1",
                 "CAFÉ NOIR by e-mail", "Café au lait at 50% off", "b", "a", "[CAFÉ] NOIR by…", "[Café] au lait…"}),
        Dump(cursor));
    search.SetIndex("subs");
    search.SetText("caf");
    search.SetOrderBy("ts", true);
    search.SetLimit(1, 1);
    EXPECT_EQ(0, m_db.Search(search, cursor));
    EXPECT_EQ("1", ColumnValues(cursor, "_ID").at(0));
    DATypedCursor typed;  // the same rows, typed
    std::string excerpt;
    std::int64_t id = 0;
    EXPECT_EQ(0,
              m_db.Search(search, typed) + typed.MoveToNext() + typed.GetRow().GetInt64("_ID", id) +
                  typed.GetRow().GetString("excerpt", excerpt));
    EXPECT_EQ(1, typed.GetCount() * id);
    EXPECT_EQ("[Caf]é …", excerpt);  // a trigram is a token
}

}  // namespace
