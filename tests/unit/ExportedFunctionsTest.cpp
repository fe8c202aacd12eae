// The eight exported functions: what each runs, and what it returns.

#include <dlfcn.h>

#include <climits>
#include <filesystem>
#include <functional>

#include "ExportedTest.h"
#include "Statements.h"
#include "vemo-access-token.h"

namespace {

const Json::Value UNTOUCHED = "what the caller had";
const std::string SELECT_T = selectSql("t");
const std::string REPLACE_T = std::string("REPLACE INTO token (") + COLUMNS +
                              ") VALUES ('t','S1',1000,1700000100,1,1700000000,'VPN','" + ALLOW + "','{}')";

std::string insertSql(const std::string& strTid)
{
    return std::string("INSERT INTO token (") + COLUMNS + ") VALUES ('" + strTid +
           "','',1000,1700086400,1,1700000000,'VPN','{}','{}')";
}

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

const Texts SHORT_TID = {
    failed(SERVICE, "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN"),
    ordinary(SERVICE, "tokenCreate failed, tid=short, uid=1000, strFunction=VPN, jTokenOption=null")};
const Texts NO_SID = {failed(WRAPPER, "!szSid || !szSid[0]")};

Texts emptyValue(const std::string& strField)
{
    return {failed(SERVICE, "strValue.empty()"),
            ordinary(SERVICE, "tokenDeleteByName failed, name=" + strField + ", strValue=")};
}

const CallCase PURGING_CALLS[] = {
    {"CreateRefused", create(UID_ERR, "VPN", "null", ""), -1, {}, {failed(SERVICE, "uid == UID_ERR")}},
    {"CreateByTid", createByTid(1000, "VPN", "null", tid("n")), 0, {insertSql(tid("n"))}, {}},
    {"CreateByTidRefused", createByTid(1000, "VPN", "null", "short"), -1, {}, SHORT_TID},
    {"GrantEx", grantEx("t", "Api", "get"), 0, {SELECT_T, REPLACE_T}, {}},
    {"GrantExRefused", grantEx("t", "api", "get"), -1, {SELECT_T}, {NOT_PERMITTED}},
    {"Grant", grant("t", "Api", "get"), 0, {SELECT_T, REPLACE_T}, {}},
    {"GrantRefused", grant("t", "Api", "put"), -1, {SELECT_T}, {GRANT_REFUSED}},
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
    Texts expected = {UID, RAISE, ACCESS, OPEN, BACK};
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

class PurgingFunction : public ExportedTest, public ::testing::WithParamInterface<CallCase> {
protected:
    Texts statements() const { return Texts{PURGE} + GetParam().statements; }
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
    failStatements(PURGE, {SQLITE_IOERR, "disk I/O error", 0});

    EXPECT_EQ(GetParam().nResult, GetParam().call());

    expectCalls(statements());
    EXPECT_EQ(failureOf(PURGE, "disk I/O error") + GetParam().lines, takeLines());
    EXPECT_EQ((Texts{"old"}), query("SELECT tid FROM token WHERE tid = 'old'"));
}

INSTANTIATE_TEST_SUITE_P(Calls, PurgingFunction, ::testing::ValuesIn(PURGING_CALLS), caseName);

class DeleteByBindSid : public ExportedTest, public ::testing::WithParamInterface<CallCase> {};

TEST_P(DeleteByBindSid, DoesNotPurge)
{
    EXPECT_EQ(GetParam().nResult, GetParam().call());

    expectCalls(GetParam().statements);
    EXPECT_EQ(GetParam().lines, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Calls, DeleteByBindSid, ::testing::ValuesIn(BIND_SID_CALLS), caseName);

class Exported : public ExportedTest {};

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
        {grantEx("t", "Odd", "get"), {PURGE, SELECT_T}},
        {grant("t", "Odd", "get"), {PURGE, SELECT_T}}};
    for (const auto& [call, statements] : throwing) {
        seam().calls.clear();

        EXPECT_THROW(call(), Json::LogicError);

        expectCalls(statements);
    }
    EXPECT_EQ("2", countOf("t"));
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

class ExportedToSystemLog : public ExportedTest {
protected:
    ExportedToSystemLog() : ExportedTest(Destination::Syslog) {}
};

TEST_F(ExportedToSystemLog, TellErrnoInFrontOfEachLine)
{
    seam().fail("seteuid", EPERM);

    EXPECT_EQ(-1, VemoAccessTokenDeleteByBindSid(nullptr));

    EXPECT_EQ(inSystemLog({NOT_ROOT, failed(WRAPPER, "!szSid || !szSid[0]", EPERM)}, EPERM),
              takeLines(Destination::Syslog));
    EXPECT_EQ((Texts{"syslog 3", "syslog 3"}), seam().callsOf({"syslog"}));
}

} // namespace
