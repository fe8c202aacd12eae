#include "tools/Nearest.h"

#include <gtest/gtest.h>

using tool::didYouMean;
using tool::distance;

TEST(Distance, CountsWhatMustChange)
{
    const struct {
        std::string strOne;
        std::string strOther;
        size_t nDistance;
    } CASES[] = {
        {"", "", 0},          {"", "abc", 3},          {"list", "list", 0},          {"lst", "list", 1},
        {"llist", "list", 1}, {"lint", "list", 1},     {"lsit", "list", 1},          {"abcd", "badc", 2},
        {"ca", "abc", 3},     {"craete", "create", 1}, {"--funct", "--function", 3}, {"ab", "ba", 1},
    };
    for (const auto& each : CASES) {
        SCOPED_TRACE(each.strOne + " " + each.strOther);
        EXPECT_EQ(each.nDistance, distance(each.strOne, each.strOther));
        EXPECT_EQ(each.nDistance, distance(each.strOther, each.strOne));
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
        {"lost", "did you mean \"list\"?"}, // as near to "last"
        {"lxyt", ""},                       // half of it, too
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
