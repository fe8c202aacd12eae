// Deleting tokens, by one value, by a list of values, and all of them.

#include <functional>

#include "AccessTokenUtil.h"
#include "FourTokens.h"
#include "StandIns.h"
#include "Statements.h"

namespace {

// What the store writes when SQLite refuses a deletion.
Texts diskErrorLines(const std::string& strSql)
{
    return failureOf(strSql, DISK_ERROR.szError, EIO) + Texts{failed(STORE, "0 > (err = runSql())", EIO)};
}

std::string arraySummary(const std::string& strName, const std::string& strList)
{
    return ordinary(SERVICE, "tokenDeleteByArray failed, name=" + strName + ", strVector=" + strList);
}

std::string nameSummary(const std::string& strName, const std::string& strValue)
{
    return ordinary(SERVICE, "tokenDeleteByName failed, name=" + strName + ", strValue=" + strValue);
}

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

class Deletion : public FourTokens {};

class DeletionBy : public FourTokens, public ::testing::WithParamInterface<DeletionCase> {};

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
    const std::string strSql = deleteSql("bind_sid", "S1");
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

            EXPECT_EQ((Texts{failed(SERVICE, refusal.szCondition, nErrno), refusal.strSummary}), takeLines());
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
            (Texts{failed(SERVICE, "jType[szName][0].asString() != \"string\""), arraySummary(szName, "1000"),
                   failed(SERVICE, "0 > (err = tokenDeleteByArray(strVector, szName))"),
                   nameSummary(szName, "1000")}),
            takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Deletion, TellsOfAListThatCannotBecomeAFilter)
{
    standIns().vectorParamToJson = [](Texts&, const char*, Json::Value&) { return -1; };

    EXPECT_EQ(-1, byArray({"a", "b"}, "tid")(api()));

    EXPECT_EQ((Texts{failed(SERVICE, "0 > VectorParamToJson(strVector, szName, jParam)"),
                     arraySummary("tid", "a,b")}),
              takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

// Whatever may go wrong with the filter, a deletion by value never empties the table.
TEST_F(Deletion, ByArrayNeverRunsWithoutACondition)
{
    standIns().vectorParamToJson = [](Texts&, const char*, Json::Value&) { return 0; };

    EXPECT_EQ(-1, byArray({"a"}, "tid")(api()));

    EXPECT_EQ((Texts{failed(STORE, "strSql.empty()"),
                     failed(SERVICE, "0 > (err = m_pDb->tokenDelete(jParam))"), arraySummary("tid", "a")}),
              takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

const std::string BY_TID = deleteSql("tid", "a");

// The lines of tokenDeleteByName above those of the store.
const Texts ABOVE_STORE = {
    failed(SERVICE, "0 > (err = m_pDb->tokenDelete(jParam))", EIO), arraySummary("tid", "a"),
    failed(SERVICE, "0 > (err = tokenDeleteByArray(strVector, szName))", EIO), nameSummary("tid", "a")};

TEST_F(Deletion, TellsEachStepOfAStoreFailure)
{
    failStatements("DELETE", DISK_ERROR);

    EXPECT_EQ(-1, byTid("a")(api()));

    EXPECT_EQ(diskErrorLines(BY_TID) + ABOVE_STORE, takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

// The statement took effect all the same.
TEST_F(Deletion, ReportsFailureAfterWaitingForALock)
{
    failStatements("DELETE", LOCKED);

    EXPECT_EQ(-1, byTid("a")(api()));

    EXPECT_EQ(Texts{fail(STORE, "sql error, sql=" + BY_TID, EIO)} + ABOVE_STORE, takeLines());
    EXPECT_EQ("a'b b c", tids());
}

TEST_F(Deletion, OfAListTellsItsValuesWhenTheStoreFails)
{
    failStatements("DELETE", DISK_ERROR);

    EXPECT_EQ(-1, byTidArray({"a", "b", "c"})(api()));

    EXPECT_EQ(diskErrorLines(deleteSql("tid", "a''b''c")) +
                  (Texts{failed(SERVICE, "0 > (err = m_pDb->tokenDelete(jParam))", EIO),
                         arraySummary("tid", "a,b,c")}),
              takeLines());
}

TEST_F(Deletion, OfAllHasOnlyTheStoresLines)
{
    failStatements("DELETE", DISK_ERROR);

    EXPECT_EQ(-1, api().tokenDeleteAll());

    EXPECT_EQ(diskErrorLines("DELETE FROM token;"), takeLines());
    EXPECT_EQ(ALL_TIDS, tids());
}

TEST_F(Deletion, FailsWithoutAStore)
{
    seam().fail("operator new", 0, 2, 2); // the fixture's own service was the first
    AccessTokenApi apiWithoutStore;
    EXPECT_EQ((Texts{ordinary(SERVICE, "new AccessTokenDbApi failed")}), takeLines());

    for (const DeletionCase& deletion : DELETIONS) {
        SCOPED_TRACE(deletion.szName);
        EXPECT_EQ(-1, deletion.remove(apiWithoutStore));
    }
    EXPECT_EQ(-1, apiWithoutStore.tokenDeleteAll());
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(true));
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(false));
    EXPECT_EQ(ALL_TIDS, tids());
}

class DeletionToSystemLog : public FourTokens {
protected:
    DeletionToSystemLog() : FourTokens(Destination::Syslog) {}
};

TEST_F(DeletionToSystemLog, TellsErrnoInFrontOfEachLine)
{
    for (const int nErrno : {0, EACCES}) {
        errno = nErrno;

        EXPECT_EQ(-1, byTid("")(api()));

        EXPECT_EQ(inSystemLog({failed(SERVICE, "strValue.empty()", nErrno), nameSummary("tid", "")}, nErrno),
                  takeLines(Destination::Syslog));
    }
    EXPECT_EQ((Texts{"syslog 3", "syslog 3", "syslog 3", "syslog 3"}), seam().callsOf({"syslog"}));
}

} // namespace
