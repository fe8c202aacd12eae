// Processes are killed in the middle of an operation, and leave the store as after a crash.

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

// Kills the process before or after SQLite's call on files of that number, or in the middle of it if it is a
// write. Returns the number of calls.
int64_t runUntil(const Operation& operation, int64_t nFatal, uint64_t nWhere)
{
    int64_t nCalls = 0;
    const FaultyVfs vfs([&](const FileCall& call, const std::function<int()>& real) {
        if (++nCalls != nFatal) {
            return real();
        }
        if (1 == nWhere) {
            real();
        } else if (2 == nWhere && 0 == strcmp("xWrite", call.szName)) {
            call.write(call.cb / 2);
        }
        return raise(SIGKILL);
    });
    operation.run();
    return nCalls;
}

// The kernel kills the process after that time.
void runFor(const Operation& operation, int64_t nNanoseconds)
{
    sigevent event = {};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGKILL;
    timer_t timer;
    const itimerspec when = {{0, 0}, {nNanoseconds / 1000000000, nNanoseconds % 1000000000}};
    if (0 != timer_create(CLOCK_MONOTONIC, &event, &timer) || 0 != timer_settime(timer, 0, &when, nullptr)) {
        _exit(1);
    }
    operation.run();
}

class Kill : public ::testing::Test {
protected:
    // Runs it in another process. Returns whether that process was killed before its end.
    static bool isKilledIn(const std::function<void()>& run)
    {
        const int nStatus = statusOf(startProcess([&] {
            alarm(60); // ends a call that hangs
            run();
        }));
        const bool blKilled = WIFSIGNALED(nStatus) && SIGKILL == WTERMSIG(nStatus);
        EXPECT_TRUE(blKilled || 0 == nStatus) << nStatus;
        return blKilled;
    }

    // The store must be in a state that the caller knows, for a reader and for the library's next call.
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
            const std::string strLeft = blHalf ? strState : strState.empty() ? "no token" : "all";
            ++m_counts["first creations left " + strLeft];
        }
    }

    // Kills each operation equally often, each time at a number drawn from 1 to lifeOf(operation).
    void killAll(const std::string& strName, const std::function<int64_t(const Operation&)>& lifeOf,
                 const std::function<std::function<void()>(const Operation&, int64_t nFatal)>& fatal)
    {
        const int64_t nEach = scaled(500) / static_cast<int64_t>(operations().size());
        for (const Operation& operation : operations()) {
            SCOPED_TRACE(operation.szName);
            prepareStore(m_store, operation);
            const int64_t nLife = lifeOf(operation);
            const Oracle oracle(m_store, operation);
            for (int64_t nLeft = nEach; 0 < nLeft && !HasFailure();) {
                const auto run = fatal(operation, 1 + static_cast<int64_t>(m_random() >> 1) % nLife);
                prepareStore(m_store, operation);
                const bool blKilled = isKilledIn(run);
                ++m_counts[blKilled ? "killed" : "ended before"];
                if (blKilled) {
                    --nLeft;
                    judge(operation, oracle);
                }
            }
        }
        for (const auto& [strWhat, nTimes] : m_counts) {
            figure("kill, " + strName, std::to_string(nTimes) + " " + strWhat);
        }
    }

    const TokenStore m_store;
    std::map<std::string, int64_t> m_counts; // what happened, and how often
    std::mt19937_64 m_random{seed()};
};

} // namespace

TEST_F(Kill, AtACallLeavesAStateThatTheCallerKnows)
{
    killAll(
        "at a call", [](const Operation& operation) { return runUntil(operation, 0, 0); },
        [&](const Operation& operation, int64_t nFatal) {
            return [&operation, nFatal, nWhere = m_random() % 3] { runUntil(operation, nFatal, nWhere); };
        });
}

TEST_F(Kill, AtAMomentLeavesAStateThatTheCallerKnows)
{
    const auto nanosecondsOf = [&](const Operation& operation) { // of the shortest of ten runs
        int64_t nShortest = INT64_MAX;
        for (int i = 0; i < 10; ++i) {
            prepareStore(m_store, operation);
            const auto start = std::chrono::steady_clock::now();
            isKilledIn(operation.run);
            const auto life = std::chrono::steady_clock::now() - start;
            nShortest = std::min<int64_t>(nShortest, std::chrono::nanoseconds(life).count());
        }
        return nShortest;
    };
    killAll("at a moment", nanosecondsOf, [](const Operation& operation, int64_t nFatal) {
        return [&operation, nFatal] { runFor(operation, nFatal); };
    });
}
