// The two switches of the log, its two destinations, and the forms of its lines.

#include <cstring>
#include <filesystem>
#include <functional>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::checkPermission;
using VEMO_ACCESS_TOKEN::debugInfo;
using VEMO_ACCESS_TOKEN::debugInfoGet;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::logToStdout;
using VEMO_ACCESS_TOKEN::logToStdoutGet;
using VEMO_ACCESS_TOKEN::tokenType;

// The process decides the identity of its lines in the system log, not the library.
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

void askForAnApi(const char* szMethod = "get")
{
    Json::Value jToken = json(R"({"webapi_allow":{"Api":{"method":[]}}})");
    EXPECT_EQ(0, checkPermission(jToken, "Api", szMethod));
}

void checkACountOfText()
{
    Json::Value jToken = json(R"({"count":"5"})");
    EXPECT_EQ(-1, checkJsonType(jToken));
}

// The library logs as it does before any switch is set.
class Log : public TableTest {
protected:
    Log() { m_blStdout = false; }

    static void expectLatch(bool (*pSwitch)(bool), bool (*pGet)(), bool (*pGetOther)())
    {
        EXPECT_FALSE(pGet() || pSwitch(false) || pGet());
        EXPECT_TRUE(pSwitch(true) && pGet() && pSwitch(false) && pGet() && pSwitch(true));
        EXPECT_FALSE(pGetOther());
    }
};

TEST_F(Log, ToStdoutNeverGoesOff)
{
    expectLatch(logToStdout, logToStdoutGet, debugInfoGet);
}

TEST_F(Log, OfDebugLinesNeverGoesOff)
{
    expectLatch(debugInfo, debugInfoGet, logToStdoutGet);
}

TEST_F(Log, FollowsTheSwitchesAtOnce)
{
    missTheId();
    askForAnApi();
    EXPECT_EQ(1u, takeLines().size());
    debugInfo(true);
    askForAnApi();
    debugInfo(false);
    askForAnApi();
    EXPECT_EQ(2u, takeLines().size());
    const std::string strLine = ordinary(fieldList(2), "lost data member=tid");
    for (const bool blStdout : {false, true, false}) {
        logToStdout(blStdout);
        missTheId();
    }
    EXPECT_LINES("<3>" + strLine, strLine, strLine);
}

TEST_F(Log, WritesEachFormOfLine)
{
    AccessTokenDbApi db;
    debugInfo(true);
    for (const bool blStdout : {false, true}) {
        logToStdout(blStdout);
        for (const int nErrno : {0, EACCES, 4095}) {
            const std::string strError = strerror(nErrno);
            const std::string strErrno = blStdout || 0 == nErrno ? "" : "(" + strError + ")";
            const auto writes = [&](const std::string& strLocation, const std::string& strMessage,
                                    auto operate) {
                SCOPED_TRACE(strMessage);
                errno = nErrno;
                operate();
                EXPECT_EQ(nErrno, errno);
                EXPECT_LINES((blStdout ? "" : "<3>") + strLocation + " " + strErrno + strMessage);
            };
            writes("include/internal/vemo-access-token-data-member:2", "lost data member=tid\n", missTheId);
            writes("util.cpp:#",
                   "(util.cpp:#)(" + strError + ")Failed [!jTokenParam.isObject()], err=" + strError + "\n\n",
                   [] {
                       Json::Value jToken;
                       EXPECT_EQ(-1, checkJsonType(jToken));
                   });
            writes("include/internal/vemo-access-token-data-member:4",
                   "(include/internal/vemo-access-token-data-member:4)(" + strError +
                       ")Failed [!jParam.isMember(\"bind_sid\")], err=" + strError + "\n\n",
                   [&] {
                       Json::Value jToken = json(R"({"tid":""})");
                       EXPECT_EQ(-1, db.tokenSave(jToken, true));
                       seam().lines.erase(seam().lines.begin()); // the line of debug mode
                   });
            writes("util.cpp:#",
                   "(util.cpp:#)(" + strError +
                       ")type failed, jmList[i]=count, jTokenParam={\"count\":\"5\"}\n\n",
                   checkACountOfText);
            writes("util.cpp:#",
                   "webapi=Api , method=%m %n\n%s, not in allow list, "
                   "jToken={\"webapi_allow\":{\"Api\":{\"method\":[]}}}\n",
                   [] { askForAnApi("%m %n\n%s"); });
        }
    }
}

TEST_F(Log, TellsErrnoAlthoughTheArgumentsOfALineChangeIt)
{
    tokenType(); // made now, so that the line's arguments are the only allocations
    for (const bool blStdout : {false, true}) {
        logToStdout(blStdout);
        Json::Value jToken = json(R"({"count":"5"})");
        g_pAllocation = [] { errno = EAGAIN; }; // the allocation succeeds
        errno = EACCES;
        const int nResult = checkJsonType(jToken);
        g_pAllocation = nullptr;
        EXPECT_EQ(-1, nResult);
        const Texts lines = {
            fail(UTIL, R"(type failed, jmList[i]=count, jTokenParam={"count":"5"})", EACCES)};
        EXPECT_LINES(blStdout ? lines : inSystemLog(lines, EACCES));
    }
}

// Runs operations that together write every line of the library, while errno is nErrno.
class EveryLine : public Log {
protected:
    void SetUp() override
    {
        Log::SetUp();
        debugInfo(true);
        ASSERT_EQ(0, m_db.initDb());
    }

    void operate(int nErrno)
    {
        const Answer failure = {SQLITE_IOERR, "disk I/O error", nErrno};
        const Answer locked = {SQLITE_BUSY, "database is locked", nErrno};
        const Json::Value jType = tokenType()["uid"];
        Json::Value jNull;
        Json::Value jAll(Json::objectValue);
        Json::Value jArray(Json::arrayValue);
        Json::Value jNested = json(R"({"tid":{}})");
        Json::Value jToken = token();
        std::string strTid = "t", strNew = tid(), strEmpty, strFunction = "VPN";
        Texts none;
        unsigned int uid = 0;
        std::vector<std::function<void()>> operations = {
            [&] {
                seam().fail("operator new", nErrno);
                AccessTokenApi().cleanExpireToken(false);
            },
            [&] {
                seam().sqliteOpen = [=](const char*, sqlite3**) { return errno = nErrno, SQLITE_NOMEM; };
                AccessTokenDbApi().initDb();
                seam().sqliteOpen = nullptr;
            },
            [&] {
                std::filesystem::rename(path(), path() + ".aside");
                seam().fail("access", nErrno, 1, 9); // the file is missing, but errno is ours
                failStatements(SCHEMA, failure);
                AccessTokenDbApi().initDb();
                std::filesystem::rename(path() + ".aside", path());
            },
            [&] { AccessTokenDbApi().runSql(); },
            [&] { failStatements(PURGE, failure), api().cleanExpireToken(true); },
            [&] { failStatements(PURGE, locked), api().cleanExpireToken(false); },
            [&] { failStatements(PURGE, locked, 500), m_db.cleanExpireToken(true); },
            [&] { tokenType()["uid"][0] = "double", m_db.tokenGet(jAll, jArray), checkJsonType(jToken); },
            [&] { tokenType()["uid"] = "no array", m_db.tokenGet(jAll, jArray), tokenType()["uid"] = jType; },
            [&] { failStatements("SELECT", locked), m_db.tokenGet(jAll, jArray); },
            [&] { failStatements("REPLACE", locked), api().tokenSaveByOverwrite(jToken); },
            [&] {
                failStatements("INSERT", failure), api().tokenCreateByTid(uid, strFunction, jNull, strNew);
            },
            [&] { m_db.tokenDelete(jNested, true), api().tokenDeleteByTid(strEmpty); },
            [&] { api().tokenDeleteByTidArray(none), api().tokenCountDegrade(jNull), checkACountOfText(); },
            [&] {
                api().tokenGrant(strTid, "Api", "get", jToken),
                    api().tokenGrant(strTid, "Api", "put", jToken);
            },
            [&] { api().tokenGrant(strTid, "Else", "get", jToken); },
            [&] { failStatements("DELETE", locked), api().tokenDeleteAll(), api().tokenDeleteAll(); },
        };
        // For each field, the lines that it is overwritten and that it is missing: the token that is found
        // has no field.
        for (const Field& field : fields()) {
            operations.push_back([&] {
                char* noColumns[] = {nullptr};
                seam().sqliteExec = [&](sqlite3*, const char*, SqlCallback pCallback, void* pArgument,
                                        char**) { return pCallback(pArgument, 0, noColumns, noColumns); };
                Json::Value jChange = without(field.szName);
                api().tokenUpdateByTid(strTid, jChange);
            });
        }
        insert();
        for (const auto& operation : operations) {
            errno = nErrno;
            operation();
            EXPECT_EQ(nErrno, errno);
        }
        const Texts lines = seam().lines;
        reset();
        seam().lines = lines;
    }
};

TEST_F(EveryLine, IsTheSameAtBothDestinationsButForPriorityAndErrno)
{
    std::map<int, Texts> inLog;
    for (const int nErrno : {0, EACCES}) {
        operate(nErrno);
        inLog[nErrno] = takeLines();
    }
    logToStdout(true);
    for (const int nErrno : {0, EACCES}) {
        operate(nErrno);
        EXPECT_EQ(inSystemLog(takeLines(), nErrno), inLog[nErrno]);
    }
}

} // namespace
