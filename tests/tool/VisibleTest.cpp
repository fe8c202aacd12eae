#include "tools/Visible.h"

#include <gtest/gtest.h>

using tool::Charset;
using tool::printable;
using tool::showableJson;
using tool::validUtf8;
using tool::visibleJson;
using namespace std::string_literals;

namespace {

// The first and last characters of one, two, three and four bytes.
const std::string ENDS = "\u0080 \u07ff \u0800 \uffff \U00010000 \U0010fffe \U0010ffff";

} // namespace

TEST(Visible, TextsAreEscapedByBytes)
{
    const std::string CASES[][3] = {
        {"", "", ""},
        {"plain ~", "plain ~", "plain ~"},
        {"a\0b"s, R"(a\x00b)", R"(a\x00b)"},
        {"\x1f\x7f", R"(\x1f\x7f)", R"(\x1f\x7f)"},
        {R"(\ \x \\x \)", R"(\ \x5cx \\x5cx \)", R"(\ \x5cx \\x5cx \)"},
        {"\u00e4x\U0001f600x", "\u00e4x\U0001f600x", R"(\xc3\xa4x\xf0\x9f\x98\x80x)"},
        {"\xff\xe4x\xf0\x9f\x98", R"(\xff\xe4x\xf0\x9f\x98)", R"(\xff\xe4x\xf0\x9f\x98)"},
        {"\xf4\x90\x80\x80", R"(\xf4\x90\x80\x80)", R"(\xf4\x90\x80\x80)"}, // after the last character
        {"\u00a0\u200b", R"(\xc2\xa0\xe2\x80\x8b)", R"(\xc2\xa0\xe2\x80\x8b)"},
    };
    for (const auto& each : CASES) {
        EXPECT_EQ(each[1], printable(each[0]));
        EXPECT_EQ(each[2], printable(each[0], Charset::Ascii));
    }
}

TEST(Visible, NoCharacterIsTakenForInvalid)
{
    EXPECT_EQ(ENDS + "\0\x7f"s, validUtf8(ENDS + "\0\x7f"s));
    EXPECT_EQ(R"(\xf4\x90\x80\x80\xc0\x80\xed\xa0\x80)", validUtf8("\xf4\x90\x80\x80\xc0\x80\xed\xa0\x80"));
}

TEST(Visible, JsonIsEscapedInUtf16)
{
    EXPECT_EQ("[\n\"\u07ff\",\"\xff\\\"\\u0000\\u007f\\u200b\\udb40\\udc01\"]",
              visibleJson("[\n\"\u07ff\",\"\xff\\\"\0\x7f\u200b\U000e0001\"]"s));
    EXPECT_EQ(R"(\u0080 \u07ff \u0800 \uffff \ud800\udc00 \udbff\udffe \udbff\udfff)",
              showableJson(ENDS, Charset::Ascii));
    EXPECT_EQ(R"(\udbff\udfff)", visibleJson("\U0010ffff"));
    EXPECT_EQ(ENDS + R"(\udcff)", showableJson(ENDS + "\xff", Charset::Utf8));
    EXPECT_EQ("\x7f", showableJson("\x7f", Charset::Ascii));
}
