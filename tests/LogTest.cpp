// The two switches, the two destinations and the forms of log lines.

#include <climits>
#include <cstring>
#include <ostream>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
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
class Unswitched : public ::testing::Test {
protected:
    void SetUp() override
    {
        seam() = Seam();
        errno = 0;
    }
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
        EXPECT_EQ((std::vector<std::string>{}), seam().calls);
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
    bool blStdout;
    int nErrno;
};

std::ostream& operator<<(std::ostream& stream, const Setting& setting)
{
    return stream << setting.szTestName;
}

class LineForm : public Unswitched, public ::testing::WithParamInterface<Setting> {
protected:
    void SetUp() override
    {
        logToStdout(GetParam().blStdout);
        Unswitched::SetUp();
        errno = GetParam().nErrno;
    }

    Destination destination() const
    {
        return GetParam().blStdout ? Destination::Stdout : Destination::Syslog;
    }

    std::string line(const std::string& strLocation, const std::string& strMessage) const
    {
        const bool blErrno = !GetParam().blStdout && 0 != GetParam().nErrno;
        return strLocation + " " + (blErrno ? "(" + errorText() + ")" : "") + strMessage;
    }

    // Expects that this one line was written, and errno kept.
    void expectLine(const std::string& strLocation, const std::string& strMessage)
    {
        EXPECT_EQ(GetParam().nErrno, errno);
        EXPECT_EQ((std::vector<std::string>{GetParam().blStdout ? "printf" : "syslog 3"}),
                  seam().callsOf({"printf", "syslog"}));
        EXPECT_EQ((std::vector<std::string>{line(strLocation, strMessage)}), takeLines(destination()));
        EXPECT_FALSE(g_blOpenlog);
    }

    std::string errorText() const { return strerror(GetParam().nErrno); }
};

INSTANTIATE_TEST_SUITE_P(Settings, LineForm,
                         ::testing::Values(Setting{"StdoutWithoutErrno", true, 0},
                                           Setting{"StdoutWithErrno", true, EACCES},
                                           Setting{"SyslogWithoutErrno", false, 0},
                                           Setting{"SyslogWithErrno", false, EACCES},
                                           Setting{"SyslogWithUnknownErrno", false, 4095}),
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
    EXPECT_EQ((std::vector<std::string>{}), seam().calls);
}

TEST_P(LineForm, HoldsTextOfCallersAsItIs)
{
    Json::Value jToken = json(R"({"webapi_allow":{}})");
    debugInfo(true);

    EXPECT_EQ(-1, checkPermission(jToken, "%m %n\n%s", "get"));

    EXPECT_EQ((std::vector<std::string>{
                  line("util.cpp:#", "webapi=%m %n\n%s not in allow list, jToken={\"webapi_allow\":{}}\n"),
                  line("util.cpp:#", "jToken={\"webapi_allow\":{}}\n")}),
              takeLines(destination()));
}

TEST_F(Unswitched, LinesMoveToStdoutFromTheMomentOfTheSwitch)
{
    Json::Value jToken;

    fillDefaultValue(jToken, true);
    logToStdout(true);
    fillDefaultValue(jToken, true);
    logToStdout(false);
    fillDefaultValue(jToken, true);

    EXPECT_EQ((std::vector<std::string>{"syslog 3", "printf", "printf"}), seam().calls);
}

TEST_F(Unswitched, DebugLinesStartAtTheMomentOfTheSwitch)
{
    Json::Value jToken = json(R"({"webapi_allow":{}})");

    checkPermission(jToken, "Api", "get");
    EXPECT_EQ((std::vector<std::string>{}), seam().calls);
    debugInfo(true);
    checkPermission(jToken, "Api", "get");
    debugInfo(false);
    checkPermission(jToken, "Api", "get");

    EXPECT_EQ((std::vector<std::string>{"syslog 3", "syslog 3", "syslog 3", "syslog 3"}), seam().calls);
}

// One failure that several functions report on its way up. Writing to the system log leaves an errno
// of its own behind (the seam's does), which must not show in the lines that follow.
class FailureOnItsWayUp : public Unswitched {
protected:
    static std::string systemFailure(const std::string& strFile, const std::string& strMessage, int nErrno)
    {
        const std::string strError = strerror(nErrno);
        return ordinary(strFile, "(" + strFile + ":#)(" + strError + ")" + strMessage + "\n", nErrno);
    }

    static std::string systemFailed(const std::string& strFile, const std::string& strCondition, int nErrno)
    {
        return systemFailure(strFile, "Failed [" + strCondition + "], err=" + strerror(nErrno), nErrno);
    }
};

TEST_F(FailureOnItsWayUp, TellsOneErrnoInEveryLine)
{
    const char* const DB = "AccessTokenSqlite.cpp";
    const char* const API = "AccessTokenApi.cpp";
    const std::string strTid = tid("a");
    const std::string strRecord = R"({"count":1,"tid":")" + strTid + "\"}";
    Json::Value jToken = json(strRecord);
    seam().fail("seteuid", EPERM, 1, INT_MAX);
    AccessTokenApi api;
    seam().lines.clear();
    errno = 0;
    debugInfo(true);

    EXPECT_EQ(-1, api.tokenCountDegrade(jToken));

    EXPECT_EQ((std::vector<std::string>{
                  systemFailed(DB, "0 > seteuid(0)", EPERM), systemFailed(DB, "0 > initDb()", EPERM),
                  systemFailed(DB, "0 > (err = runSql())", EPERM),
                  systemFailed(API, "0 > (err = m_pDb->tokenDelete(jParam))", EPERM),
                  ordinary(API, "tokenDeleteByArray failed, name=tid, strVector=" + strTid, EPERM),
                  systemFailed(API, "0 > (err = tokenDeleteByArray(strVector, szName))", EPERM),
                  ordinary(API, "tokenDeleteByName failed, name=tid, strValue=" + strTid, EPERM),
                  systemFailed(API, "0 > tokenDeleteByTid(strTid)", EPERM),
                  ordinary(API, "tokenCountDegrade failed, jToken=" + strRecord, EPERM)}),
              takeLines(Destination::Syslog));
    EXPECT_EQ(std::vector<std::string>(10, "syslog 3"), seam().callsOf({"syslog", "printf"}));
    EXPECT_EQ(EPERM, errno);
}

// SQLite reports by its error text, and errno is whatever it left, zero included.
TEST_F(FailureOnItsWayUp, TellsTheErrnoThatSqliteLeft)
{
    const char* const DB = "AccessTokenSqlite.cpp";
    const std::string strSql = "DELETE FROM token where deadline < strftime('%s', 'now');";
    AccessTokenDbApi db;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db.m_pDb));

    for (const int nErrno : {0, EIO, 0}) {
        SCOPED_TRACE(nErrno);
        seam().sqliteExec = [nErrno](sqlite3*, const char*, int (*)(void*, int, char**, char**), void*,
                                     char** pszError) {
            *pszError = sqlite3_mprintf("disk I/O error");
            errno = nErrno;
            return SQLITE_IOERR;
        };

        EXPECT_EQ(-1, db.cleanExpireToken(true));

        EXPECT_EQ((std::vector<std::string>{
                      ordinary(DB, "i=0,run sql failed, error=disk I/O error, sql=" + strSql, nErrno),
                      systemFailure(DB, "run sql failed, sql=" + strSql, nErrno),
                      systemFailure(DB, "run sql failed", nErrno)}),
                  takeLines(Destination::Syslog));
        EXPECT_EQ(nErrno, errno);
    }
}

} // namespace
