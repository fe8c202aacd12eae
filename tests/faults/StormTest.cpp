// 1 to 64 processes create, grant and delete on one file, through the exported functions: as they come,
// and one at a time by CallLock. VEMO_TEST_PROCESSES, a number, adds a storm of so many.

#include <gtest/gtest.h>

#include <algorithm>

#include "Figures.h"
#include "StormCalls.h"
#include "StormProcesses.h"

namespace {

struct Plan {
    Calls calls;
    int nProcesses;
    int nRounds;

    int64_t roundsOfAll() const { return static_cast<int64_t>(nProcesses) * nRounds; }
    // Half of the attempts, so that all are spent where each is counted.
    int64_t sharedUses() const { return roundsOfAll() / 2; }
};

// What one process was told in one round.
struct Round {
    int nCreated;
    int nGrantedOwn;
    int nGrantedShared;
    int nRevoked;
};

struct Tally {
    int64_t nCalls = 0;     // creations, grants of own tokens and deletions
    int64_t nFailed = 0;    // told failure, had no effect
    int64_t nFalse = 0;     // told failure, took effect
    int64_t nMissing = 0;   // told success, had no effect
    int64_t nGranted = 0;   // grants of the token that all share
    int64_t nSpent = 0;     // what they took off its count
    int64_t nDeletions = 0; // told success
    int64_t nUndone = 0;    // and the token is there none the less
};

class Storm {
public:
    explicit Storm(const Plan& plan)
        : m_plan(plan), m_calls(plan.calls), m_rounds(static_cast<size_t>(plan.roundsOfAll()))
    {
        prepare();
    }

    void takePart(int nProcess);

    // Compares what the processes were told with what the store holds.
    Tally tally();

private:
    void prepare() const;
    Round& round(int nProcess, int nRound)
    {
        return m_rounds[static_cast<size_t>(nProcess * m_plan.nRounds + nRound)];
    }
    void addOwn(int nProcess, const Tokens& found, Tally& tally);

    const Plan m_plan;
    const StormCalls m_calls;
    SharedArray<Round> m_rounds;
};

void Storm::prepare() const
{
    Tokens tokens = {{"shared", m_plan.sharedUses()}};
    for (int nProcess = 0; nProcess < m_plan.nProcesses; ++nProcess) {
        tokens[nameOf("own", nProcess)] = m_plan.nRounds + 1;
        for (int nRound = 0; nRound < m_plan.nRounds; ++nRound) {
            tokens[nameOf("revoked", nProcess, nRound)] = 1000;
        }
    }
    m_calls.prepare(tokens);
}

// Each token that a process deletes is granted by its neighbour.
void Storm::takePart(int nProcess)
{
    const int nNeighbour = (nProcess + 1) % m_plan.nProcesses;
    for (int nRound = 0; nRound < m_plan.nRounds; ++nRound) {
        Round& told = round(nProcess, nRound);
        told.nCreated = m_calls.create(nameOf("new", nProcess, nRound));
        told.nGrantedOwn = m_calls.grant(nameOf("own", nProcess));
        told.nGrantedShared = m_calls.grant("shared");
        m_calls.grant(nameOf("revoked", nNeighbour, nRound));
        told.nRevoked = m_calls.revoke(nameOf("revoked", nProcess, nRound));
    }
}

// A change that only the call can have made.
void addChange(bool blTold, bool blDone, Tally& tally)
{
    ++tally.nCalls;
    tally.nMissing += blTold && !blDone;
    tally.nFalse += !blTold && blDone;
    tally.nFailed += !blTold && !blDone;
}

// The grants of a token that the process has to itself.
void Storm::addOwn(int nProcess, const Tokens& found, Tally& tally)
{
    int nGranted = 0;
    for (int nRound = 0; nRound < m_plan.nRounds; ++nRound) {
        nGranted += 0 == round(nProcess, nRound).nGrantedOwn;
    }
    const int64_t nSpent = m_plan.nRounds + 1 - found.at(nameOf("own", nProcess));
    for (int nRound = 0; nRound < m_plan.nRounds; ++nRound) {
        addChange(nRound < nGranted, nRound < nSpent, tally);
    }
}

Tally Storm::tally()
{
    const Tokens found = m_calls.tokens();
    Tally tally;
    for (int nProcess = 0; nProcess < m_plan.nProcesses; ++nProcess) {
        addOwn(nProcess, found, tally);
        for (int nRound = 0; nRound < m_plan.nRounds; ++nRound) {
            const Round& told = round(nProcess, nRound);
            addChange(0 == told.nCreated, 0 != found.count(nameOf("new", nProcess, nRound)), tally);
            tally.nGranted += 0 == told.nGrantedShared;

            // A grant can write the token back, so what is there may have been deleted.
            const bool blThere = 0 != found.count(nameOf("revoked", nProcess, nRound));
            const bool blTold = 1 == told.nRevoked;
            addChange(blTold, blTold || !blThere, tally);
            tally.nDeletions += blTold;
            tally.nUndone += blTold && blThere;
        }
    }
    const auto shared = found.find("shared");
    tally.nSpent = m_plan.sharedUses() - (found.end() == shared ? 0 : shared->second);
    return tally;
}

void expectExact(const Plan& plan, const Tally& tally)
{
    EXPECT_EQ(0, tally.nFailed);
    EXPECT_EQ(0, tally.nFalse);
    EXPECT_EQ(plan.sharedUses(), tally.nGranted);
    EXPECT_EQ(plan.sharedUses(), tally.nSpent);
    EXPECT_EQ(plan.roundsOfAll(), tally.nDeletions);
    EXPECT_EQ(0, tally.nUndone);
}

void print(const Plan& plan, const Tally& tally)
{
    figure("Storm", stormName(plan.nProcesses, plan.calls, tally.nCalls) + ": failed though done " +
                        share(tally.nFalse, tally.nCalls) + ", failed " + share(tally.nFailed, tally.nCalls) +
                        ", grants beyond count " +
                        share(std::max<int64_t>(0, tally.nGranted - tally.nSpent), tally.nGranted) +
                        ", deletions undone " + share(tally.nUndone, tally.nDeletions));
}

void raise(Calls calls)
{
    for (const int nProcesses : stormSizes()) {
        SCOPED_TRACE(nProcesses);
        const Plan plan = {calls, nProcesses, static_cast<int>(scaled(std::max(4, 64 / nProcesses)))};
        Storm storm(plan);
        EXPECT_EQ(0, runProcesses(nProcesses, [&](int nProcess) { storm.takePart(nProcess); }));
        const Tally tally = storm.tally();
        EXPECT_EQ(0, tally.nMissing);
        if (Calls::Serialised == calls || 1 == nProcesses) {
            expectExact(plan, tally);
        }
        print(plan, tally);
    }
}

} // namespace

TEST(Storm, OfPlainCallsEndsAndCorruptsNothing)
{
    raise(Calls::Plain);
}

TEST(Storm, OfSerialisedCallsIsExact)
{
    raise(Calls::Serialised);
}
