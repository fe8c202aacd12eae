// The two switches of the log, its two destinations, and the forms of its lines. All unit tests run with both
// destinations.

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::checkPermission;
using VEMO_ACCESS_TOKEN::debugInfo;
using VEMO_ACCESS_TOKEN::debugInfoGet;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::logToStdout;
using VEMO_ACCESS_TOKEN::logToStdoutGet;
using VEMO_ACCESS_TOKEN::tokenType;

// The process chooses the name under which its lines are in the system log, not the library.
extern "C" void openlog(const char*, int, int)
{
    ADD_FAILURE() << "the library calls openlog";
}

namespace {

void missTheId()
{
    Json::Value jToken(Json::objectValue);
    EXPECT_EQ(-1, fillDefaultValue(jToken, true));
}

void askForAnApi(const char* szMethod)
{
    Json::Value jToken = json(R"({"webapi_allow":{"Api":{"method":[]}}})");
    EXPECT_EQ(0, checkPermission(jToken, "Api", szMethod));
}

void checkACountOfText()
{
    Json::Value jToken = json(R"({"count":"5"})");
    EXPECT_EQ(-1, checkJsonType(jToken));
}

// The log before any switch is set.
class Log : public SeamTest {
protected:
    Log() { m_blStdout = false; }
};

TEST_F(Log, FollowsItsTwoSwitchesWhichStayOn)
{
    bool blOn = false;
    for (const bool blSwitch : {false, true, false, true}) {
        blOn = blOn || blSwitch;
        EXPECT_EQ(blOn, debugInfo(blSwitch));
        EXPECT_EQ(blOn, debugInfoGet());
        EXPECT_FALSE(logToStdoutGet());
        missTheId();
        askForAnApi("get");
        EXPECT_EQ(blOn ? 2u : 1u, takeLines().size());
    }
    blOn = false;
    for (const bool blSwitch : {false, true, false, true}) {
        blOn = blOn || blSwitch;
        EXPECT_EQ(blOn, logToStdout(blSwitch));
        EXPECT_EQ(blOn, logToStdoutGet());
        missTheId();
        EXPECT_LINES(ordinary(fieldList(2), "lost data member=tid"));
        EXPECT_NE(blOn, seam().blInSystemLog);
    }
}

class LogLine : public SeamTest {};

TEST_F(LogLine, HasOneOfFiveFormsAndLeavesErrno)
{
    AccessTokenDbApi db;
    debugInfo(true);
    for (const int nErrno : {0, EACCES, 4095}) {
        const std::string strError = std::string("(") + strerror(nErrno) + ")";
        const auto writes = [&](const std::string& strLine, auto operate) {
            errno = nErrno;
            operate();
            EXPECT_EQ(nErrno, errno);
            EXPECT_EQ(strLine + "\n", takeLines().back());
        };
        writes("include/internal/vemo-access-token-data-member:2 lost data member=tid", missTheId);
        writes("util.cpp:# (util.cpp:#)" + strError +
                   "Failed [!jTokenParam.isObject()], err=" + strerror(nErrno) + "\n",
               [] {
                   Json::Value jToken;
                   EXPECT_EQ(-1, checkJsonType(jToken));
               });
        writes("include/internal/vemo-access-token-data-member:4 "
               "(include/internal/vemo-access-token-data-member:4)" +
                   strError + "Failed [!jParam.isMember(\"bind_sid\")], err=" + strerror(nErrno) + "\n",
               [&] {
                   Json::Value jToken = json(R"({"tid":""})");
                   EXPECT_EQ(-1, db.tokenSave(jToken, true));
               });
        writes("util.cpp:# (util.cpp:#)" + strError +
                   "type failed, jmList[i]=count, jTokenParam={\"count\":\"5\"}\n",
               checkACountOfText);
        writes("util.cpp:# webapi=Api , method=%m %n\n%s, not in allow list, "
               "jToken={\"webapi_allow\":{\"Api\":{\"method\":[]}}}",
               [] { askForAnApi("%m %n\n%s"); });
        takeLines();
    }
}

TEST_F(LogLine, ShowsErrnoEvenIfItsArgumentsChangeIt)
{
    tokenType(); // made now, so that only the line's arguments allocate
    Json::Value jToken = json(R"({"count":"5"})");
    g_pAllocation = [] { errno = EAGAIN; }; // the allocation succeeds
    errno = EACCES;
    const int nResult = checkJsonType(jToken);
    g_pAllocation = nullptr;
    EXPECT_FAILURE(nResult, fail(UTIL, R"(type failed, jmList[i]=count, jTokenParam={"count":"5"})", EACCES));
}

} // namespace
