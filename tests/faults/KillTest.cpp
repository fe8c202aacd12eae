// Processes are killed in the middle of an operation, and leave the store as a crash does.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <map>
#include <random>

#include "FaultyVfs.h"
#include "Figures.h"
#include "Oracle.h"
#include "Processes.h"
#include "internal/AccessTokenDbApi.h"

namespace {

const Operation& CREATION = operations()[1];

typedef std::function<int()> Call;

class Kill : public ::testing::Test {
protected:
    // Runs the call in another process. Returns whether it was killed before it ended.
    bool isKilledIn(const Call& run)
    {
        const int nStatus = statusOf(startProcess([&] {
            alarm(60); // nobody waits for a call that hangs
            run();
        }));
        const bool blKilled = WIFSIGNALED(nStatus) && SIGKILL == WTERMSIG(nStatus);
        EXPECT_TRUE(blKilled || 0 == nStatus) << nStatus;
        return blKilled;
    }

    // How long the process lives if it is not killed: the shortest of ten runs.
    int64_t nanosecondsOf(const Operation& operation)
    {
        int64_t nShortest = INT64_MAX;
        for (int i = 0; i < 10; ++i) {
            prepareStore(m_store, operation);
            const auto start = std::chrono::steady_clock::now();
            isKilledIn(operation.run);
            const auto life = std::chrono::steady_clock::now() - start;
            nShortest = std::min<int64_t>(nShortest, std::chrono::nanoseconds(life).count());
        }
        return nShortest;
    }

    // What was left must be a state that the caller knows, for a reader and for the library's next call.
    void judge(const Operation& operation, const Oracle& oracle)
    {
        const Files files = m_store.files();
        const std::string strState = m_store.state();
        EXPECT_TRUE(oracle.allows(strState)) << strState;
        m_store.setFiles(files);
        if (STATE_NO_TABLE == strState) {
            EXPECT_EQ(-1, CREATION.run());
            EXPECT_EQ(0, AccessTokenDbApi().createTable());
        }
        EXPECT_EQ(0, CREATION.run());
        EXPECT_NE(std::string::npos, m_store.state().find("new||0|new|2|new|VPN"));
        if (operation.blCreatesStore) {
            const bool blHalf = STATE_MISSING == strState || STATE_NO_TABLE == strState;
            ++m_leftovers[blHalf ? strState : strState.empty() ? "no token" : "all"];
        }
    }

    // Kills each operation equally often.
    void killAll(const std::string& strName, int64_t nKills,
                 const std::function<Call(const Operation&)>& drawFatal)
    {
        int64_t nKilled = 0;
        int64_t nEnded = 0;
        for (const Operation& operation : operations()) {
            SCOPED_TRACE(operation.szName);
            const Oracle oracle(m_store, operation);
            const int64_t nEnough = nKilled + nKills / static_cast<int64_t>(operations().size());
            while (nKilled < nEnough && !HasFailure()) {
                const Call runFatally = drawFatal(operation);
                prepareStore(m_store, operation);
                if (!isKilledIn(runFatally)) {
                    ++nEnded;
                    continue;
                }
                ++nKilled;
                judge(operation, oracle);
            }
        }
        std::string strText =
            std::to_string(nKilled) + " killed, " + std::to_string(nEnded) + " ended before";
        for (const auto& [strLeft, nTimes] : m_leftovers) {
            strText += ", " + std::to_string(nTimes) + " first creations left " + strLeft;
        }
        figure("kill, " + strName, strText);
    }

    TokenStore m_store;
    std::map<std::string, int64_t> m_leftovers; // by a first creation
    std::mt19937_64 m_random{seed()};
};

int64_t countCalls(const Operation& operation)
{
    int64_t nCalls = 0;
    const FaultyVfs vfs([&](const FileCall&, const Call& real) {
        ++nCalls;
        return real();
    });
    operation.run();
    return nCalls;
}

// Dies before the call of that number, after it, or half-way if it is a write.
int runUntil(const Operation& operation, int64_t nFatal, uint64_t nWhere)
{
    int64_t nCalls = 0;
    const FaultyVfs vfs([&](const FileCall& call, const Call& real) {
        if (++nCalls < nFatal) {
            return real();
        }
        if (1 == nWhere) {
            real();
        } else if (2 == nWhere && 0 == strcmp("xWrite", call.szName)) {
            call.write(call.cb / 2);
        }
        return raise(SIGKILL);
    });
    return operation.run();
}

// The kernel kills the process after that time.
int runFor(const Operation& operation, int64_t nNanoseconds)
{
    sigevent event = {};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGKILL;
    timer_t timer;
    itimerspec when = {};
    when.it_value.tv_sec = nNanoseconds / 1000000000;
    when.it_value.tv_nsec = nNanoseconds % 1000000000;
    if (0 != timer_create(CLOCK_MONOTONIC, &event, &timer) || 0 != timer_settime(timer, 0, &when, nullptr)) {
        _exit(1);
    }
    return operation.run();
}

} // namespace

TEST_F(Kill, AtACallLeavesAStateThatTheCallerKnows)
{
    std::map<const char*, int64_t> calls;
    for (const Operation& operation : operations()) {
        prepareStore(m_store, operation);
        calls[operation.szName] = countCalls(operation);
    }
    killAll("at a call", scaled(500), [&](const Operation& operation) {
        const int64_t nFatal = 1 + static_cast<int64_t>(m_random() >> 1) % calls[operation.szName];
        const uint64_t nWhere = m_random() % 3;
        return [&operation, nFatal, nWhere] { return runUntil(operation, nFatal, nWhere); };
    });
}

TEST_F(Kill, AtAMomentLeavesAStateThatTheCallerKnows)
{
    std::map<const char*, int64_t> nanoseconds;
    for (const Operation& operation : operations()) {
        nanoseconds[operation.szName] = nanosecondsOf(operation);
    }
    killAll("at a moment", scaled(500), [&](const Operation& operation) {
        const int64_t nTime = 1 + static_cast<int64_t>(m_random() >> 1) % nanoseconds[operation.szName];
        return [&operation, nTime] { return runFor(operation, nTime); };
    });
}
