// Deleting tokens, and purging the expired ones.

#include <dlfcn.h>

#include <climits>
#include <cstring>
#include <functional>
#include <optional>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StoreTest.h"

namespace {

typedef std::vector<std::string> Texts;

const char* const API = "AccessTokenApi.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const std::string PURGE = "DELETE FROM token where deadline < strftime('%s', 'now');";
const time_t NOW = 1700000000;

// What VectorParamToJson answers, without doing anything, when set.
std::optional<int> g_nVectorParamResult;

Texts operator+(Texts left, const Texts& right)
{
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

// Fails nTimes statements with the error and EIO. The others run; what SQLite does to errno there is
// its own affair and is hidden from the log lines.
void failStatements(const char* szError, int nTimes)
{
    seam().sqliteExec = [szError, nTimes](sqlite3* pDb, const char* szSql, auto callback, void* pArgument,
                                          char** pszError) mutable {
        if (0 < nTimes--) {
            *pszError = sqlite3_mprintf("%s", szError);
            errno = EIO;
            return SQLITE_ERROR;
        }
        const int nErrno = errno;
        const int nResult = sqlite3_exec(pDb, szSql, callback, pArgument, pszError);
        errno = nErrno;
        return nResult;
    };
}

// What the store writes when SQLite refuses a deletion.
Texts diskErrorLines(const std::string& strSql)
{
    return {ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + strSql),
            fail(STORE, "run sql failed, sql=" + strSql, EIO), failed(STORE, "0 > (err = runSql())", EIO)};
}

std::string arraySummary(const std::string& strName, const std::string& strList)
{
    return ordinary(API, "tokenDeleteByArray failed, name=" + strName + ", strVector=" + strList);
}

std::string nameSummary(const std::string& strName, const std::string& strValue)
{
    return ordinary(API, "tokenDeleteByName failed, name=" + strName + ", strValue=" + strValue);
}

class Deletion : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insertToken("a", "S1", "VPN");
        insertToken("b", "S1", "MAIL");
        insertToken("a''b", "", "VPN");
        insertToken("c", "S2", "O''Brien");
        m_api.emplace();
        failStatements("", 0);
        seam().calls.clear();
        seam().clock = NOW;
        errno = 0;
    }

    void insertToken(const std::string& strTid, const std::string& strSid, const std::string& strFunction,
                     const std::string& strDeadline = "1700000100") const
    {
        insert(strTid,
               "'" + strSid + "',1000," + strDeadline + ",1,1700000000,'" + strFunction + "','{}','{}'");
    }

    AccessTokenApi& api() { return *m_api; }

    // The tids that there are, with blanks between.
    std::string tids() const
    {
        return query("SELECT group_concat(tid, ' ') FROM (SELECT tid FROM token ORDER BY tid)")[0];
    }

private:
    std::optional<AccessTokenApi> m_api; // opened when its database stands
};

const char* const ALL_TIDS = "a a'b b c";

typedef std::function<int(AccessTokenApi&)> Removal;

Removal byValue(int (AccessTokenApi::*pRemove)(std::string&), std::string strValue)
{
    return [=](AccessTokenApi& api) mutable { return (api.*pRemove)(strValue); };
}

const auto byTid = [](const char* szTid) { return byValue(&AccessTokenApi::tokenDeleteByTid, szTid); };
const auto byBindSid = [](const char* szSid) {
    return byValue(&AccessTokenApi::tokenDeleteByBindSid, szSid);
};
const auto byFunction = [](const char* szTag) {
    return byValue(&AccessTokenApi::tokenDeleteByFunction, szTag);
};

Removal byName(std::string strValue, const char* szName)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByName(strValue, szName); };
}

Removal byTidArray(Texts values)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByTidArray(values); };
}

Removal byArray(Texts values, const char* szName)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByArray(values, szName); };
}

struct DeletionCase {
    const char* szName;
    Removal remove;
    const char* szCondition;
    int nDeleted;
    const char* szLeft;
};

void PrintTo(const DeletionCase& deletion, std::ostream* pStream)
{
    *pStream << deletion.szName;
}

const DeletionCase DELETIONS[] = {
    {"Tid", byTid("a"), "tid in ('a' )", 1, "a'b b c"},
    {"UnknownTid", byTid("zz"), "tid in ('zz' )", 0, ALL_TIDS},
    {"TidOfOtherCase", byTid("A"), "tid in ('A' )", 0, ALL_TIDS},
    {"TidThatIsSql", byTid("' OR '1'='1"), "tid in (''' OR ''1''=''1' )", 0, ALL_TIDS},
    {"TidThatIsAPattern", byTid("%"), "tid in ('%' )", 0, ALL_TIDS},
    {"BindSid", byBindSid("S1"), "bind_sid in ('S1' )", 2, "a'b c"},
    {"Function", byFunction("VPN"), "function in ('VPN' )", 2, "b c"},
    {"FunctionWithQuote", byFunction("O'Brien"), "function in ('O''Brien' )", 1, "a a'b b"},
    {"NameTid", byName("a", "tid"), "tid in ('a' )", 1, "a'b b c"},
    {"NameBindSid", byName("S2", "bind_sid"), "bind_sid in ('S2' )", 1, "a a'b b"},
    {"NameFunction", byName("MAIL", "function"), "function in ('MAIL' )", 1, "a a'b c"},
    {"TidArrayOfOne", byTidArray({"c"}), "tid in ('c' )", 1, "a a'b b"},
    // No separator stands between the elements, so several values are one text.
    {"TidArrayOfThree", byTidArray({"a", "b", "zz"}), "tid in ('a''b''zz' )", 0, ALL_TIDS},
    {"TidArrayThatTogetherIsATid", byTidArray({"a", "b"}), "tid in ('a''b' )", 1, "a b c"},
    {"TidArrayWithDuplicate", byTidArray({"a", "a"}), "tid in ('a''a' )", 0, ALL_TIDS},
    // Only the list itself must not be empty: an empty element selects the unbound tokens.
    {"ArrayOfEmptyText", byArray({""}, "bind_sid"), "bind_sid in ('' )", 1, "a b c"},
    {"ArrayOfFunctions", byArray({"VPN"}, "function"), "function in ('VPN' )", 2, "b c"},
};

class DeletionBy : public Deletion, public ::testing::WithParamInterface<DeletionCase> {};

TEST_P(DeletionBy, RunsOneStatementAndCounts)
{
    EXPECT_EQ(GetParam().nDeleted, GetParam().remove(api()));

    EXPECT_EQ((Texts{std::string("sqlite3_exec DELETE FROM token WHERE  (") + GetParam().szCondition + " );",
                     "sqlite3_changes"}),
              seam().callsOf(OPENING_CALLS));
    EXPECT_EQ(GetParam().szLeft, tids());
    EXPECT_EQ(Texts{}, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Values, DeletionBy, ::testing::ValuesIn(DELETIONS),
                         [](const auto& test) { return std::string(test.param.szName); });

TEST_F(Deletion, OfAllEmptiesTheTable)
{
    EXPECT_EQ(4, api().tokenDeleteAll());
    EXPECT_EQ(0, api().tokenDeleteAll());

    EXPECT_EQ((Texts{"sqlite3_exec DELETE FROM token;", "sqlite3_exec DELETE FROM token;"}),
              seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ("NULL", tids());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Deletion, TracesStatementAndNumberInDebugMode)
{
    const std::string strSql = "DELETE FROM token WHERE  (bind_sid in ('S1' ) );";
    std::string strSid = "S1";
    VEMO_ACCESS_TOKEN::debugInfo(true);

    EXPECT_EQ(2, api().tokenDeleteByBindSid(strSid));

    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + strSql), ordinary(STORE, "change rv=2, run sql=" + strSql),
                     ordinary(STORE, "delete token number=2")}),
              takeLines());
}

// Whatever the table of types says now, decides.
TEST_F(Deletion, FollowsTheTypeTable)
{
    VEMO_ACCESS_TOKEN::tokenType()["uid"][0] = "string";

    EXPECT_EQ(4, byName("1000", "uid")(api()));

    EXPECT_EQ("NULL", tids());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Deletion, RefusesListsValuesAndNames)
{
    const char* const szType = "jType[szName][0].asString() != \"string\"";
    const char* const szField = "!jType.isMember(szName)";
    const char* const szNoName = "!szName || !szName[0]";
    const struct {
        Removal remove;
        const char* szCondition;
        std::string strSummary;
    } refusals[] = {
        {byTidArray({}), "0 >= strVector.size()", arraySummary("tid", "")},
        {byArray({}, nullptr), "0 >= strVector.size()", arraySummary("(null)", "")},
        {byArray({"a", "b", "c"}, nullptr), szNoName, arraySummary("(null)", "a,b,c")},
        {byArray({"a", "b", "c"}, ""), szNoName, arraySummary("", "a,b,c")},
        {byArray({"a"}, "foo"), szField, arraySummary("foo", "a")},
        {byArray({"a"}, "Tid"), szField, arraySummary("Tid", "a")},
        {byArray({"a"}, "sort_by"), szField, arraySummary("sort_by", "a")},
        {byArray({"1000", "1001"}, "uid"), szType, arraySummary("uid", "1000,1001")},
        {byArray({"", "", ""}, "deadline"), szType, arraySummary("deadline", ",,")},
        {byArray({""}, "count"), szType, arraySummary("count", "")},
        {byArray({"a,b", "%s%n"}, "create_time"), szType, arraySummary("create_time", "a,b,%s%n")},
        {byArray({"{}"}, "webapi_allow"), szType, arraySummary("webapi_allow", "{}")},
        {byArray({"{}"}, "extra"), szType, arraySummary("extra", "{}")},
        {byTid(""), "strValue.empty()", nameSummary("tid", "")},
        {byBindSid(""), "strValue.empty()", nameSummary("bind_sid", "")},
        {byFunction(""), "strValue.empty()", nameSummary("function", "")},
        {byName("", nullptr), "strValue.empty()", nameSummary("(null)", "")},
        {byName("", "foo"), "strValue.empty()", nameSummary("foo", "")},
        {byName("a", nullptr), szNoName, nameSummary("(null)", "a")},
        {byName("a", ""), szNoName, nameSummary("", "a")},
        {byName("a", "foo"), szField, nameSummary("foo", "a")},
        {byName("%s", "tid "), szField, nameSummary("tid ", "%s")}};
    for (const auto& refusal : refusals) {
        for (const int nErrno : {0, EACCES}) {
            SCOPED_TRACE(refusal.strSummary);
            errno = nErrno;

            EXPECT_EQ(-1, refusal.remove(api()));

            EXPECT_EQ((Texts{failed(API, refusal.szCondition, nErrno), refusal.strSummary}), takeLines());
        }
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

// tokenDeleteByName leaves the test of the type to tokenDeleteByArray, and both tell.
TEST_F(Deletion, ByNameRefusesFieldsThatAreNoStrings)
{
    for (const char* szName : {"uid", "deadline", "count", "create_time", "webapi_allow", "extra"}) {
        SCOPED_TRACE(szName);

        EXPECT_EQ(-1, byName("1000", szName)(api()));

        EXPECT_EQ(
            (Texts{failed(API, "jType[szName][0].asString() != \"string\""), arraySummary(szName, "1000"),
                   failed(API, "0 > (err = tokenDeleteByArray(strVector, szName))"),
                   nameSummary(szName, "1000")}),
            takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Deletion, TellsOfAListThatCannotBecomeAFilter)
{
    g_nVectorParamResult = -1;

    EXPECT_EQ(-1, byArray({"a", "b"}, "tid")(api()));

    EXPECT_EQ(
        (Texts{failed(API, "0 > VectorParamToJson(strVector, szName, jParam)"), arraySummary("tid", "a,b")}),
        takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

// Whatever may go wrong with the filter, a deletion by value never empties the table.
TEST_F(Deletion, ByArrayNeverRunsWithoutACondition)
{
    g_nVectorParamResult = 0;

    EXPECT_EQ(-1, byArray({"a"}, "tid")(api()));

    EXPECT_EQ((Texts{failed(STORE, "strSql.empty()"), failed(API, "0 > (err = m_pDb->tokenDelete(jParam))"),
                     arraySummary("tid", "a")}),
              takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

const std::string BY_TID = "DELETE FROM token WHERE  (tid in ('a' ) );";

// The lines of tokenDeleteByName above those of the store.
const Texts ABOVE_STORE = {
    failed(API, "0 > (err = m_pDb->tokenDelete(jParam))", EIO), arraySummary("tid", "a"),
    failed(API, "0 > (err = tokenDeleteByArray(strVector, szName))", EIO), nameSummary("tid", "a")};

TEST_F(Deletion, TellsEachStepOfAStoreFailure)
{
    failStatements("disk I/O error", 1);

    EXPECT_EQ(-1, byTid("a")(api()));

    EXPECT_EQ(diskErrorLines(BY_TID) + ABOVE_STORE, takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

// The statement took effect all the same.
TEST_F(Deletion, ReportsFailureAfterWaitingForALock)
{
    failStatements("database is locked", 1);

    EXPECT_EQ(-1, byTid("a")(api()));

    EXPECT_EQ(Texts{fail(STORE, "sql error, sql=" + BY_TID, EIO)} + ABOVE_STORE, takeLines());
    EXPECT_EQ("a'b b c", tids());
}

TEST_F(Deletion, OfAListTellsItsValuesWhenTheStoreFails)
{
    failStatements("disk I/O error", 1);

    EXPECT_EQ(-1, byTidArray({"a", "b", "c"})(api()));

    EXPECT_EQ(
        diskErrorLines("DELETE FROM token WHERE  (tid in ('a''b''c' ) );") +
            Texts({failed(API, "0 > (err = m_pDb->tokenDelete(jParam))", EIO), arraySummary("tid", "a,b,c")}),
        takeLines());
}

TEST_F(Deletion, OfAllHasOnlyTheStoresLines)
{
    failStatements("disk I/O error", 1);

    EXPECT_EQ(-1, api().tokenDeleteAll());

    EXPECT_EQ(diskErrorLines("DELETE FROM token;"), takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

TEST_F(Deletion, FailsWithoutAStore)
{
    seam().fail("operator new", 0, 2, 2); // the fixture's own service was the first
    AccessTokenApi apiWithoutStore;
    EXPECT_EQ((Texts{ordinary(API, "new AccessTokenDbApi failed")}), takeLines());

    for (const DeletionCase& deletion : DELETIONS) {
        SCOPED_TRACE(deletion.szName);
        EXPECT_EQ(-1, deletion.remove(apiWithoutStore));
    }
    EXPECT_EQ(-1, apiWithoutStore.tokenDeleteAll());
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(true));
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(false));
    EXPECT_EQ(ALL_TIDS, tids());
}

class ServicePurge : public Deletion {};

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

const std::string RUN = ordinary(STORE, "run sql=" + PURGE);
const std::string CHANGE = ordinary(STORE, "change rv=0, run sql=" + PURGE);
const std::string LOCKED = ordinary(STORE, "i=0,run sql failed, error=database is locked, sql=" + PURGE);
const std::string DISK_ERROR = ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + PURGE);
const std::string NOT_RUN = fail(STORE, "run sql failed, sql=" + PURGE, EIO);
const Texts NOT_OPENED = {failed(STORE, "0 > seteuid(0)", EPERM), failed(STORE, "0 > initDb()", EPERM)};

const PurgeFailure PURGE_FAILURES[] = {{"StatementRefused",
                                        [] { failStatements("disk I/O error", 1); },
                                        {DISK_ERROR, NOT_RUN},
                                        {RUN, DISK_ERROR, NOT_RUN},
                                        "run sql failed",
                                        EIO},
                                       {"LockWaitedOut",
                                        [] { failStatements("database is locked", 1); },
                                        {},
                                        {RUN, LOCKED, RUN, CHANGE},
                                        "sql error, sql=" + PURGE,
                                        EIO},
                                       {"DatabaseNotOpened",
                                        [] { seam().fail("seteuid", EPERM, 1, INT_MAX); }, NOT_OPENED,
                                        NOT_OPENED, "run sql failed", EPERM}};

class ServicePurgeFails : public Deletion,
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
        expected.push_back(failed(API, "0 > m_pDb->cleanExpireToken(blLogErr)", failure.nErrno));
    } else if (blDebug) {
        expected.push_back(fail(API, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)", failure.nErrno));
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

// Without the switch to standard output.
class DeletionToSystemLog : public ::testing::Test {
protected:
    void SetUp() override
    {
        seam() = Seam();
        seam().fail("seteuid", EPERM, 1, INT_MAX); // no database is ever reached
    }
};

TEST_F(DeletionToSystemLog, TellsErrnoInFrontOfEachLine)
{
    AccessTokenApi api;
    for (const int nErrno : {0, EACCES}) {
        takeLines();
        errno = nErrno;

        EXPECT_EQ(-1, byTid("")(api));

        const std::string strError = strerror(nErrno);
        EXPECT_EQ((Texts{ordinary(API,
                                  "(AccessTokenApi.cpp:#)(" + strError +
                                      ")Failed [strValue.empty()], err=" + strError + "\n",
                                  nErrno),
                         ordinary(API, "tokenDeleteByName failed, name=tid, strValue=", nErrno)}),
                  takeLines(Destination::Syslog));
    }
    EXPECT_EQ((Texts{"syslog 3", "syslog 3", "syslog 3", "syslog 3", "syslog 3"}),
              seam().callsOf({"syslog"}));
}

} // namespace

// Nothing that a caller passes makes the conversion fail where a deletion calls it; a test does.
int AccessTokenApi::VectorParamToJson(std::vector<std::string>& strVector, const char* szField,
                                      Json::Value& jParamOut)
{
    typedef int Function(AccessTokenApi*, std::vector<std::string>&, const char*, Json::Value&);
    if (g_nVectorParamResult) {
        return *g_nVectorParamResult;
    }
    void* const pNext =
        dlsym(RTLD_NEXT, "_ZN14AccessTokenApi17VectorParamToJsonERSt6vectorINSt7__cxx1112basic_"
                         "stringIcSt11char_traitsIcESaIcEEESaIS6_EEPKcRN4Json5ValueE");
    return reinterpret_cast<Function*>(pNext)(this, strVector, szField, jParamOut);
}
