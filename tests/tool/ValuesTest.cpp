#include "tools/Values.h"

#include <gtest/gtest.h>

using tool::relativeText;

namespace {

const int64_t MINUTE = 60;
const int64_t HOUR = 60 * MINUTE;
const int64_t DAY = 24 * HOUR;

} // namespace

TEST(RelativeText, HasOneUnit)
{
    const struct {
        int64_t nLeft;
        const char* szText;
    } CASES[] = {
        {0, "in 0 s"},
        {1, "in 1 s"},
        {MINUTE - 1, "in 59 s"},
        {MINUTE, "in 1 min"},
        {2 * MINUTE - 1, "in 1 min"},
        {HOUR - 1, "in 59 min"},
        {HOUR, "in 1 h"},
        {2 * DAY - 1, "in 47 h"},
        {2 * DAY, "in 2 d"},
        {3 * DAY - 1, "in 2 d"},
        {-1, "expired 1 s ago"},
        {-MINUTE, "expired 1 min ago"},
        {-2 * DAY + 1, "expired 47 h ago"},
        {-2 * DAY, "expired 2 d ago"},
    };
    const int64_t nNow = 1767225600;
    for (const auto& each : CASES) {
        EXPECT_EQ(each.szText, relativeText(nNow + each.nLeft, nNow)) << each.nLeft;
    }
}
