// The service's purge of expired tokens.

#include <climits>

#include "AccessTokenUtil.h"
#include "FourTokens.h"
#include "Statements.h"

namespace {

class ServicePurge : public FourTokens {};

TEST_F(ServicePurge, DeletesWhatLiesBeforeNow)
{
    const char* const before[] = {"-1", "-9223372036854775808", "0", "1699999999"};
    const char* const after[] = {"1700000000", "1700000001", "9223372036854775807", "NULL"};
    for (const auto& deadlines : {before, after}) {
        for (int i = 0; i < 4; ++i) {
            insertToken(deadlines[i], "", "VPN", deadlines[i]);
        }
    }

    EXPECT_EQ(0, api().cleanExpireToken(true));

    EXPECT_EQ((Texts{"sqlite3_exec " + PURGE, "sqlite3_changes"}), seam().callsOf(OPENING_CALLS));
    EXPECT_EQ("1700000000 1700000001 9223372036854775807 NULL a a'b b c", tids());
    EXPECT_EQ(Texts{}, takeLines());
}

// Nothing protects -1: no deadline stands for "never".
TEST_F(ServicePurge, TakesATokenWhoseDeadlineWasSetToMinusOne)
{
    std::string strTid = "a";
    Json::Value jParam = json(R"({"deadline": -1})");
    ASSERT_EQ(0, api().tokenUpdateByTid(strTid, jParam));
    ASSERT_EQ((Texts{"a"}), query("SELECT tid FROM token WHERE deadline = -1"));

    EXPECT_EQ(0, api().cleanExpireToken(false));

    EXPECT_EQ("a'b b c", tids());
}

TEST_F(ServicePurge, TracesItsStatementInDebugMode)
{
    seam().clock = NOW + 101;
    VEMO_ACCESS_TOKEN::debugInfo(true);

    EXPECT_EQ(0, api().cleanExpireToken(false));

    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + PURGE), ordinary(STORE, "change rv=4, run sql=" + PURGE)}),
              takeLines());
}

struct PurgeFailure {
    const char* szName;
    void (*arrange)();
    Texts always; // the lines below the purge
    Texts debug;  // the same in debug mode
    std::string strOwn;
    int nErrno;
};

void PrintTo(const PurgeFailure& failure, std::ostream* pStream)
{
    *pStream << failure.szName;
}

const std::string RUN_LINE = ordinary(STORE, "run sql=" + PURGE);
const std::string CHANGE = ordinary(STORE, "change rv=0, run sql=" + PURGE);
const std::string LOCK_LINE = ordinary(STORE, "i=0,run sql failed, error=database is locked, sql=" + PURGE);
const Texts NOT_RUN = failureOf(PURGE, DISK_ERROR.szError, EIO);

const PurgeFailure PURGE_FAILURES[] = {{"StatementRefused", [] { failStatements(PURGE, DISK_ERROR); },
                                        NOT_RUN, Texts{RUN_LINE} + NOT_RUN, "run sql failed", EIO},
                                       {"LockWaitedOut",
                                        [] { failStatements(PURGE, LOCKED); },
                                        {},
                                        {RUN_LINE, LOCK_LINE, RUN_LINE, CHANGE},
                                        "sql error, sql=" + PURGE,
                                        EIO},
                                       {"DatabaseNotOpened",
                                        [] { seam().fail("seteuid", EPERM, 1, INT_MAX); }, NOT_OPENED,
                                        NOT_OPENED, "run sql failed", EPERM}};

class ServicePurgeFails : public FourTokens,
                          public ::testing::WithParamInterface<std::tuple<PurgeFailure, bool, bool>> {};

// The purge's own lines can be kept quiet; those that the store writes for any statement cannot.
TEST_P(ServicePurgeFails, WithTheLinesThatWereAskedFor)
{
    const auto& [failure, blLogErr, blDebug] = GetParam();
    failure.arrange();
    AccessTokenApi another;
    takeLines();
    VEMO_ACCESS_TOKEN::debugInfo(blDebug);

    EXPECT_EQ(-1, another.cleanExpireToken(blLogErr));

    Texts expected = blDebug ? failure.debug : failure.always;
    if (blLogErr || blDebug) {
        expected.push_back(fail(STORE, failure.strOwn, failure.nErrno));
    }
    if (blLogErr) {
        expected.push_back(failed(SERVICE, "0 > m_pDb->cleanExpireToken(blLogErr)", failure.nErrno));
    } else if (blDebug) {
        expected.push_back(fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)", failure.nErrno));
    }
    EXPECT_EQ(expected, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Failures, ServicePurgeFails,
                         ::testing::Combine(::testing::ValuesIn(PURGE_FAILURES), ::testing::Bool(),
                                            ::testing::Bool()),
                         [](const auto& test) {
                             return std::get<0>(test.param).szName +
                                    std::string(std::get<1>(test.param) ? "Loud" : "Quiet") +
                                    (std::get<2>(test.param) ? "Debug" : "");
                         });

} // namespace
