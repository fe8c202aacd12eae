// Every allocation of each operation fails: once, and from then on. That of SQLite and of jsoncpp too.

#include <gtest/gtest.h>
#include <pwd.h>
#include <sqlite3.h>

#include <algorithm>
#include <functional>
#include <thread>

#include "Figures.h"
#include "Heap.h"
#include "Interpose.h"
#include "Oracle.h"

namespace {

const uid_t NOBODY_KNOWN = 3999999999;

bool g_blCrossedSqlite = false;

class MemoryFault : public ::testing::TestWithParam<size_t> {};

void inThisThread(const std::function<void()>& judge)
{
    judge();
}

// Finds nothing that the library keeps for a thread.
void inThreadOfItsOwn(const std::function<void()>& judge)
{
    std::thread(judge).join();
}

void failEachAllocation(const Operation& operation, void (*run)(const std::function<void()>& judge))
{
    TokenStore store;
    getpwuid(NOBODY_KNOWN); // has every user database loaded, which stays
    const Oracle oracle(store, operation);
    std::string strWrong;
    int64_t cbHeld = INT64_MAX; // after an undisturbed run
    const auto judge = [&](int64_t nFirst, int64_t nLast) {
        run([&] { strWrong = oracle.judge([&] { Heap::failFrom(nFirst, nLast); }, &Heap::failNone); });
        EXPECT_EQ("", strWrong) << "allocation " << nFirst << " to " << nLast;
        EXPECT_FALSE(g_blCrossedSqlite) << "allocation " << nFirst << " to " << nLast;
        // Less, when something that was kept has been given up.
        EXPECT_GE(cbHeld, Heap::liveBytes()) << "allocation " << nFirst << " to " << nLast;
        if (0 == nFirst && INT64_MAX != cbHeld) {
            EXPECT_EQ(cbHeld, Heap::liveBytes());
        }
    };
    const int64_t nAllocations = failEach(judge, [&] {
        cbHeld = Heap::liveBytes();
        return Heap::allocations();
    });
    figure("memory faults",
           std::string(operation.szName) + ": " + std::to_string(nAllocations) + " allocations");
}

} // namespace

// Tells when an exception comes out of SQLite, which knows none and would not clean up behind it.
extern "C" int sqlite3_exec(sqlite3* pDb, const char* szSql, int (*callback)(void*, int, char**, char**),
                            void* pArgument, char** pszError)
{
    try {
        return NEXT(sqlite3_exec)(pDb, szSql, callback, pArgument, pszError);
    } catch (...) {
        g_blCrossedSqlite = true;
        throw;
    }
}

TEST_P(MemoryFault, LeavesNothingBehind)
{
    failEachAllocation(operations()[GetParam()], &inThisThread);
}

TEST(MemoryFaultInAFreshThread, LeavesNothingBehind)
{
    failEachAllocation(operations()[3], &inThreadOfItsOwn); // which reads and writes JSON
}

INSTANTIATE_TEST_SUITE_P(Each, MemoryFault, ::testing::Range<size_t>(0, operations().size()),
                         [](const auto& instance) {
                             std::string strName = operations()[instance.param].szName;
                             std::replace(strName.begin(), strName.end(), ' ', '_');
                             return strName;
                         });
