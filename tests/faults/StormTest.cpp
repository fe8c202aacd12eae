// 1 to 64 processes use one file at the same time through the exported functions: without a lock, and
// serialised by CallLock. VEMO_TEST_PROCESSES adds a storm of that many processes.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "Figures.h"
#include "ProcessState.h"
#include "Processes.h"
#include "StormCalls.h"

namespace {

// The results of calls whose effect no other call can have.
struct Tally {
    int64_t nCalls = 0;
    int64_t nFailed = 0;  // reported failure, had no effect
    int64_t nFalse = 0;   // reported failure, but took effect
    int64_t nMissing = 0; // reported success, but had no effect

    void add(bool blReported, bool blDone)
    {
        ++nCalls;
        nMissing += blReported && !blDone;
        nFalse += !blReported && blDone;
        nFailed += !blReported && !blDone;
    }
};

// "KIND-PROCESS-ROUND"
std::string nameOf(const char* szKind, int nProcess, int nRound = 0)
{
    return std::string(szKind) + "-" + std::to_string(nProcess) + "-" + std::to_string(nRound);
}

bool has(const Tokens& tokens, const std::string& strName)
{
    return 0 != tokens.count(strName);
}

// Whether each call must have exactly the effect that it reports.
bool isExact(Calls calls, int nProcesses)
{
    return Calls::Serialised == calls || 1 == nProcesses;
}

void report(const char* szName, int nProcesses, Calls calls, const Tally& tally, const std::string& strMore)
{
    EXPECT_EQ(0, tally.nMissing);
    if (isExact(calls, nProcesses)) {
        EXPECT_EQ(0, tally.nFailed);
        EXPECT_EQ(0, tally.nFalse);
    }
    figure(szName, std::to_string(nProcesses) + (1 == nProcesses ? " process, " : " processes, ") +
                       (Calls::Plain == calls ? "plain, " : "serialised, ") + std::to_string(tally.nCalls) +
                       " calls: failed though done " + share(tally.nFalse, tally.nCalls) + ", failed " +
                       share(tally.nFailed, tally.nCalls) + strMore);
}

// Processes that create, grant and delete.
class Storm {
public:
    Storm(Calls calls, int nProcesses) : m_nProcesses(nProcesses), m_calls(calls)
    {
        Tokens tokens = {{"shared", m_nShared}};
        for (int nProcess = 0; nProcess < m_nProcesses; ++nProcess) {
            tokens[nameOf("own", nProcess)] = m_nRounds + 1;
            for (int nRound = 0; nRound < m_nRounds; ++nRound) {
                tokens[nameOf("revoked", nProcess, nRound)] = 1000;
            }
        }
        m_calls.prepare(tokens);
    }

    // Each token that a process deletes is granted by its neighbour.
    void takePart(int nProcess)
    {
        for (int nRound = 0; nRound < m_nRounds; ++nRound) {
            Round& results = round(nProcess, nRound);
            results.nCreated = m_calls.create(nameOf("new", nProcess, nRound));
            results.nGrantedOwn = m_calls.grant(nameOf("own", nProcess));
            results.nGrantedShared = m_calls.grant("shared");
            m_calls.grant(nameOf("revoked", (nProcess + 1) % m_nProcesses, nRound));
            results.nRevoked = m_calls.revoke(nameOf("revoked", nProcess, nRound));
        }
    }

    // Compares the results that the processes got with what the store holds.
    void judge(Calls calls)
    {
        Tally tally;
        int64_t nGranted = 0; // of the token that all share
        int64_t nDeleted = 0;
        int64_t nUndone = 0; // reported as deleted, but the token is there
        const Tokens found = m_calls.tokens();
        for (int nProcess = 0; nProcess < m_nProcesses; ++nProcess) {
            const int64_t nSpent = m_nRounds + 1 - found.at(nameOf("own", nProcess));
            int64_t nGrantedOwn = 0;
            for (int nRound = 0; nRound < m_nRounds; ++nRound) {
                const Round& results = round(nProcess, nRound);
                tally.add(0 == results.nCreated, has(found, nameOf("new", nProcess, nRound)));
                nGrantedOwn += 0 == results.nGrantedOwn;
                nGranted += 0 == results.nGrantedShared;
                // A grant may have written the deleted token back, so only a missing one proves a deletion.
                const bool blThere = has(found, nameOf("revoked", nProcess, nRound));
                const bool blReported = 1 == results.nRevoked;
                tally.add(blReported, blReported || !blThere);
                nDeleted += blReported;
                nUndone += blReported && blThere;
            }
            for (int nRound = 0; nRound < m_nRounds; ++nRound) {
                tally.add(nRound < nGrantedOwn, nRound < nSpent);
            }
        }
        const int64_t nSpent = m_nShared - (has(found, "shared") ? found.at("shared") : 0);
        if (isExact(calls, m_nProcesses)) {
            EXPECT_EQ(m_nShared, nGranted);
            EXPECT_EQ(m_nShared, nSpent);
            EXPECT_EQ(m_nProcesses * m_nRounds, nDeleted);
            EXPECT_EQ(0, nUndone);
        }
        report("Storm", m_nProcesses, calls, tally,
               ", grants beyond count " + share(std::max<int64_t>(0, nGranted - nSpent), nGranted) +
                   ", deletions undone " + share(nUndone, nDeleted));
    }

private:
    // The results that one process got in one round.
    struct Round {
        int nCreated;
        int nGrantedOwn;
        int nGrantedShared;
        int nRevoked;
    };
    Round& round(int nProcess, int nRound)
    {
        return m_rounds[static_cast<size_t>(nProcess * m_nRounds + nRound)];
    }

    const int m_nProcesses;
    const int m_nRounds = static_cast<int>(scaled(std::max(4, 64 / m_nProcesses)));
    // Half as many uses as attempts, so that all are spent if each is counted.
    const int64_t m_nShared = m_nProcesses * m_nRounds / 2;
    const StormCalls m_calls;
    SharedArray<Round> m_rounds{static_cast<size_t>(m_nProcesses * m_nRounds)};
};

void storm(Calls calls, int nProcesses)
{
    Storm processes(calls, nProcesses);
    EXPECT_EQ(0, runProcesses(nProcesses, [&](int nProcess) { processes.takePart(nProcess); }));
    processes.judge(calls);
}

// All processes start without a file. The file exists before its table: calls in between fail.
void makeStores(Calls calls, int nProcesses)
{
    struct Creation {
        int nCreated;
        bool blNoTable;
    };
    const StormCalls stormCalls(calls);
    const int64_t nStores = scaled(std::max(2, 64 / nProcesses));
    Tally tally;
    int64_t nNoTable = 0; // failed because there was no table
    int64_t nBroken = 0;  // stores that stayed without one
    for (int64_t nStore = 0; nStore < nStores; ++nStore) {
        SharedArray<Creation> creations(static_cast<size_t>(nProcesses));
        stormCalls.store().setFiles({});
        EXPECT_EQ(0, runProcesses(nProcesses, [&](int nProcess) {
                      Log::clear();
                      Creation& creation = creations[static_cast<size_t>(nProcess)];
                      creation.nCreated = stormCalls.create(nameOf("new", nProcess));
                      creation.blNoTable = nullptr != strstr(Log::text(), "no such table: token");
                  }));
        const Tokens found = stormCalls.tokens();
        nBroken += STATE_NO_TABLE == stormCalls.store().state();
        for (int nProcess = 0; nProcess < nProcesses; ++nProcess) {
            const Creation& creation = creations[static_cast<size_t>(nProcess)];
            const bool blDone = has(found, nameOf("new", nProcess));
            tally.add(0 == creation.nCreated, blDone);
            nNoTable += 0 > creation.nCreated && !blDone && creation.blNoTable;
        }
    }
    report("First creation", nProcesses, calls, tally,
           " (no table yet " + share(nNoTable, tally.nCalls) + "), stores without a table " +
               share(nBroken, nStores));
}

// 1 to 64, and VEMO_TEST_PROCESSES.
void forEachSize(Calls calls, void (*test)(Calls calls, int nProcesses))
{
    std::vector<int> nSizes = {1, 2, 4, 8, 16, 32, 64};
    if (const char* szMore = getenv("VEMO_TEST_PROCESSES")) {
        nSizes.push_back(std::stoi(szMore));
    }
    for (const int nProcesses : nSizes) {
        SCOPED_TRACE(nProcesses);
        test(calls, nProcesses);
    }
}

} // namespace

TEST(Storm, OfPlainCallsEndsAndCorruptsNothing)
{
    forEachSize(Calls::Plain, &storm);
}

TEST(Storm, OfSerialisedCallsIsExact)
{
    forEachSize(Calls::Serialised, &storm);
}

TEST(FirstCreation, ByPlainCallsEndsAndCorruptsNothing)
{
    forEachSize(Calls::Plain, &makeStores);
}

TEST(FirstCreation, BySerialisedCallsIsExact)
{
    forEachSize(Calls::Serialised, &makeStores);
}
