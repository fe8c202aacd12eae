// Deleting tokens, by one value, by a list of values, and all of them.

#include <functional>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

typedef std::function<int(AccessTokenApi&)> Removal;

const std::string STORE_FAILED = "0 > (err = m_pDb->tokenDelete(jParam))";
const std::string ARRAY_FAILED = "0 > (err = tokenDeleteByArray(strVector, szName))";
const std::string NO_STRING = "jType[szName][0].asString() != \"string\"";

std::string arraySummary(const std::string& strName, const std::string& strList)
{
    return ordinary(SERVICE, "tokenDeleteByArray failed, name=" + strName + ", strVector=" + strList);
}

std::string nameSummary(const std::string& strName, const std::string& strValue)
{
    return ordinary(SERVICE, "tokenDeleteByName failed, name=" + strName + ", strValue=" + strValue);
}

Removal byValue(int (AccessTokenApi::*pRemove)(std::string&), std::string strValue)
{
    return [=](AccessTokenApi& api) mutable { return (api.*pRemove)(strValue); };
}

Removal byTid(const char* szTid)
{
    return byValue(&AccessTokenApi::tokenDeleteByTid, szTid);
}

Removal bySid(const char* szSid)
{
    return byValue(&AccessTokenApi::tokenDeleteByBindSid, szSid);
}

Removal byFunction(const char* szTag)
{
    return byValue(&AccessTokenApi::tokenDeleteByFunction, szTag);
}

Removal byName(std::string strValue, const char* szName)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByName(strValue, szName); };
}

Removal byTids(Texts values)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByTidArray(values); };
}

Removal byArray(Texts values, const char* szName)
{
    return [=](AccessTokenApi& api) mutable { return api.tokenDeleteByArray(values, szName); };
}

// Four tokens: a, b, a'b and c.
class Deletion : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        fill();
    }

    void fill() const
    {
        query("DELETE FROM token");
        insert(R"({"tid":"a"})");
        insert(R"({"tid":"b","function":"MAIL"})");
        insert(R"({"tid":"a'b","bind_sid":""})");
        insert(R"({"tid":"c","bind_sid":"S2","function":"O'Brien"})");
    }
};

TEST_F(Deletion, RunsOneStatementAndCounts)
{
    const char* const szAll = "a a'b b c";
    const struct {
        Removal remove;
        const char* szCondition;
        int nDeleted;
        const char* szLeft;
    } rows[] = {
        {byTid("a"), "tid in ('a' )", 1, "a'b b c"},
        {byTid("zz"), "tid in ('zz' )", 0, szAll},
        {byTid("A"), "tid in ('A' )", 0, szAll},
        {byTid("' OR '1'='1"), "tid in (''' OR ''1''=''1' )", 0, szAll},
        {byTid("%"), "tid in ('%' )", 0, szAll},
        {bySid("S1"), "bind_sid in ('S1' )", 2, "a'b c"},
        {byFunction("VPN"), "function in ('VPN' )", 2, "b c"},
        {byFunction("O'Brien"), "function in ('O''Brien' )", 1, "a a'b b"},
        {byName("a", "tid"), "tid in ('a' )", 1, "a'b b c"},
        {byName("S2", "bind_sid"), "bind_sid in ('S2' )", 1, "a a'b b"},
        {byName("MAIL", "function"), "function in ('MAIL' )", 1, "a a'b c"},
        {byTids({"c"}), "tid in ('c' )", 1, "a a'b b"},
        // No separator stands between the elements, so several values are one text.
        {byTids({"a", "b", "zz"}), "tid in ('a''b''zz' )", 0, szAll},
        {byTids({"a", "b"}), "tid in ('a''b' )", 1, "a b c"},
        // Only the list itself must not be empty: an empty element selects the unbound tokens.
        {byArray({""}, "bind_sid"), "bind_sid in ('' )", 1, "a b c"},
        {byArray({"VPN"}, "function"), "function in ('VPN' )", 2, "b c"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szCondition);
        fill();
        seam().calls.clear();
        EXPECT_EQ(row.nDeleted, row.remove(api()));
        EXPECT_EQ((Texts{std::string("sqlite3_exec DELETE FROM token WHERE  (") + row.szCondition + " );",
                         CHANGES}),
                  seam().callsOf(OPENING_CALLS));
        EXPECT_EQ(row.szLeft, tids());
    }
    EXPECT_EQ(2, api().tokenDeleteAll());
    EXPECT_EQ(0, api().tokenDeleteAll());
    EXPECT_EQ("DELETE FROM token;", seam().statements().back());
    EXPECT_EQ("", tids());
}

// The table of types decides, as it is now.
TEST_F(Deletion, FollowsTheTypeTable)
{
    VEMO_ACCESS_TOKEN::tokenType()["uid"][0] = "string";
    EXPECT_EQ(4, byName("1000", "uid")(api()));
}

TEST_F(Deletion, RefusesListsValuesAndNames)
{
    const std::string strField = "!jType.isMember(szName)";
    const std::string strNoName = "!szName || !szName[0]";
    const std::string strEmpty = "strValue.empty()";
    const struct {
        Removal remove;
        std::string strCondition;
        std::string strSummary;
    } rows[] = {
        {byTids({}), "0 >= strVector.size()", arraySummary("tid", "")},
        {byArray({}, nullptr), "0 >= strVector.size()", arraySummary("(null)", "")},
        {byArray({"a", "b", "c"}, nullptr), strNoName, arraySummary("(null)", "a,b,c")},
        {byArray({"a", "b", "c"}, ""), strNoName, arraySummary("", "a,b,c")},
        {byArray({"a"}, "foo"), strField, arraySummary("foo", "a")},
        {byArray({"a"}, "Tid"), strField, arraySummary("Tid", "a")},
        {byArray({"a"}, "sort_by"), strField, arraySummary("sort_by", "a")},
        {byArray({"1000", "1001"}, "uid"), NO_STRING, arraySummary("uid", "1000,1001")},
        {byArray({"", "", ""}, "deadline"), NO_STRING, arraySummary("deadline", ",,")},
        {byArray({""}, "count"), NO_STRING, arraySummary("count", "")},
        {byArray({"a,b", "%s%n"}, "create_time"), NO_STRING, arraySummary("create_time", "a,b,%s%n")},
        {byArray({"{}"}, "webapi_allow"), NO_STRING, arraySummary("webapi_allow", "{}")},
        {byArray({"{}"}, "extra"), NO_STRING, arraySummary("extra", "{}")},
        {byTid(""), strEmpty, nameSummary("tid", "")},
        {bySid(""), strEmpty, nameSummary("bind_sid", "")},
        {byFunction(""), strEmpty, nameSummary("function", "")},
        {byName("", nullptr), strEmpty, nameSummary("(null)", "")},
        {byName("", "foo"), strEmpty, nameSummary("foo", "")},
        {byName("a", nullptr), strNoName, nameSummary("(null)", "a")},
        {byName("a", ""), strNoName, nameSummary("", "a")},
        {byName("a", "foo"), strField, nameSummary("foo", "a")},
        {byName("%s", "tid "), strField, nameSummary("tid ", "%s")},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.strSummary);
        errno = EACCES;
        EXPECT_FAILURE(row.remove(api()), failed(SERVICE, row.strCondition, EACCES), row.strSummary);
    }
    // tokenDeleteByName leaves the check of the type to tokenDeleteByArray, and both log.
    EXPECT_FAILURE(byName("1000", "uid")(api()), failed(SERVICE, NO_STRING, EACCES),
                   arraySummary("uid", "1000"), failed(SERVICE, ARRAY_FAILED, EACCES),
                   nameSummary("uid", "1000"));
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Deletion, TellsEachStepOfAFailure)
{
    const auto refused = [](const std::string& strSql) {
        return failureOf(strSql, DISK_ERROR.szError, EIO) + Texts{failed(STORE, "0 > (err = runSql())", EIO)};
    };
    const Texts above = {failed(SERVICE, STORE_FAILED, EIO), arraySummary("tid", "a"),
                         failed(SERVICE, ARRAY_FAILED, EIO), nameSummary("tid", "a")};
    failStatements("DELETE", DISK_ERROR, 3);
    EXPECT_FAILURE(byTid("a")(api()), refused(deleteSql("tid", "a")) + above);
    EXPECT_FAILURE(byTids({"a", "b", "c"})(api()),
                   refused(deleteSql("tid", "a''b''c")) +
                       Texts{failed(SERVICE, STORE_FAILED, EIO), arraySummary("tid", "a,b,c")});
    EXPECT_FAILURE(api().tokenDeleteAll(), refused("DELETE FROM token;"));
    EXPECT_EQ("a a'b b c", tids());
    // A statement that had to wait has taken effect.
    failStatements("DELETE", LOCKED);
    EXPECT_FAILURE(byTid("a")(api()),
                   Texts{fail(STORE, "sql error, sql=" + deleteSql("tid", "a"), EIO)} + above);
    EXPECT_EQ("a'b b c", tids());
}

} // namespace
