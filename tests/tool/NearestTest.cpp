#include "tools/Nearest.h"

#include <gtest/gtest.h>

#include <tuple>

using tool::didYouMean;
using tool::distance;

TEST(Distance, CountsWhatMustChange)
{
    const std::tuple<std::string, std::string, size_t> CASES[] = {
        {"", "", 0},          {"", "abc", 3},          {"list", "list", 0},          {"lst", "list", 1},
        {"llist", "list", 1}, {"lint", "list", 1},     {"lsit", "list", 1},          {"abcd", "badc", 2},
        {"ca", "abc", 3},     {"craete", "create", 1}, {"--funct", "--function", 3}, {"ab", "ba", 1},
    };
    for (const auto& [strOne, strOther, nDistance] : CASES) {
        SCOPED_TRACE(strOne + " " + strOther);
        EXPECT_EQ(nDistance, distance(strOne, strOther));
        EXPECT_EQ(nDistance, distance(strOther, strOne));
    }
}

TEST(DidYouMean, NamesTheNearestIfItIsNear)
{
    const std::pair<std::string, std::string> CASES[] = {
        {"lsit", "did you mean \"list\"?"},
        {"list", "did you mean \"list\"?"},
        {"liszt", "did you mean \"list\"?"},
        {"li", ""}, // half of it
        {"gran", "did you mean \"grant\"?"},
        {"gra", ""},
        {"lost", "did you mean \"list\"?"}, // "last" is as near
        {"lxyt", ""},                       // also half of it
        {"--funct", "did you mean \"--function\"?"},
        {"--func", ""},
        {"list of tokens", ""},
        {"", ""},
        {std::string(255, 'l'), ""},
    };
    for (const auto& [strWord, strQuestion] : CASES) {
        SCOPED_TRACE(strWord);
        EXPECT_EQ(strQuestion, didYouMean(strWord, {"list", "last", "grant", "--function"}));
    }
    EXPECT_EQ("", didYouMean("list", {}));
}
