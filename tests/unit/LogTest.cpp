// The two switches, the two destinations and the forms of log lines.

#include <climits>
#include <cstring>
#include <new>
#include <ostream>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StandIns.h"
#include "Statements.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::checkPermission;
using VEMO_ACCESS_TOKEN::debugInfo;
using VEMO_ACCESS_TOKEN::debugInfoGet;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::logToStdout;
using VEMO_ACCESS_TOKEN::logToStdoutGet;

namespace {

bool g_blOpenlog = false;

} // namespace

// The identity of the lines in the system log is the process's own affair.
extern "C" void openlog(const char*, int, int)
{
    g_blOpenlog = true;
}

namespace {

// Logs as the library does when nobody has said anything.
class Unswitched : public SeamTest {
protected:
    Unswitched() : SeamTest(Destination::Syslog) {}
};

class Switch : public Unswitched {
protected:
    static void expectLatch(bool (*pSwitch)(bool), bool (*pGet)(), bool (*pGetOther)())
    {
        EXPECT_FALSE(pGet());
        EXPECT_FALSE(pSwitch(false));
        EXPECT_FALSE(pGet());
        EXPECT_TRUE(pSwitch(true));
        EXPECT_TRUE(pGet());
        EXPECT_TRUE(pSwitch(false));
        EXPECT_TRUE(pGet());
        EXPECT_TRUE(pSwitch(true));
        EXPECT_FALSE(pGetOther());
        EXPECT_EQ(Texts{}, seam().calls);
    }
};

TEST_F(Switch, LogToStdoutNeverGoesOff)
{
    expectLatch(logToStdout, logToStdoutGet, debugInfoGet);
}

TEST_F(Switch, DebugInfoNeverGoesOff)
{
    expectLatch(debugInfo, debugInfoGet, logToStdoutGet);
}

// What one call logs at each destination and errno.
struct Setting {
    const char* szTestName;
    Destination destination;
    int nErrno;
};

std::ostream& operator<<(std::ostream& stream, const Setting& setting)
{
    return stream << setting.szTestName;
}

class LineForm : public SeamTest, public ::testing::WithParamInterface<Setting> {
protected:
    LineForm() : SeamTest(GetParam().destination) {}

    void SetUp() override
    {
        SeamTest::SetUp();
        errno = GetParam().nErrno;
    }

    std::string line(const std::string& strLocation, const std::string& strMessage) const
    {
        const bool blErrno = Destination::Syslog == destination() && 0 != GetParam().nErrno;
        return strLocation + " " + (blErrno ? "(" + errorText() + ")" : "") + strMessage;
    }

    // Expects that this one line was written, and errno kept.
    void expectLine(const std::string& strLocation, const std::string& strMessage)
    {
        EXPECT_EQ(GetParam().nErrno, errno);
        EXPECT_EQ((Texts{Destination::Stdout == destination() ? "printf" : "syslog 3"}),
                  seam().callsOf({"printf", "syslog"}));
        EXPECT_EQ((Texts{line(strLocation, strMessage)}), takeLines(destination()));
        EXPECT_FALSE(g_blOpenlog);
    }

    std::string errorText() const { return strerror(GetParam().nErrno); }
};

INSTANTIATE_TEST_SUITE_P(Settings, LineForm,
                         ::testing::Values(Setting{"StdoutWithoutErrno", Destination::Stdout, 0},
                                           Setting{"StdoutWithErrno", Destination::Stdout, EACCES},
                                           Setting{"SyslogWithoutErrno", Destination::Syslog, 0},
                                           Setting{"SyslogWithErrno", Destination::Syslog, EACCES},
                                           Setting{"SyslogWithUnknownErrno", Destination::Syslog, 4095}),
                         [](const auto& testInfo) { return testInfo.param.szTestName; });

TEST_P(LineForm, OfAnOrdinaryLine)
{
    Json::Value jToken(Json::objectValue);

    EXPECT_EQ(-1, fillDefaultValue(jToken, true));

    expectLine("include/internal/vemo-access-token-data-member:2", "lost data member=tid\n");
}

TEST_P(LineForm, OfAFailureCheck)
{
    Json::Value jToken;

    EXPECT_EQ(-1, checkJsonType(jToken));

    expectLine("util.cpp:#", "(util.cpp:#)(" + errorText() +
                                 ")Failed [!jTokenParam.isObject()], err=" + errorText() + "\n\n");
}

TEST_P(LineForm, OfAFailureCheckInTheFieldList)
{
    Json::Value jToken = json(R"({"tid":""})");
    AccessTokenDbApi db;

    EXPECT_EQ(-1, db.tokenSave(jToken, true));

    expectLine("include/internal/vemo-access-token-data-member:4",
               "(include/internal/vemo-access-token-data-member:4)(" + errorText() +
                   ")Failed [!jParam.isMember(\"bind_sid\")], err=" + errorText() + "\n\n");
}

TEST_P(LineForm, OfAFailureWithAMessageOfItsOwn)
{
    Json::Value jToken = json(R"({"count":"5"})");

    EXPECT_EQ(-1, checkJsonType(jToken));

    expectLine("util.cpp:#", "(util.cpp:#)(" + errorText() +
                                 ")type failed, jmList[i]=count, jTokenParam={\"count\":\"5\"}\n\n");
}

TEST_P(LineForm, OfADebugLine)
{
    Json::Value jToken = json(R"({"webapi_allow":{"Api":{"method":[]}}})");
    debugInfo(true);

    EXPECT_EQ(0, checkPermission(jToken, "Api", "get"));

    expectLine("util.cpp:#", "webapi=Api , method=get, not in allow list, "
                             "jToken={\"webapi_allow\":{\"Api\":{\"method\":[]}}}\n");
}

TEST_P(LineForm, OfNothingForADebugLineWithoutDebug)
{
    Json::Value jToken = json(R"({"webapi_allow":{"Api":{"method":[]}}})");

    EXPECT_EQ(0, checkPermission(jToken, "Api", "get"));
    EXPECT_EQ(-1, checkPermission(jToken, "Other", "get"));

    EXPECT_EQ(GetParam().nErrno, errno);
    EXPECT_EQ(Texts{}, seam().calls);
}

TEST_P(LineForm, HoldsTextOfCallersAsItIs)
{
    Json::Value jToken = json(R"({"webapi_allow":{}})");
    debugInfo(true);

    EXPECT_EQ(-1, checkPermission(jToken, "%m %n\n%s", "get"));

    EXPECT_EQ((Texts{line("util.cpp:#", "webapi=%m %n\n%s not in allow list, jToken={\"webapi_allow\":{}}\n"),
                     line("util.cpp:#", "jToken={\"webapi_allow\":{}}\n")}),
              takeLines(destination()));
}

TEST_P(LineForm, TellsErrnoAlthoughItsArgumentsChangeIt)
{
    Json::Value jToken = json(R"({"count":"5"})");
    VEMO_ACCESS_TOKEN::tokenType();         // made now, so that the line's arguments are the only allocations
    g_pAllocation = [] { errno = EAGAIN; }; // and succeeds
    errno = GetParam().nErrno;

    const int nResult = checkJsonType(jToken);

    g_pAllocation = nullptr;
    EXPECT_EQ(-1, nResult);
    expectLine("util.cpp:#", "(util.cpp:#)(" + errorText() +
                                 ")type failed, jmList[i]=count, jTokenParam={\"count\":\"5\"}\n\n");
}

TEST_F(Unswitched, LinesMoveToStdoutFromTheMomentOfTheSwitch)
{
    Json::Value jToken;

    fillDefaultValue(jToken, true);
    logToStdout(true);
    fillDefaultValue(jToken, true);
    logToStdout(false);
    fillDefaultValue(jToken, true);

    EXPECT_EQ((Texts{"syslog 3", "printf", "printf"}), seam().calls);
}

TEST_F(Unswitched, DebugLinesStartAtTheMomentOfTheSwitch)
{
    Json::Value jToken = json(R"({"webapi_allow":{}})");

    checkPermission(jToken, "Api", "get");
    EXPECT_EQ(Texts{}, seam().calls);
    debugInfo(true);
    checkPermission(jToken, "Api", "get");
    debugInfo(false);
    checkPermission(jToken, "Api", "get");

    EXPECT_EQ((Texts{"syslog 3", "syslog 3", "syslog 3", "syslog 3"}), seam().calls);
}

// One failure that several functions report on its way up. Writing to the system log leaves an errno
// of its own behind (the seam's does), which must not show in the lines that follow.
class FailureOnItsWayUp : public Unswitched {};

TEST_F(FailureOnItsWayUp, TellsOneErrnoInEveryLine)
{
    const std::string strTid = tid("a");
    const std::string strRecord = R"({"count":1,"tid":")" + strTid + "\"}";
    Json::Value jToken = json(strRecord);
    seam().fail("seteuid", EPERM, 1, INT_MAX);
    AccessTokenApi api;
    seam().lines.clear();
    errno = 0;
    debugInfo(true);

    EXPECT_EQ(-1, api.tokenCountDegrade(jToken));

    const Texts lines = {failed(STORE, "0 > (err = runSql())", EPERM),
                         failed(SERVICE, "0 > (err = m_pDb->tokenDelete(jParam))", EPERM),
                         ordinary(SERVICE, "tokenDeleteByArray failed, name=tid, strVector=" + strTid),
                         failed(SERVICE, "0 > (err = tokenDeleteByArray(strVector, szName))", EPERM),
                         ordinary(SERVICE, "tokenDeleteByName failed, name=tid, strValue=" + strTid),
                         failed(SERVICE, "0 > tokenDeleteByTid(strTid)", EPERM),
                         ordinary(SERVICE, "tokenCountDegrade failed, jToken=" + strRecord)};
    EXPECT_EQ(inSystemLog(NOT_OPENED + lines, EPERM), takeLines(Destination::Syslog));
    EXPECT_EQ(Texts(10, "syslog 3"), seam().callsOf({"syslog", "printf"}));
    EXPECT_EQ(EPERM, errno);
}

// SQLite reports by its error text, and errno is whatever it left, zero included.
TEST_F(FailureOnItsWayUp, TellsTheErrnoThatSqliteLeft)
{
    AccessTokenDbApi db;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db.m_pDb));

    for (const int nErrno : {0, EIO, 0}) {
        SCOPED_TRACE(nErrno);
        failStatements(PURGE, {SQLITE_IOERR, "disk I/O error", nErrno});

        EXPECT_EQ(-1, db.cleanExpireToken(true));

        const Texts lines =
            failureOf(PURGE, "disk I/O error", nErrno) + Texts{fail(STORE, "run sql failed", nErrno)};
        EXPECT_EQ(inSystemLog(lines, nErrno), takeLines(Destination::Syslog));
        EXPECT_EQ(nErrno, errno);
    }
}

} // namespace
