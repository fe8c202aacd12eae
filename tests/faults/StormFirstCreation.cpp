// The storm that makes the store: all begin without a file. The file is there before its table is, and
// whoever comes in between fails.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

#include "Figures.h"
#include "ProcessState.h"
#include "StormCalls.h"
#include "StormProcesses.h"

namespace {

struct Told {
    int nCreated;
    bool blNoTable;
};

struct Tally {
    int64_t nCalls = 0;
    int64_t nStores = 0;
    int64_t nFailed = 0;  // told failure, had no effect
    int64_t nNoTable = 0; // of these: for want of the table
    int64_t nFalse = 0;   // told failure, took effect
    int64_t nMissing = 0; // told success, had no effect
    int64_t nBroken = 0;  // stores that stayed without a table
};

void makeStore(const StormCalls& calls, int nProcesses, Tally& tally)
{
    SharedArray<Told> told(static_cast<size_t>(nProcesses));
    calls.removeStore();
    EXPECT_EQ(0, runProcesses(nProcesses, [&](int nProcess) {
                  Log::clear();
                  Told& mine = told[static_cast<size_t>(nProcess)];
                  mine.nCreated = calls.create(nameOf("new", nProcess));
                  mine.blNoTable = nullptr != strstr(Log::text(), "no such table: token");
              }));
    const Tokens found = calls.tokens();
    ++tally.nStores;
    tally.nBroken += !calls.hasTable();
    for (int nProcess = 0; nProcess < nProcesses; ++nProcess) {
        const Told& his = told[static_cast<size_t>(nProcess)];
        const bool blDone = 0 != found.count(nameOf("new", nProcess));
        ++tally.nCalls;
        tally.nMissing += 0 == his.nCreated && !blDone;
        tally.nFalse += 0 > his.nCreated && blDone;
        tally.nFailed += 0 > his.nCreated && !blDone;
        tally.nNoTable += 0 > his.nCreated && !blDone && his.blNoTable;
    }
}

void makeStores(Calls calls)
{
    for (const int nProcesses : stormSizes()) {
        SCOPED_TRACE(nProcesses);
        const StormCalls stormCalls(calls);
        Tally tally;
        for (int64_t nLeft = scaled(std::max(2, 64 / nProcesses)); 0 < nLeft; --nLeft) {
            makeStore(stormCalls, nProcesses, tally);
        }
        EXPECT_EQ(0, tally.nMissing);
        if (Calls::Serialised == calls || 1 == nProcesses) {
            EXPECT_EQ(0, tally.nFailed);
            EXPECT_EQ(0, tally.nFalse);
        }
        figure("First creation", stormName(nProcesses, calls, tally.nCalls) + ": failed though done " +
                                     share(tally.nFalse, tally.nCalls) + ", failed " +
                                     share(tally.nFailed, tally.nCalls) + " (for want of the table " +
                                     share(tally.nNoTable, tally.nCalls) + "), stores without a table " +
                                     share(tally.nBroken, tally.nStores));
    }
}

} // namespace

TEST(FirstCreation, ByPlainCallsEndsAndCorruptsNothing)
{
    makeStores(Calls::Plain);
}

TEST(FirstCreation, BySerialisedCallsIsExact)
{
    makeStores(Calls::Serialised);
}
