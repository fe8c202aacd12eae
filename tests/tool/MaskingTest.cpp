#include "tools/Masking.h"

#include <gtest/gtest.h>

#include "AccessTokenDefine.h"

using tool::masked;
using tool::shortened;
using tool::shownPath;
using tool::shownReason;

namespace {

const std::string ID(VEMO_ATOKEN_LENGTH_MIN, 'x');
const std::string SHORT = ID.substr(1);
const std::string SHOWN = "xxxxxxxx...";

} // namespace

TEST(Masking, ShowsEightCharactersOf)
{
    const std::string strMarks(40, '\x80'); // continuation bytes without a first byte
    const char* const FACE = "\U0001f600";
    std::string strFaces;
    for (int i = 0; i < 8; ++i) {
        strFaces += FACE;
    }
    const std::string CASES[][2] = {
        {"", ""},
        {"1234567", "1234567"},
        {"12345678", "12345678"},
        {"123456789", "12345678"},
        {"1234567\u00e4", "1234567\u00e4"},
        {"1234567\u00e4\u00e4", "1234567\u00e4"},
        {strFaces, strFaces},
        {strFaces + FACE, strFaces},
        {strMarks, strMarks.substr(0, 32)},
        {strMarks.substr(0, 32), strMarks.substr(0, 32)},
    };
    for (const auto& each : CASES) {
        EXPECT_EQ(each[1], masked(each[0]));
        EXPECT_EQ(each[1] + (each[0] == each[1] ? "" : "..."), shortened(each[0]));
    }
}

TEST(Masking, ShortensTextsAsLongAsAnId)
{
    EXPECT_EQ("\"" + SHORT + "\"", tool::quoted(SHORT));
    EXPECT_EQ("\"" + SHOWN + "\"", tool::quoted(ID));
    EXPECT_EQ("/a/" + SHOWN + "/b", shownPath("/a/" + ID + "/b"));
    EXPECT_EQ(SHORT, shownPath(SHORT));
    EXPECT_EQ("/" + SHOWN + "/b", shownPath("/" + SHORT + "/b"));
}

// The quoted part of a reason, from the first to the last quotation mark.
TEST(Masking, ShortensTheQuotedPartOfAReason)
{
    const std::string CASES[][2] = {
        {"no such column: a", "no such column: a"},
        {ID, SHOWN},
        {"near \"" + ID + "\": syntax error", "near \"" + SHOWN + "\": syntax error"},
        {"'" + ID + "'", "'" + SHOWN + "'"},
        {"key (" + ID + ")", "key (" + SHOWN + ")"},
        {"key '" + SHORT + "'", "key '" + SHORT + "'"},
        {ID + ")", SHOWN},
        {"(" + ID, "(xxxxxxx..."},
        {"it's" + ID, "it'sxxxx..."},
        {ID + "''" + ID, SHOWN + "'xxxxxxx..."},
    };
    for (const auto& each : CASES) {
        EXPECT_EQ(each[1], shownReason(each[0]));
    }
}
