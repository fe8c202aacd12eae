// Every allocation of each operation fails: once, and from then on. That of SQLite and of jsoncpp too.

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sqlite3.h>

#include <algorithm>

#include "Figures.h"
#include "Heap.h"
#include "Oracle.h"

namespace {

const uid_t NOBODY_KNOWN = 3999999999;

bool g_blCrossedSqlite = false;

class MemoryFault : public ::testing::TestWithParam<size_t> {};

} // namespace

// Tells when an exception comes out of SQLite, which knows none and would not clean up behind it.
extern "C" int sqlite3_exec(sqlite3* pDb, const char* szSql, int (*callback)(void*, int, char**, char**),
                            void* pArgument, char** pszError)
{
    static const auto real = reinterpret_cast<decltype(&sqlite3_exec)>(dlsym(RTLD_NEXT, "sqlite3_exec"));
    try {
        return real(pDb, szSql, callback, pArgument, pszError);
    } catch (...) {
        g_blCrossedSqlite = true;
        throw;
    }
}

TEST_P(MemoryFault, LeavesNothingBehind)
{
    const Operation& operation = operations()[GetParam()];
    TokenStore store;
    getpwuid(NOBODY_KNOWN); // has every user database loaded, which stays
    const Oracle oracle(store, operation);
    int64_t cbHeld = 0; // more than after an undisturbed run; less when something kept was given up
    const auto judge = [&](int64_t nFirst, int64_t nLast) {
        const std::string strWrong = oracle.judge(
            [&] {
                cbHeld -= Heap::liveBytes();
                Heap::failFrom(nFirst, nLast);
            },
            [&] {
                Heap::failNone();
                cbHeld += Heap::liveBytes();
            });
        EXPECT_EQ("", strWrong) << "allocation " << nFirst << " to " << nLast;
        EXPECT_GE(0, cbHeld) << "allocation " << nFirst << " to " << nLast;
        EXPECT_FALSE(g_blCrossedSqlite) << "allocation " << nFirst << " to " << nLast;
    };

    judge(0, -1);
    const int64_t nAllocations = Heap::allocations();
    for (int64_t nAllocation = 1; nAllocation <= nAllocations; ++nAllocation) {
        judge(nAllocation, nAllocation);
        judge(nAllocation, INT64_MAX);
        ASSERT_FALSE(HasFailure());
    }
    judge(0, -1);
    EXPECT_EQ(0, cbHeld);
    figure("memory faults",
           std::string(operation.szName) + ": " + std::to_string(nAllocations) + " allocations");
}

INSTANTIATE_TEST_SUITE_P(Each, MemoryFault, ::testing::Range<size_t>(0, operations().size()),
                         [](const auto& instance) {
                             std::string strName = operations()[instance.param].szName;
                             std::replace(strName.begin(), strName.end(), ' ', '_');
                             return strName;
                         });
