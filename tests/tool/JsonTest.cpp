#include "tools/Json.h"

#include <gtest/gtest.h>

#include <limits>

#include "ScarceMemory.h"
#include "tools/Failure.h"

using tool::compactJson;
using tool::flawOfStored;
using tool::nestingOf;
using tool::parseObject;

namespace {

std::string nested(int nLevels)
{
    return std::string(static_cast<size_t>(nLevels), '[') + std::string(static_cast<size_t>(nLevels), ']');
}

// The value that is read, or the reason why none is.
std::string read(const std::string& strText)
{
    try {
        return compactJson(parseObject(strText));
    } catch (const tool::BadValue& bad) {
        return bad.what();
    }
}

const std::string LONG(100, 'x');

} // namespace

TEST(Json, ShowsHowDeepATextIsNested)
{
    const std::pair<const char*, int> CASES[] = {
        {"", 0},
        {"{}", 1},
        {"[[[]]]", 3},
        {"[[],[[]],{}]", 3},
        {R"({"a":{"b":[1]},"c":{}})", 3},
        {R"({"a":"[[[{{{"})", 1},
        {R"(["\"[[", [[]]])", 3},
        {R"(["\\"])", 1},
        {R"("\"[[[")", 0},
        {R"(["\\", [["]"]]])", 3},
        {R"("\)", 0},
        {"]]]]", 0},
        {"}[[", 1},
    };
    for (const auto& [szText, nLevels] : CASES) {
        EXPECT_EQ(nLevels, nestingOf(szText)) << szText;
    }
}

TEST(Json, IsReadStrictly)
{
    const char* const CASES[][2] = {
        {R"({"a":[1,"b",null]})", R"({"a":[1,"b",null]})"},
        {"{\n \"a\": NaN, \"b\": -Infinity}", R"({"a":NaN,"b":-Infinity})"},
        {"1", "is not JSON: Column 1 A valid JSON document must be either an array or an object value."},
        {R"({'a':1})", "is not JSON: Column 2 Missing '}' or object member name"},
        {"{\n\"a\":}", "is not JSON: Line 2, Column 5 Syntax error: value, object or array expected."},
        {R"({"a":tru,"b":fals})", "is not JSON: Column 6 Syntax error: value, object or array expected."},
    };
    for (const auto& each : CASES) {
        EXPECT_EQ(each[1], read(each[0])) << each[0];
    }
    EXPECT_EQ("is nested too deeply for JSON", read(R"({"a":)" + nested(1000) + "}"));
    EXPECT_EQ(R"({"a":)" + nested(999) + "}", read(R"({"a":)" + nested(999) + "}"));
}

TEST(Json, ThatATokenHoldsIsReadAsLenientlyAsByTheLibrary)
{
    for (const std::string& strText : {std::string("/**/{\"a\":1,}x"), std::string("1"), nested(1000)}) {
        EXPECT_EQ("", flawOfStored(strText));
    }
    EXPECT_EQ("is not JSON", flawOfStored("{"));
    EXPECT_EQ("is nested too deeply", flawOfStored(nested(1001)));
}

TEST(Json, IsWrittenAsItIs)
{
    Json::Value jValue;
    jValue["double"] = 0.1 + 0.2;
    jValue["infinite"] = std::numeric_limits<double>::infinity();
    jValue["text"] = "\xc3\xa4\xff\x1b";
    EXPECT_EQ("{\"double\":0.30000000000000004,\"infinite\":Infinity,\"text\":\"\xc3\xa4\xff\\u001b\"}",
              compactJson(jValue));
}

// Streams hide a lack of memory. It must not cut a text short, or make a number invalid.
TEST(Json, IsWholeOrNoneWhenMemoryFails)
{
    const std::string strText = R"({"a":[0.12345678901234559,")" + LONG + R"("]})";
    EXPECT_EQ(std::set<std::string>{strText}, resultsWhileMemoryFails([&] { return read(strText); }));
    const std::string strBad = "{\"" + LONG + "\":1,\"" + LONG + "\":2}";
    EXPECT_EQ(std::set<std::string>{read(strBad)}, resultsWhileMemoryFails([&] { return read(strBad); }));
    EXPECT_EQ(std::set<std::string>{""}, resultsWhileMemoryFails([&] { return flawOfStored(strText); }));
}
