// The eight exported functions.

#include <dlfcn.h>
#include <malloc.h>
#include <unistd.h>

#include <climits>
#include <cstring>
#include <filesystem>
#include <functional>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "vemo-access-token.h"

namespace {

typedef std::vector<std::string> Texts;

const char* const API = "AccessTokenApi.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const WRAPPER = "AccessTokenWrapper.cpp";
const time_t NOW = 1700000000;
const uid_t UID_CALLER = 1000;
const Json::Value UNTOUCHED = "what the caller had";
const std::string ALLOW = R"({"Api":{"method":["get"]},"Odd":{"method":[{}]}})";
const std::string PURGE = "DELETE FROM token where deadline < strftime('%s', 'now');";
const std::string SELECT = std::string("SELECT ") + COLUMNS + " FROM token  WHERE  (tid='t' );";
const std::string REPLACE = std::string("REPLACE INTO token (") + COLUMNS +
                            ") VALUES ('t','S1',1000,1700000100,1,1700000000,'VPN','" + ALLOW + "','{}')";

bool g_blGrantWithoutUid = false;

std::string insertSql(const std::string& strTid)
{
    return std::string("INSERT INTO token (") + COLUMNS + ") VALUES ('" + strTid +
           "','',1000,1700086400,1,1700000000,'VPN','{}','{}')";
}

std::string deleteSql(const std::string& strField, const std::string& strValue)
{
    return "DELETE FROM token WHERE  (" + strField + " in ('" + strValue + "' ) );";
}

// Leaves errno as it was: what SQLite does to it is its own affair and is hidden from the log lines.
template <typename Result, typename... Arguments>
std::function<Result(Arguments...)> quiet(Result (*pFunction)(Arguments...))
{
    return [pFunction](Arguments... arguments) {
        const int nErrno = errno;
        const Result result = pFunction(arguments...);
        errno = nErrno;
        return result;
    };
}

class Exported : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insert("t", "'S1',1000,1700000100,2,1700000000,'VPN','" + ALLOW + "','{}'");
        insert("u", "'S2',1000,1700000100,2,1700000000,'MAIL','" + ALLOW + "','{}'");
        insert("old", "'S1',1000,1699999999,2,1700000000,'VPN','" + ALLOW + "','{}'");
        seam().sqliteOpen = quiet(sqlite3_open);
        seam().sqliteExec = quiet(sqlite3_exec);
        seam().sqliteClose = quiet(sqlite3_close);
        seam().clock = NOW;
        ASSERT_EQ(0, seteuid(UID_CALLER));
        errno = 0;
    }

    // The count of the token t, "" when it is gone.
    std::string stored() const
    {
        const Texts rows = query("SELECT count FROM token WHERE tid = 't'");
        return rows.empty() ? "" : rows[0];
    }
};

// The functions with their arguments kept.
typedef std::function<int()> Call;

Call create(unsigned int uid, std::string strFunction, const char* szOption, std::string strTid)
{
    return [=]() mutable {
        Json::Value jOption = json(szOption);
        return VemoAccessTokenCreate(uid, strFunction, jOption, strTid);
    };
}

Call createByTid(unsigned int uid, std::string strFunction, const char* szOption, std::string strTid)
{
    return [=]() mutable {
        Json::Value jOption = json(szOption);
        return VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid);
    };
}

Call grantEx(std::string strTid, const char* szApi, const char* szMethod)
{
    return [=]() mutable {
        Json::Value jToken;
        return VemoAccessTokenGrantEx(strTid, szApi, szMethod, jToken);
    };
}

Call grant(std::string strTid, const char* szApi, const char* szMethod)
{
    return [=]() mutable { return VemoAccessTokenGrant(strTid, szApi, szMethod, nullptr, 0); };
}

Call deleteByTid(std::string strTid)
{
    return [=]() mutable { return VemoAccessTokenDeleteByTid(strTid); };
}

Call deleteByFunction(std::string strFunction)
{
    return [=]() mutable { return VemoAccessTokenDeleteByFunction(strFunction); };
}

Call deleteByBindSid(const char* szSid)
{
    return [=] { return VemoAccessTokenDeleteByBindSid(szSid); };
}

struct CallCase {
    const char* szName;
    Call call;
    int nResult;
    Texts statements; // after those of the purge
    Texts lines;
};

void PrintTo(const CallCase& callCase, std::ostream* pStream)
{
    *pStream << callCase.szName;
}

const std::string GRANT_REFUSED =
    failed(WRAPPER, "0 > VemoAccessTokenGrantEx(strTid, szWebapiName, szWebapiMethod, jToken)");
const std::string NOT_PERMITTED =
    failed(API, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))");
const Texts SHORT_TID = {
    failed(API, "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN"),
    ordinary(API, "tokenCreate failed, tid=short, uid=1000, strFunction=VPN, jTokenOption=null")};
const Texts NO_SID = {failed(WRAPPER, "!szSid || !szSid[0]")};

Texts emptyValue(const std::string& strField)
{
    return {failed(API, "strValue.empty()"),
            ordinary(API, "tokenDeleteByName failed, name=" + strField + ", strValue=")};
}

const CallCase PURGING_CALLS[] = {
    {"CreateRefused", create(UID_ERR, "VPN", "null", ""), -1, {}, {failed(API, "uid == UID_ERR")}},
    {"CreateByTid", createByTid(1000, "VPN", "null", tid("n")), 0, {insertSql(tid("n"))}, {}},
    {"CreateByTidRefused", createByTid(1000, "VPN", "null", "short"), -1, {}, SHORT_TID},
    {"GrantEx", grantEx("t", "Api", "get"), 0, {SELECT, REPLACE}, {}},
    {"GrantExRefused", grantEx("t", "api", "get"), -1, {SELECT}, {NOT_PERMITTED}},
    {"Grant", grant("t", "Api", "get"), 0, {SELECT, REPLACE}, {}},
    {"GrantRefused", grant("t", "Api", "put"), -1, {SELECT}, {GRANT_REFUSED}},
    {"DeleteByTid", deleteByTid("t"), 1, {deleteSql("tid", "t")}, {}},
    {"DeleteByUnknownTid", deleteByTid("z"), 0, {deleteSql("tid", "z")}, {}},
    {"DeleteByTidRefused", deleteByTid(""), -1, {}, emptyValue("tid")},
    {"DeleteByFunction", deleteByFunction("MAIL"), 1, {deleteSql("function", "MAIL")}, {}},
    {"DeleteByFunctionRefused", deleteByFunction(""), -1, {}, emptyValue("function")}};

const CallCase BIND_SID_CALLS[] = {
    // Two: the expired token is still there.
    {"Sid", deleteByBindSid("S1"), 2, {deleteSql("bind_sid", "S1")}, {}},
    {"UnknownSid", deleteByBindSid("S9"), 0, {deleteSql("bind_sid", "S9")}, {}},
    {"NullSid", deleteByBindSid(nullptr), -1, {}, NO_SID},
    {"EmptySid", deleteByBindSid(""), -1, {}, NO_SID}};

// Every call opens the database, runs the statements and closes it; in this order.
void expectCalls(const Texts& statements)
{
    Texts expected = {"geteuid", "seteuid 0", "access " VEMO_ATOKEN_DB_PATH,
                      "sqlite3_open " VEMO_ATOKEN_DB_PATH, "seteuid 1000"};
    for (const std::string& strStatement : statements) {
        expected.push_back("sqlite3_exec " + strStatement);
    }
    expected.push_back("sqlite3_close");
    EXPECT_EQ(expected, seam().callsOf({"geteuid", "seteuid", "access", "sqlite3_open", "sqlite3_exec",
                                        "sqlite3_close"}));
    EXPECT_EQ(UID_CALLER, geteuid());
}

std::string caseName(const ::testing::TestParamInfo<CallCase>& test)
{
    return test.param.szName;
}

class PurgingFunction : public Exported, public ::testing::WithParamInterface<CallCase> {
protected:
    Texts statements() const
    {
        Texts all = GetParam().statements;
        all.insert(all.begin(), PURGE);
        return all;
    }
};

TEST_P(PurgingFunction, PurgesThenOperates)
{
    EXPECT_EQ(GetParam().nResult, GetParam().call());

    expectCalls(statements());
    EXPECT_EQ(GetParam().lines, takeLines());
    EXPECT_EQ(Texts{}, query("SELECT tid FROM token WHERE tid = 'old'"));
}

// The store tells of the statement; the failed purge itself is kept quiet.
TEST_P(PurgingFunction, OperatesAfterAFailedPurge)
{
    seam().sqliteExec = [](sqlite3* pDb, const char* szSql, auto callback, void* pArgument, char** pszError) {
        if (PURGE == szSql) {
            *pszError = sqlite3_mprintf("disk I/O error");
            return SQLITE_IOERR;
        }
        return quiet(sqlite3_exec)(pDb, szSql, callback, pArgument, pszError);
    };

    EXPECT_EQ(GetParam().nResult, GetParam().call());

    expectCalls(statements());
    Texts lines = GetParam().lines;
    lines.insert(lines.begin(), {ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + PURGE),
                                 fail(STORE, "run sql failed, sql=" + PURGE)});
    EXPECT_EQ(lines, takeLines());
    EXPECT_EQ((Texts{"old"}), query("SELECT tid FROM token WHERE tid = 'old'"));
}

INSTANTIATE_TEST_SUITE_P(Calls, PurgingFunction, ::testing::ValuesIn(PURGING_CALLS), caseName);

class DeleteByBindSid : public Exported, public ::testing::WithParamInterface<CallCase> {};

TEST_P(DeleteByBindSid, DoesNotPurge)
{
    EXPECT_EQ(GetParam().nResult, GetParam().call());

    expectCalls(GetParam().statements);
    EXPECT_EQ(GetParam().lines, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Calls, DeleteByBindSid, ::testing::ValuesIn(BIND_SID_CALLS), caseName);

TEST_F(Exported, CreateReturnsTheNewId)
{
    unsigned int uid = 1000;
    std::string strFunction = "VPN";
    Json::Value jOption;
    std::string strTid = "overwritten";

    EXPECT_EQ(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));

    expectCalls({PURGE, insertSql(strTid)});
    EXPECT_LE(127u, strTid.size());
    EXPECT_EQ((Texts{strTid}), query("SELECT tid FROM token WHERE tid NOT IN ('t','u')"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Exported, CreateMakesTheDatabaseOnFirstUse)
{
    std::filesystem::remove(path());

    EXPECT_EQ(0, createByTid(1000, "VPN", "null", tid())());

    const Texts statements = seam().callsOf({"sqlite3_exec"});
    ASSERT_EQ(3u, statements.size());
    EXPECT_EQ(0u, statements[0].find("sqlite3_exec PRAGMA auto_vacuum = FULL; CREATE TABLE"));
    EXPECT_EQ("sqlite3_exec " + PURGE, statements[1]);
    EXPECT_EQ("sqlite3_exec " + insertSql(tid()), statements[2]);
    EXPECT_EQ((Texts{tid()}), query("SELECT tid FROM token"));
}

TEST_F(Exported, GenerateNeverTouchesTheDatabase)
{
    std::string strTid;

    EXPECT_EQ(0, VemoAccessTokenGenerate(strTid));

    EXPECT_EQ(seam().callsOf({"getrandom"}), seam().calls);
    EXPECT_LE(127u, strTid.size());
    EXPECT_GE(255u, strTid.size());
}

TEST_F(Exported, GeneratePassesTheFailureOn)
{
    seam().fail("getrandom", ENOSYS);
    std::string strTid = "untouched";

    EXPECT_EQ(-1, VemoAccessTokenGenerate(strTid));

    EXPECT_EQ("untouched", strTid);
    EXPECT_EQ((Texts{"getrandom"}), seam().calls);
}

TEST_F(Exported, GrantExHandsTheRecordBackOrLeavesItAlone)
{
    std::string strTid = "t";
    std::string strExpired = "old";
    Json::Value jToken = UNTOUCHED;

    EXPECT_EQ(-1, VemoAccessTokenGrantEx(strExpired, "Api", "get", jToken));
    EXPECT_EQ(UNTOUCHED, jToken);

    EXPECT_EQ(0, VemoAccessTokenGrantEx(strTid, "Api", "get", jToken));
    EXPECT_EQ(json(R"({"bind_sid":"S1","count":1,"create_time":1700000000,"deadline":1700000100,"extra":{},)"
                   R"("function":"VPN","tid":"t","uid":1000,"webapi_allow":)" +
                   ALLOW + "}"),
              jToken);
}

TEST_F(Exported, LetExceptionsPassOnceTheDatabaseIsClosed)
{
    const std::pair<Call, Texts> throwing[] = {
        {create(1000, "VPN", R"({"deadline":"soon"})", ""), {PURGE}},
        {createByTid(1000, "VPN", R"({"deadline":"soon"})", tid()), {PURGE}},
        {createByTid(1000, "VPN", R"({"deadline":4294967296})", tid()), {PURGE}},
        {grantEx("t", "Odd", "get"), {PURGE, SELECT}},
        {grant("t", "Odd", "get"), {PURGE, SELECT}}};
    for (const auto& [call, statements] : throwing) {
        seam().calls.clear();

        EXPECT_THROW(call(), Json::LogicError);

        expectCalls(statements);
    }
    EXPECT_EQ("2", stored());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Exported, FailWhenTheDatabaseCannotBeOpened)
{
    seam().fail("seteuid", EPERM, 1, INT_MAX);
    for (const Call& call : {create(1000, "VPN", "null", ""), createByTid(1000, "VPN", "null", tid()),
                             grantEx("t", "Api", "get"), grant("t", "Api", "get"), deleteByTid("t"),
                             deleteByBindSid("S1"), deleteByFunction("VPN")}) {
        EXPECT_EQ(-1, call());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_open", "sqlite3_exec", "sqlite3_close"}));
}

TEST_F(Exported, HavePlainNames)
{
    void* const pLibrary = dlopen("libvemoaccesstoken.so.6", RTLD_NOW | RTLD_NOLOAD);
    ASSERT_NE(nullptr, pLibrary) << dlerror();
    for (const char* szName :
         {"VemoAccessTokenCreate", "VemoAccessTokenCreateByTid", "VemoAccessTokenGenerate",
          "VemoAccessTokenGrant", "VemoAccessTokenGrantEx", "VemoAccessTokenDeleteByTid",
          "VemoAccessTokenDeleteByBindSid", "VemoAccessTokenDeleteByFunction"}) {
        void* const pFunction = dlsym(pLibrary, szName);
        EXPECT_NE(nullptr, pFunction) << szName;
    }
    typedef int Generate(std::string&);
    std::string strTid;
    EXPECT_EQ(0, reinterpret_cast<Generate*>(dlsym(pLibrary, "VemoAccessTokenGenerate"))(strTid));
    dlclose(pLibrary);
}

// The user database: one user, of any uid.
void setUser(const std::string& strName)
{
    seam().getUser = [strName](uid_t, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                               struct passwd** ppEntry) {
        *ppEntry = nullptr;
        if (cbBuffer <= strName.size()) {
            return ERANGE;
        }
        *pEntry = {};
        pEntry->pw_name = strcpy(szBuffer, strName.c_str());
        *ppEntry = pEntry;
        return 0;
    };
}

class GrantWithName : public Exported {
protected:
    void SetUp() override
    {
        Exported::SetUp();
        setUser("alice");
        memset(m_szUser, '#', sizeof(m_szUser) - 1);
    }

    int grant(const char* szApi = "Api", const char* szMethod = "get", size_t cbUser = sizeof(m_szUser))
    {
        std::string strTid = "t";
        return VemoAccessTokenGrant(strTid, szApi, szMethod, m_szUser, cbUser);
    }

    char m_szUser[17] = "";
    const std::string m_strUntouched = std::string(16, '#');
};

TEST_F(GrantWithName, LooksTheUserUpAfterTheDatabaseIsClosed)
{
    EXPECT_EQ(0, grant());

    EXPECT_STREQ("alice", m_szUser);
    EXPECT_EQ((Texts{"sqlite3_close", "getpwuid_r 1000"}), seam().callsOf({"sqlite3_close", "getpwuid_r"}));
    EXPECT_EQ("1", stored());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantWithName, FindsRealUsers)
{
    seam().getUser = nullptr;
    query("UPDATE token SET uid = 0");

    EXPECT_EQ(0, grant());

    EXPECT_STREQ("root", m_szUser);
}

TEST_F(GrantWithName, NarrowsTheUid)
{
    const std::pair<const char*, const char*> uids[] = {{"4294968296", "1000"},
                                                        {"-1", "4294967295"},
                                                        {"4294967295", "4294967295"},
                                                        {"-9223372036854775808", "0"}};
    for (const auto& [szStored, szLookedUp] : uids) {
        query(std::string("UPDATE token SET count = -1, uid = ") + szStored);
        seam().calls.clear();

        EXPECT_EQ(0, grant());

        EXPECT_EQ((Texts{std::string("getpwuid_r ") + szLookedUp}), seam().callsOf({"getpwuid_r"}));
    }
}

TEST_F(GrantWithName, LooksNobodyUpWithoutABuffer)
{
    std::string strTid = "t";

    EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", nullptr, sizeof(m_szUser)));
    EXPECT_EQ("1", stored());
    EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", m_szUser, 0));

    EXPECT_EQ("", stored());
    EXPECT_EQ(m_strUntouched, m_szUser);
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantWithName, WritesWhatFits)
{
    const size_t cbHuge = static_cast<size_t>(UINT_MAX) + 1;
    const struct {
        const char* szName;
        size_t cbUser;
        int nResult;
        const char* szWritten;
    } rows[] = {{"alice", 6, 0, "alice"},
                {"alice", 5, -1, "alic"},
                {"alice", 2, -1, "a"},
                {"alice", 1, -1, ""},
                {"alice", 17, 0, "alice"},
                {"", 1, 0, ""},
                {"%s%n%d", 17, 0, "%s%n%d"},
                // The size counts as an int, whatever was written by then.
                {"alice", static_cast<size_t>(INT_MAX), 0, "alice"},
                {"alice", static_cast<size_t>(INT_MAX) + 1, -1, "alice"},
                {"alice", cbHuge + 5, -1, "alice"},
                {"alice", cbHuge + 6, 0, "alice"}};
    query("UPDATE token SET count = -1");
    for (const auto& row : rows) {
        SCOPED_TRACE(row.cbUser);
        setUser(row.szName);
        memset(m_szUser, '#', 16);
        errno = 0;

        EXPECT_EQ(row.nResult, grant("Api", "get", row.cbUser));

        EXPECT_STREQ(row.szWritten, m_szUser);
        EXPECT_EQ('#', m_szUser[strlen(row.szWritten) + 1]);
        const std::string strLine =
            failed(WRAPPER, "(int)cbUser <= snprintf(szUser,cbUser, \"%s\", pUser->szName)");
        EXPECT_EQ(0 == row.nResult ? Texts{} : Texts{strLine}, takeLines());
    }
}

TEST_F(GrantWithName, LeavesTheNameAloneWhenRefused)
{
    const struct {
        const char* szTid;
        const char* szApi;
        const char* szMethod;
        Texts lines;
    } refusals[] = {{"", "Api", "get", {failed(API, "strTid.empty()"), GRANT_REFUSED}},
                    {"t", nullptr, "get", {failed(API, "!szWebapiName || !szWebapiName[0]"), GRANT_REFUSED}},
                    {"unknown", "Api", "get", {GRANT_REFUSED}},
                    {"old", "Api", "get", {GRANT_REFUSED}},
                    {"t", "api", "get", {NOT_PERMITTED, GRANT_REFUSED}},
                    {"t", "Api", "put", {GRANT_REFUSED}}};
    for (const auto& refusal : refusals) {
        SCOPED_TRACE(refusal.szTid);
        std::string strTid = refusal.szTid;

        EXPECT_EQ(-1,
                  VemoAccessTokenGrant(strTid, refusal.szApi, refusal.szMethod, m_szUser, sizeof(m_szUser)));

        EXPECT_EQ(refusal.lines, takeLines());
        EXPECT_EQ(m_strUntouched, m_szUser);
    }
    EXPECT_EQ("2", stored());
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
}

// The use is spent by then, and nothing gives it back.
TEST_F(GrantWithName, FailsForUsersThatCannotBeFound)
{
    const std::string strFailed = "0 > VEMOUserGetByUID(jToken[\"uid\"].asInt64(), &pUser)";
    const struct {
        int nResult; // of getpwuid_r, which finds no entry
        std::string strLine;
    } answers[] = {{0, failed(WRAPPER, "!pUser")},
                   {ENOENT, failed(WRAPPER, "!pUser")},
                   {ESRCH, failed(WRAPPER, "!pUser")},
                   {EIO, failed(WRAPPER, strFailed, EIO)},
                   {EMFILE, failed(WRAPPER, strFailed, EMFILE)}};
    for (const auto& answer : answers) {
        SCOPED_TRACE(answer.nResult);
        query("UPDATE token SET count = 2");
        seam().getUser = [&answer](uid_t, struct passwd*, char*, size_t, struct passwd** ppEntry) {
            *ppEntry = nullptr;
            return answer.nResult;
        };
        errno = 0;

        EXPECT_EQ(-1, grant());

        EXPECT_EQ((Texts{answer.strLine}), takeLines());
        EXPECT_EQ(m_strUntouched, m_szUser);
        EXPECT_EQ("1", stored());
    }
}

TEST_F(GrantWithName, FailsWithoutMemoryForTheUser)
{
    seam().fail("operator new", ENOMEM, 2, 2); // the first is the store

    EXPECT_EQ(-1, grant());

    EXPECT_EQ((Texts{failed(WRAPPER, "0 > VEMOUserGetByUID(jToken[\"uid\"].asInt64(), &pUser)", ENOMEM)}),
              takeLines());
    EXPECT_EQ(m_strUntouched, m_szUser);
}

TEST_F(GrantWithName, FailsForARecordWithoutUid)
{
    g_blGrantWithoutUid = true;

    EXPECT_EQ(-1, grant());

    EXPECT_EQ((Texts{failed(WRAPPER, "!jToken.isMember(\"uid\")")}), takeLines());
    EXPECT_EQ(m_strUntouched, m_szUser);
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
}

// Whether the name fits or not. (Under a sanitizer, which has an allocator of its own, its own report
// at exit tells.)
TEST_F(GrantWithName, FreesTheUser)
{
    const size_t cbName = 50000;
    setUser(std::string(cbName, 'x'));
    query("UPDATE token SET count = -1");
    std::string strTid = "t";
    std::vector<char> user(cbName + 1);
    const auto grantTwice = [&] {
        EXPECT_EQ(-1, VemoAccessTokenGrant(strTid, "Api", "get", user.data(), cbName));
        EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", user.data(), cbName + 1));
    };
    grantTwice();
    const size_t cbBefore = mallinfo2().uordblks;

    for (int i = 0; i < 10; ++i) {
        grantTwice();
    }

    EXPECT_GT(cbBefore + cbName, mallinfo2().uordblks);
}

// Without the switch to standard output.
class ExportedToSystemLog : public ::testing::Test {
protected:
    void SetUp() override
    {
        seam() = Seam();
        seam().fail("seteuid", EPERM, 1, INT_MAX); // no database is ever reached
        errno = 0;
    }
};

TEST_F(ExportedToSystemLog, TellErrnoInFrontOfEachLine)
{
    const std::string strError = strerror(EPERM);

    EXPECT_EQ(-1, VemoAccessTokenDeleteByBindSid(nullptr));

    EXPECT_EQ((Texts{ordinary(STORE,
                              "(AccessTokenSqlite.cpp:#)(" + strError +
                                  ")Failed [0 > seteuid(0)], err=" + strError + "\n",
                              EPERM),
                     ordinary(WRAPPER,
                              "(AccessTokenWrapper.cpp:#)(" + strError +
                                  ")Failed [!szSid || !szSid[0]], err=" + strError + "\n",
                              EPERM)}),
              takeLines(Destination::Syslog));
    EXPECT_EQ((Texts{"syslog 3", "syslog 3"}), seam().callsOf({"syslog"}));
}

} // namespace

// No grant yields a record without a uid, except here.
int VemoAccessTokenGrantEx(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                           Json::Value& jToken)
{
    typedef int Function(std::string&, const char*, const char*, Json::Value&);
    if (g_blGrantWithoutUid) {
        return 0;
    }
    void* const pNext = dlsym(RTLD_NEXT, "VemoAccessTokenGrantEx");
    return reinterpret_cast<Function*>(pNext)(strTid, szWebapiName, szWebapiMethod, jToken);
}
