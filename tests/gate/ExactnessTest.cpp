// Replies and the uses that are spent agree, whatever happens to the gate.

#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>
#include <vector>

#include "AccessTokenUtil.h"
#include "CallLock.h"
#include "Figures.h"
#include "Operations.h"
#include "RunningGate.h"
#include "TokenStore.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

namespace {

const int CLIENTS = 8;
const int USES = 1000000;
const char* const TARGET = "/grant/Example.Api/get";

// How clients fared.
struct Tally {
    std::atomic<int64_t> nGranted{0};
    std::atomic<int64_t> nRefused{0};
    std::atomic<int64_t> nUnanswered{0}; // the connection ended
    std::atomic<int64_t> nTurnedAway{0}; // there was none
    std::atomic<int64_t> nFailed{0};

    void count(const std::string& strStatus)
    {
        ++("200" == strStatus                 ? nGranted
           : "403" == strStatus               ? nRefused
           : "" == strStatus                  ? nUnanswered
           : GateClient::REFUSED == strStatus ? nTurnedAway
                                              : nFailed);
    }
};

class Exactness : public ::testing::Test {
protected:
    Exactness()
    {
        VEMO_ACCESS_TOKEN::tokenType(); // before there are threads
        create(0, USES);
        create(1, USES);
    }

    static void create(int nToken, int nUses)
    {
        unsigned int uid = 0;
        std::string strFunction = "test";
        std::string strTid = idOf(std::to_string(nToken));
        Json::Value jOption;
        jOption["count"] = nUses;
        jOption["webapi_allow"]["Example.Api"]["method"].append("get");
        ASSERT_EQ(0, VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid));
    }

    static int64_t usesLeft()
    {
        AccessTokenDbApi db;
        Json::Value jFilter(Json::objectValue);
        Json::Value jTokens(Json::arrayValue);
        db.tokenGet(jFilter, jTokens);
        int64_t nLeft = 0;
        for (const Json::Value& jToken : jTokens) {
            nLeft += jToken["count"].asInt64();
        }
        return nLeft;
    }

    // Clients that call one token after another until they are told to stop, or the connection ends.
    void startClients(int nTokens, bool blConnectEachTime = false)
    {
        m_blStop = false;
        for (int i = 0; i < CLIENTS; ++i) {
            m_threads.emplace_back([this, i, nTokens, blConnectEachTime] {
                GateClient client(m_strSocket);
                for (int nCall = i; !m_blStop; ++nCall) {
                    const std::string strStatus = client.call(idOf(std::to_string(nCall % nTokens)), TARGET);
                    m_tally.count(strStatus);
                    if (blConnectEachTime) {
                        client.close();
                    } else if (strStatus.empty() || GateClient::REFUSED == strStatus) {
                        return;
                    }
                }
            });
        }
    }

    void stopClients()
    {
        m_blStop = true;
        for (std::thread& thread : m_threads) {
            thread.join();
        }
        m_threads.clear();
    }

    const TokenStore m_store;
    const std::string m_strSocket = m_store.directory() + "/calls";
    Tally m_tally;
    std::vector<std::thread> m_threads;
    std::atomic<bool> m_blStop{false};
};

// One that dies takes the other along. What was answered is spent, and of the rest no more than was under
// way.
class Killed : public Exactness {
protected:
    void killSome(const char* szName, pid_t (RunningGate::*victim)() const)
    {
        const int64_t nRounds = scaled(10);
        int64_t nSpentUnanswered = 0;
        std::mt19937_64 random(seed());
        for (int64_t nRound = 0; nRound < nRounds && !HasFailure(); ++nRound) {
            const int64_t nBefore = usesLeft() + m_tally.nGranted;
            const int64_t nUnansweredBefore = m_tally.nUnanswered;
            RunningGate gate(m_strSocket);
            startClients(2);
            usleep(static_cast<useconds_t>(random() % 100000));
            kill((gate.*victim)(), SIGKILL);
            EXPECT_NE(0, gate.wait());
            stopClients();
            const int64_t nExtra = nBefore - usesLeft() - m_tally.nGranted;
            EXPECT_LE(0, nExtra) << "a use was answered and not spent; seed " << seed();
            EXPECT_GE(m_tally.nUnanswered - nUnansweredBefore, nExtra) << "seed " << seed();
            nSpentUnanswered += nExtra;
        }
        EXPECT_EQ(0, m_tally.nFailed + m_tally.nRefused);
        figure(szName, std::to_string(nRounds) + " kills among " + std::to_string(m_tally.nGranted) +
                           " grants; nothing answered was lost; of " + std::to_string(m_tally.nUnanswered) +
                           " calls without an answer " + std::to_string(nSpentUnanswered) + " were made");
    }
};

} // namespace

TEST_F(Exactness, GrantsAreTheUsesSpentBesideOtherPrograms)
{
    create(2, 10);
    std::atomic<int64_t> nByLibrary{0};
    {
        RunningGate gate(m_strSocket);
        const int64_t nBefore = usesLeft();
        startClients(3);
        for (int i = 0; i < 2; ++i) {
            m_threads.emplace_back([this, &nByLibrary, i] {
                for (int nCall = i; !m_blStop; ++nCall) {
                    std::string strTid = idOf(std::to_string(nCall % 3));
                    Json::Value jToken;
                    CallLock lock;
                    const bool blGranted = 0 == VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken);
                    nByLibrary += blGranted;
                    // Nothing is in the way of a call under the lock, so a refusal is one.
                    EXPECT_TRUE(blGranted || 2 == nCall % 3);
                }
            });
        }
        for (int i = 0; i < 1000 && (i < 50 || 0 == m_tally.nRefused || 0 == nByLibrary); ++i) {
            usleep(10000);
        }
        stopClients();
        EXPECT_EQ(nBefore - usesLeft(), m_tally.nGranted + nByLibrary);
        EXPECT_EQ(0, gate.stop());
    }
    EXPECT_LT(0, nByLibrary);
    EXPECT_LT(0, m_tally.nRefused) << "the third token has 10 uses";
    EXPECT_EQ(0, m_tally.nUnanswered + m_tally.nTurnedAway + m_tally.nFailed);
    figure("gate beside callers of the library under the call lock",
           std::to_string(m_tally.nGranted) + " and " + std::to_string(nByLibrary) +
               " grants, all of them exact");
}

TEST_F(Exactness, CallsAreAnsweredWhileAnotherProgramHoldsTheLock)
{
    const RunningGate gate(m_strSocket);
    GateClient client(m_strSocket);
    const int64_t nBefore = usesLeft();
    {
        const CallLock lock;
        EXPECT_EQ("503", client.call(idOf("0"), TARGET));
        EXPECT_EQ(nBefore, usesLeft());
    }
    usleep(20000);
    // The gate had its turn when nobody waited for it any more, and did not keep it.
    EXPECT_NO_THROW(CallLock(CallLock::FILE_OF_ALL, std::chrono::milliseconds(500)));
    EXPECT_EQ("200", client.call(idOf("0"), TARGET));
    EXPECT_EQ(nBefore - 1, usesLeft());
}

TEST_F(Killed, TheOneThatHoldsTheTokens)
{
    killSome("gate, its parent killed", &RunningGate::parent);
}

TEST_F(Killed, TheOneThatReadsHttp)
{
    killSome("gate, its child killed", &RunningGate::child);
}

// Whoever comes while one gate hands over to the next is served by either.
TEST_F(Exactness, NobodyIsTurnedAwayWhileAnotherTakesOver)
{
    const int64_t nBefore = usesLeft();
    auto pGate = std::make_unique<RunningGate>(m_strSocket);
    startClients(2, true);
    for (int i = 0; i < 5; ++i) {
        auto pNext = std::make_unique<RunningGate>(m_strSocket);
        EXPECT_EQ(0, pGate->stop());
        pGate = std::move(pNext);
    }
    stopClients();
    EXPECT_EQ(nBefore - usesLeft(), m_tally.nGranted);
    EXPECT_LT(0, m_tally.nGranted);
    EXPECT_EQ(0, m_tally.nUnanswered + m_tally.nTurnedAway + m_tally.nRefused + m_tally.nFailed);
}
