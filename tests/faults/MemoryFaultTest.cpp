// Each allocation of each operation fails, also in SQLite and jsoncpp: alone, or with all later ones.

#include <gtest/gtest.h>
#include <pwd.h>

#include <functional>
#include <thread>

#include "Heap.h"
#include "Oracle.h"

namespace {

const uid_t NOBODY_KNOWN = 3999999999;

class MemoryFault : public ::testing::TestWithParam<size_t> {};

// With blOwnThread, each run has a new thread, for which the library holds no object yet.
void failEachAllocation(const Operation& operation, bool blOwnThread = false)
{
    const TokenStore store;
    getpwuid(NOBODY_KNOWN);    // loads the user databases, which stay in memory
    int64_t nHeld = INT64_MAX; // after an undisturbed run
    g_allocations.run = [&](const std::function<void()>& judge) {
        if (blOwnThread) {
            std::thread(judge).join();
        } else {
            judge();
        }
        const int64_t nLive = g_nLive;
        nHeld = INT64_MAX == nHeld ? nLive : nHeld;
        EXPECT_GE(nHeld, nLive); // less if the library has released something that it held
        if (0 == g_allocations.nFirst) {
            EXPECT_EQ(nHeld, nLive);
        }
    };
    EXPECT_LT(0, failEach(store, operation, g_allocations));
}

} // namespace

TEST_P(MemoryFault, LeavesNothingBehind)
{
    failEachAllocation(operations()[GetParam()]);
}

TEST(MemoryFaultInAFreshThread, LeavesNothingBehind)
{
    failEachAllocation(GRANT, true); // which reads and writes JSON
}

INSTANTIATE_TEST_SUITE_P(Each, MemoryFault, ::testing::Range<size_t>(0, operations().size()),
                         [](const auto& instance) { return operations()[instance.param].szName; });
