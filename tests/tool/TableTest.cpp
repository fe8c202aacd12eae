#include "tools/Table.h"

#include <gtest/gtest.h>

#include <clocale>

using tool::Table;
typedef Table::Kind Kind;

namespace {

const size_t ENDLESS = SIZE_MAX;

} // namespace

TEST(Table, AlignsItsColumnsAndPutsNoBlanksBehindTheLast)
{
    const std::vector<Table::Column> COLUMNS = {
        {"A", Kind::Short}, {"NUMBER", Kind::Right}, {"Z", Kind::Long}};
    Table titled(COLUMNS, true);
    Table bare(COLUMNS, false);
    EXPECT_EQ("", titled.text(ENDLESS, false));
    for (Table* pTable : {&titled, &bare}) {
        pTable->add({"", "1", "z"});
        pTable->add({"", "22", ""});
    }
    EXPECT_EQ("A  NUMBER  Z\n"
              "        1  z\n"
              "       22  \n",
              titled.text(ENDLESS, true));
    EXPECT_EQ("   1  z\n"
              "  22  \n",
              bare.text(ENDLESS, true));
}

TEST(Table, IsRedOnlyWhereItIsColoured)
{
    Table table({{"LONG", Kind::Long}, {"SHORT", Kind::Short}}, true);
    table.add({"expired", "1"}, true);
    table.add({"none", "2"});
    EXPECT_EQ("LONG  SHORT\n"
              "expi  1\n"
              "red   \n"
              "none  2\n",
              table.text(1, false));
    EXPECT_EQ("LONG  SHORT\n"
              "\033[31mexpi  1\033[0m\n"
              "\033[31mred   \033[0m\n"
              "none  2\n",
              table.text(1, true));
}

TEST(Table, GivesItsLongColumnsEqualSharesOfWhatIsLeft)
{
    const struct {
        const char* szFirst;
        const char* szLast;
        size_t nTerminal;
        const char* szText;
    } CASES[] = {
        {"0123456789", "01234567", 24,
         "FIRST        N  LAST\n"
         "0123456789  12  01234567\n"},
        {"0123456789", "01234567", 23,
         "FIRST       N  LAST\n"
         "012345678  12  01234567\n"
         "9              \n"},
        {"01234567", "0123456789", 23,
         "FIRST      N  LAST\n"
         "01234567  12  012345678\n"
         "              9\n"},
        // What the one does not need is for the other.
        {"01234", "0123456789012345678", 23,
         "FIRST   N  LAST\n"
         "01234  12  012345678901\n"
         "           2345678\n"},
        {"01234567890123456789", "012", 23,
         "FIRST           N  LAST\n"
         "0123456789012  12  012\n"
         "3456789            \n"},
        // No less than the titles need.
        {"0123456789", "01234567", 0,
         "FIRST   N  LAST\n"
         "01234  12  0123\n"
         "56789      4567\n"},
        // Characters of two columns, and marks that take none and stay with their letters.
        {"\u6f22\u5b57\u6f22\u5b57", "e\u0301e\u0301e\u0301e\u0301e\u0301e\u0301", 17,
         "FIRST    N  LAST\n"
         "\u6f22\u5b57\u6f22  12  e\u0301e\u0301e\u0301e\u0301e\u0301\n"
         "\u5b57          e\u0301\n"},
        {"\x1b", "\xff", 23,
         "FIRST   N  LAST\n"
         "\\x1b   12  \\xff\n"},
    };
    ASSERT_NE(nullptr, setlocale(LC_CTYPE, "C.UTF-8"));
    for (const auto& each : CASES) {
        Table table({{"FIRST", Kind::Long}, {"N", Kind::Right}, {"LAST", Kind::Long}}, true);
        table.add({each.szFirst, "12", each.szLast});
        EXPECT_EQ(each.szText, table.text(each.nTerminal, false));
    }
}
