// The eight exported functions: what each runs and returns, also at the end of a thread and of the process.

#include <pthread.h>
#include <unistd.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <thread>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"
#include "vemo-access-token.h"

namespace {

const std::string SELECT_T = selectSql("t");
const std::string GRANT_REFUSED =
    failed(WRAPPER, "0 > VemoAccessTokenGrantEx(strTid, szWebapiName, szWebapiMethod, jToken)");
const std::string NOT_PERMITTED =
    failed(SERVICE, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))");

// Each call opens the database, runs the statements and closes it, in this order.
void expectCalls(const Texts& statements)
{
    Texts expected = {UID, RAISE, ACCESS, OPEN, BACK};
    for (const std::string& strStatement : statements) {
        expected.push_back("sqlite3_exec " + strStatement);
    }
    EXPECT_EQ(expected + Texts{CLOSE}, seam().callsOf({"geteuid", "seteuid", "access", "sqlite3_open",
                                                       "sqlite3_exec", "sqlite3_close"}));
    EXPECT_EQ(UID_CALLER, geteuid());
}

// Three tokens, one of them expired, and a caller who is not root.
class Exported : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeTable();
        fill();
        ASSERT_EQ(0, seteuid(UID_CALLER));
    }

    void fill() const
    {
        query("DELETE FROM token");
        insert(R"({"count":2})");
        insert(R"({"tid":"u","bind_sid":"S2","function":"MAIL"})");
        insert(R"({"tid":"old","deadline":1699999999})");
    }

    // The functions take references; these take values.
    static int create(unsigned int uid, const char* szOption, std::string strTid = "")
    {
        Json::Value jOption = json(szOption);
        std::string strFunction = "VPN";
        return strTid.empty() ? VemoAccessTokenCreate(uid, strFunction, jOption, strTid)
                              : VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid);
    }
    static int grantEx(std::string strTid, const char* szApi, const char* szMethod)
    {
        Json::Value jToken;
        return VemoAccessTokenGrantEx(strTid, szApi, szMethod, jToken);
    }
    static int grantOnly(std::string strTid, const char* szApi, const char* szMethod)
    {
        return VemoAccessTokenGrant(strTid, szApi, szMethod, nullptr, 0);
    }
    static int deleteByTid(std::string strTid) { return VemoAccessTokenDeleteByTid(strTid); }
    static int deleteByFunction(std::string strTag) { return VemoAccessTokenDeleteByFunction(strTag); }
};

TEST_F(Exported, PurgeFirstAndGoOnAfterAFailedPurge)
{
    const auto emptyValue = [](const std::string& strField) {
        return Texts{failed(SERVICE, "strValue.empty()"),
                     ordinary(SERVICE, "tokenDeleteByName failed, name=" + strField + ", strValue=")};
    };
    const std::string strInsert = saveSql("INSERT", created(tid("n")));
    const std::string strReplace = saveSql("REPLACE", token(R"({"count":1})"));
    const Texts shortTid = {
        failed(SERVICE, "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN"),
        ordinary(SERVICE, "tokenCreate failed, tid=short, uid=1000, strFunction=VPN, jTokenOption=null")};
    // These statements follow the purge. Even if the call throws, it closes the database.
    const int nThrows = 7;
    const auto purges = [&](int (*pCall)(), int nResult, const Texts& statements, const Texts& lines) {
        for (const bool blPurged : {true, false}) {
            SCOPED_TRACE(joined(statements + lines, ""));
            fill();
            reset();
            failStatements(PURGE, {SQLITE_IOERR, "disk I/O error", 0}, blPurged ? 0 : 1);
            if (nThrows == nResult) {
                EXPECT_THROW(pCall(), Json::LogicError);
            } else {
                EXPECT_EQ(nResult, pCall());
            }
            expectCalls(Texts{PURGE} + statements);
            // The store logs its statement; the purge itself logs nothing.
            EXPECT_LINES((blPurged ? Texts{} : failureOf(PURGE, "disk I/O error")) + lines);
            EXPECT_EQ(blPurged ? "" : "3", countOf("old"));
        }
    };
    purges([] { return create(UID_ERR, "null"); }, -1, {}, {failed(SERVICE, "uid == UID_ERR")});
    purges([] { return create(1000, "null", tid("n")); }, 0, {strInsert}, {});
    purges([] { return create(1000, "null", "short"); }, -1, {}, shortTid);
    purges([] { return create(1000, R"({"deadline":"soon"})"); }, nThrows, {}, {});
    purges([] { return create(1000, R"({"deadline":"soon"})", tid()); }, nThrows, {}, {});
    purges([] { return grantEx("t", "Api", "get"); }, 0, {SELECT_T, strReplace}, {});
    purges([] { return grantEx("t", "api", "get"); }, -1, {SELECT_T}, {NOT_PERMITTED});
    purges([] { return grantEx("t", "Odd", "get"); }, nThrows, {SELECT_T}, {});
    purges([] { return grantOnly("t", "Api", "get"); }, 0, {SELECT_T, strReplace}, {});
    purges([] { return grantOnly("t", "Api", "put"); }, -1, {SELECT_T}, {GRANT_REFUSED});
    purges([] { return grantOnly("t", "Odd", "get"); }, nThrows, {SELECT_T}, {});
    purges([] { return deleteByTid("t"); }, 1, {deleteSql("tid", "t")}, {});
    purges([] { return deleteByTid("z"); }, 0, {deleteSql("tid", "z")}, {});
    purges([] { return deleteByTid(""); }, -1, {}, emptyValue("tid"));
    purges([] { return deleteByFunction("MAIL"); }, 1, {deleteSql("function", "MAIL")}, {});
    purges([] { return deleteByFunction(""); }, -1, {}, emptyValue("function"));
}

TEST_F(Exported, DeleteByBindSidDoesNotPurge)
{
    const std::string strNoSid = failed(WRAPPER, "!szSid || !szSid[0]");
    const auto deletes = [&](const char* szSid, int nResult, const Texts& statements, const Texts& lines) {
        seam().calls.clear();
        EXPECT_EQ(nResult, VemoAccessTokenDeleteByBindSid(szSid));
        expectCalls(statements);
        EXPECT_LINES(lines);
    };
    deletes("S1", 2, {deleteSql("bind_sid", "S1")}, {}); // two: the expired token is still there
    deletes("S9", 0, {deleteSql("bind_sid", "S9")}, {});
    deletes(nullptr, -1, {}, {strNoSid});
    deletes("", -1, {}, {strNoSid});
}

TEST_F(Exported, CreateMakesTheDatabaseOnFirstUseAndReturnsTheNewId)
{
    std::filesystem::remove(path());
    unsigned int uid = 1000;
    std::string strFunction = "VPN";
    Json::Value jOption;
    std::string strTid = "overwritten";
    EXPECT_EQ(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));
    EXPECT_LE(127u, strTid.size());
    EXPECT_EQ((Texts{SCHEMA, PURGE, saveSql("INSERT", created(strTid))}), seam().statements());
    EXPECT_EQ((Texts{row(created(strTid))}), rows());
}

TEST_F(Exported, GenerateNeverTouchesTheDatabase)
{
    std::string strTid;
    EXPECT_EQ(0, VemoAccessTokenGenerate(strTid));
    EXPECT_LE(127u, strTid.size());
    EXPECT_GE(255u, strTid.size());
    EXPECT_EQ(seam().callsOf({"getrandom"}), seam().calls);
    for (const int nCall : {1, 2}) { // for the length, and for the characters
        seam().counts.clear();
        seam().fail("getrandom", ENOSYS, nCall, nCall);
        std::string strUntouched = "untouched";
        EXPECT_EQ(-1, VemoAccessTokenGenerate(strUntouched));
        EXPECT_EQ("untouched", strUntouched);
    }
}

// The grant that returns the name of the token's user

class GrantWithName : public Exported {
protected:
    void SetUp() override
    {
        Exported::SetUp();
        setUser("alice");
        memset(m_szUser, '#', sizeof(m_szUser) - 1);
    }

    // The user database: one user, of any uid.
    static void setUser(const std::string& strName)
    {
        seam().getUser = [strName](uid_t, struct passwd* pEntry, char* szBuffer, size_t,
                                   struct passwd** ppEntry) {
            pEntry->pw_name = strcpy(szBuffer, strName.c_str());
            *ppEntry = pEntry;
            return 0;
        };
    }

    int grant(size_t cbUser = sizeof(m_szUser))
    {
        std::string strTid = "t";
        return VemoAccessTokenGrant(strTid, "Api", "get", m_szUser, cbUser);
    }

    char m_szUser[17] = "";
};

TEST_F(GrantWithName, LooksTheUserUpByTheNarrowedUidWhenTheDatabaseIsClosed)
{
    query("UPDATE token SET uid = 4294968296");
    EXPECT_EQ(0, grant());
    EXPECT_STREQ("alice", m_szUser);
    EXPECT_EQ((Texts{CLOSE, "getpwuid_r 1000"}), seam().callsOf({CLOSE, "getpwuid_r"}));
}

TEST_F(GrantWithName, WritesAsMuchOfTheNameAsFits)
{
    const size_t cbHuge = static_cast<size_t>(UINT_MAX) + 1;
    query("UPDATE token SET count = -1");
    const auto writes = [&](const char* szName, size_t cbUser, int nResult, const char* szWritten) {
        SCOPED_TRACE(cbUser);
        setUser(szName);
        memset(m_szUser, '#', 16);
        errno = 0;
        EXPECT_EQ(nResult, grant(cbUser));
        EXPECT_STREQ(szWritten, m_szUser);
        EXPECT_EQ('#', m_szUser[strlen(szWritten) + 1]);
        const std::string strLine =
            failed(WRAPPER, "(int)cbUser <= snprintf(szUser,cbUser, \"%s\", pUser->szName)");
        EXPECT_LINES(0 == nResult ? Texts{} : Texts{strLine});
    };
    writes("alice", 6, 0, "alice");
    writes("alice", 5, -1, "alic");
    writes("alice", 1, -1, "");
    writes("%s%n%d", 17, 0, "%s%n%d");
    // The size counts as an int, after the name was written.
    writes("alice", static_cast<size_t>(INT_MAX), 0, "alice");
    writes("alice", static_cast<size_t>(INT_MAX) + 1, -1, "alice");
    writes("alice", cbHuge + 5, -1, "alice");
    writes("alice", cbHuge + 6, 0, "alice");
}

TEST_F(GrantWithName, SpendsTheUseEvenIfTheUserIsNotFound)
{
    seam().fail("getpwuid_r", EIO);
    EXPECT_EQ(0, grant(0)); // no user is looked up if no name is asked for
    EXPECT_EQ("1", countOf());
    EXPECT_FAILURE(grant(), failed(WRAPPER, "0 > VEMOUserGetByUID(jToken[\"uid\"].asInt64(), &pUser)", EIO));
    EXPECT_EQ(std::string(16, '#'), m_szUser);
    EXPECT_EQ("", countOf());
}

// The end of a thread and of the process, and a thread that can keep nothing

bool isGranted()
{
    std::string strTid = "t";
    Json::Value jToken;
    return 0 == VemoAccessTokenGrantEx(strTid, "Api", nullptr, jToken) &&
           token()["webapi_allow"] == jToken["webapi_allow"];
}

TEST_F(Exported, GrantInHandlersAtTheEndOfTheProcess)
{
    const auto grantAtExit = [] { atexit([] { _exit(isGranted() ? 0 : 1); }); };
    query("UPDATE token SET count = -1");
    // The library keeps an object from the first grant on. A handler that was registered earlier runs later.
    for (const bool blBefore : {false, true}) {
        EXPECT_EXIT(
            {
                VEMO_ACCESS_TOKEN::tokenType();
                blBefore ? grantAtExit() : void();
                isGranted();
                blBefore ? void() : grantAtExit();
                exit(2);
            },
            ::testing::ExitedWithCode(0), "");
    }
}

// Grants when it is destroyed.
struct LastGrant {
    bool* pGranted = nullptr;
    ~LastGrant() { *pGranted = isGranted(); }
};

TEST_F(Exported, GrantAtTheEndOfAThread)
{
    bool blGranted = false;
    std::thread([&] {
        // Made before the library's own object of the thread, so it is destroyed after that.
        static thread_local LastGrant lastGrant;
        lastGrant.pGranted = &blGranted;
        isGranted();
    }).join();
    EXPECT_TRUE(blGranted);
}

// The library keeps an object for each thread under a key. The keys of a process are limited.
TEST_F(Exported, GrantEvenIfTheProcessHasNoKeyLeft)
{
    pthread_key_t key;
    while (0 == pthread_key_create(&key, nullptr)) {
    }
    EXPECT_TRUE(isGranted());
}

} // namespace
