#include "tools/Table.h"

#include <gtest/gtest.h>

#include <clocale>
#include <tuple>

using tool::Table;
typedef Table::Kind Kind;

TEST(Table, AlignsItsColumnsAndPutsNoBlanksAfterTheLast)
{
    const std::vector<Table::Column> COLUMNS = {
        {"A", Kind::Short}, {"NUMBER", Kind::Right}, {"Z", Kind::Long}};
    Table titled(COLUMNS, true);
    Table bare(COLUMNS, false);
    EXPECT_EQ("", titled.text(SIZE_MAX, false));
    for (Table* pTable : {&titled, &bare}) {
        pTable->add({"", "1", "z"});
        pTable->add({"", "22", ""});
    }
    EXPECT_EQ("A  NUMBER  Z\n"
              "        1  z\n"
              "       22  \n",
              titled.text(SIZE_MAX, true));
    EXPECT_EQ("   1  z\n"
              "  22  \n",
              bare.text(SIZE_MAX, true));
}

TEST(Table, IsRedOnlyWhereItIsColoured)
{
    Table table({{"L", Kind::Long}, {"SHORT", Kind::Short}}, true);
    table.add({"has gone", "1"}, true);
    table.add({"no", "2"});
    EXPECT_EQ("L     SHORT\n"
              "has   1\n"
              "gone  \n"
              "no    2\n",
              table.text(1, false));
    EXPECT_EQ("L     SHORT\n"
              "\033[31mhas   1\033[0m\n"
              "\033[31mgone  \033[0m\n"
              "no    2\n",
              table.text(1, true));
}

TEST(Table, GivesItsLongColumnsEqualSharesOfWhatIsLeft)
{
    const std::tuple<const char*, const char*, size_t, const char*> CASES[] = {
        {"0123 56789", "01 34567", 24,
         "FIRST        N  LAST\n"
         "0123 56789  12  01 34567\n"},
        {"0123 56789", "01 34567", 23,
         "FIRST       N  LAST\n"
         "0123       12  01 34567\n"
         "56789          \n"},
        {"01 34567", "0123 56789", 23,
         "FIRST      N  LAST\n"
         "01 34567  12  0123\n"
         "              56789\n"},
        // One column gets the space that the other does not need.
        {"01234", "0 2 4 6 8 0 2 4 6 8", 23,
         "FIRST   N  LAST\n"
         "01234  12  0 2 4 6 8 0\n"
         "           2 4 6 8\n"},
        {"0 2 4 6 8 0 2 4 6 8", "012", 23,
         "FIRST           N  LAST\n"
         "0 2 4 6 8 0 2  12  012\n"
         "4 6 8              \n"},
        // Not less than the titles and the words need; a word also ends after a comma.
        {"0 2 4 6", "0 2 4", 0,
         "FIRST   N  LAST\n"
         "0 2 4  12  0 2\n"
         "6          4\n"},
        {"0123456,89", "01234567 9", 0,
         "FIRST      N  LAST\n"
         "0123456,  12  01234567\n"
         "89            9\n"},
        {"0123456789012345678901234567890123456789", "0123456789012345678901234567890123456789xy", 0,
         "FIRST                                      N  LAST\n"
         "0123456789012345678901234567890123456789  12  0123456789012345678901234567890123456789\n"
         "                                              xy\n"},
        // Characters of two columns, and marks that take none and stay with their letters.
        {"\u6f22\u5b57\u6f22 \u5b57", "e\u0301e\u0301e\u0301e\u0301e\u0301 e\u0301", 17,
         "FIRST    N  LAST\n"
         "\u6f22\u5b57\u6f22  12  e\u0301e\u0301e\u0301e\u0301e\u0301\n"
         "\u5b57          e\u0301\n"},
        {"\x1b", "\xff", 23,
         "FIRST   N  LAST\n"
         "\\x1b   12  \\xff\n"},
    };
    ASSERT_NE(nullptr, setlocale(LC_CTYPE, "C.UTF-8"));
    for (const auto& [szFirst, szLast, nTerminal, szText] : CASES) {
        Table table({{"FIRST", Kind::Long}, {"N", Kind::Right}, {"LAST", Kind::Long}}, true);
        table.add({szFirst, "12", szLast});
        EXPECT_EQ(szText, table.text(nTerminal, false));
    }
}

TEST(Table, LeavesSpareColumnsOutWhereALineDoesNotFitTheLastFirst)
{
    const std::pair<size_t, const char*> CASES[] = {
        {20, "A   SPARE  MORE  Z\n"
             "aa  bb     cc    zz\n"},
        {19, "A   SPARE  MORE  Z\n"
             "aa  bb     cc    zz\n"},
        {18, "A   SPARE  Z\n"
             "aa  bb     zz\n"},
        {13, "A   SPARE  Z\n"
             "aa  bb     zz\n"},
        {12, "A   Z\n"
             "aa  zz\n"},
        {0, "A   Z\n"
            "aa  zz\n"},
    };
    Table table(
        {{"A", Kind::Short}, {"SPARE", Kind::Short, true}, {"MORE", Kind::Long, true}, {"Z", Kind::Long}},
        true);
    table.add({"aa", "bb", "cc", "zz"});
    for (const auto& [nTerminal, szText] : CASES) {
        EXPECT_EQ(szText, table.text(nTerminal, false)) << nTerminal;
    }
    // The last column can be one of them; what is measured line by line is laid out in the same way.
    Table last({{"A", Kind::Short}, {"LAST", Kind::Short, true}}, true);
    last.add({"aa", "bb"});
    EXPECT_EQ("A\naa\n", last.text(7, false));
    EXPECT_EQ("A   LAST\naa  bb\n", last.text(8, false));
}
