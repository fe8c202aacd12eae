// Deleting tokens, by one value, by a list of values, and all of them.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

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

// Four tokens: a, b, a'b and c.
class Deletion : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        fill();
    }

    int byTid(std::string strTid) { return api().tokenDeleteByTid(strTid); }
    int bySid(std::string strSid) { return api().tokenDeleteByBindSid(strSid); }
    int byFunction(std::string strFunction) { return api().tokenDeleteByFunction(strFunction); }
    int byTids(Texts values) { return api().tokenDeleteByTidArray(values); }
    int byName(std::string strValue, const char* szName) { return api().tokenDeleteByName(strValue, szName); }
    int byArray(Texts values, const char* szName) { return api().tokenDeleteByArray(values, szName); }

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
    const auto deletes = [&](int nResult, const char* szCondition, int nDeleted, const char* szLeft) {
        SCOPED_TRACE(szCondition);
        EXPECT_EQ(nDeleted, nResult);
        EXPECT_EQ(
            (Texts{std::string("sqlite3_exec DELETE FROM token WHERE  (") + szCondition + " );", CHANGES}),
            seam().callsOf(OPENING_CALLS));
        EXPECT_EQ(szLeft, tids());
        fill();
        seam().calls.clear();
    };
    deletes(byTid("a"), "tid in ('a' )", 1, "a'b b c");
    deletes(byTid("zz"), "tid in ('zz' )", 0, szAll);
    deletes(byTid("' OR '1'='1"), "tid in (''' OR ''1''=''1' )", 0, szAll);
    deletes(bySid("S1"), "bind_sid in ('S1' )", 2, "a'b c");
    deletes(byFunction("VPN"), "function in ('VPN' )", 2, "b c");
    deletes(byFunction("O'Brien"), "function in ('O''Brien' )", 1, "a a'b b");
    deletes(byName("a", "tid"), "tid in ('a' )", 1, "a'b b c");
    // No separator stands between the elements, so several values are one text.
    deletes(byTids({"a", "b"}), "tid in ('a''b' )", 1, "a b c");
    // Only the list itself must not be empty: an empty element selects the unbound tokens.
    deletes(byArray({""}, "bind_sid"), "bind_sid in ('' )", 1, "a b c");
    EXPECT_EQ(4, api().tokenDeleteAll());
    EXPECT_EQ(0, api().tokenDeleteAll());
    EXPECT_EQ("DELETE FROM token;", seam().statements().back());
    EXPECT_EQ("", tids());
}

// The table of types decides, as it is now.
TEST_F(Deletion, FollowsTheTypeTable)
{
    VEMO_ACCESS_TOKEN::tokenType()["uid"][0] = "string";
    EXPECT_EQ(4, byName("1000", "uid"));
}

TEST_F(Deletion, RefusesListsValuesAndNames)
{
    const std::string strField = "!jType.isMember(szName)";
    const std::string strNoName = "!szName || !szName[0]";
    const std::string strEmpty = "strValue.empty()";
    const auto refuses = [](int nResult, const std::string& strCondition, const std::string& strSummary) {
        EXPECT_EQ(-1, nResult);
        EXPECT_LINES(failed(SERVICE, strCondition, EACCES), strSummary);
    };
    errno = EACCES;
    refuses(byTids({}), "0 >= strVector.size()", arraySummary("tid", ""));
    refuses(byArray({}, nullptr), "0 >= strVector.size()", arraySummary("(null)", ""));
    refuses(byArray({"a", "b", "c"}, nullptr), strNoName, arraySummary("(null)", "a,b,c"));
    refuses(byArray({"a", "b", "c"}, ""), strNoName, arraySummary("", "a,b,c"));
    refuses(byArray({"a"}, "foo"), strField, arraySummary("foo", "a"));
    refuses(byArray({"a"}, "sort_by"), strField, arraySummary("sort_by", "a"));
    refuses(byArray({"1000", "1001"}, "uid"), NO_STRING, arraySummary("uid", "1000,1001"));
    refuses(byArray({"", "", ""}, "deadline"), NO_STRING, arraySummary("deadline", ",,"));
    refuses(byArray({"a,b", "%s%n"}, "create_time"), NO_STRING, arraySummary("create_time", "a,b,%s%n"));
    refuses(byTid(""), strEmpty, nameSummary("tid", ""));
    refuses(bySid(""), strEmpty, nameSummary("bind_sid", ""));
    refuses(byFunction(""), strEmpty, nameSummary("function", ""));
    refuses(byName("", nullptr), strEmpty, nameSummary("(null)", ""));
    refuses(byName("a", nullptr), strNoName, nameSummary("(null)", "a"));
    refuses(byName("a", ""), strNoName, nameSummary("", "a"));
    refuses(byName("a", "foo"), strField, nameSummary("foo", "a"));
    // tokenDeleteByName leaves the check of the type to tokenDeleteByArray, and both log.
    EXPECT_FAILURE(byName("1000", "uid"), failed(SERVICE, NO_STRING, EACCES), arraySummary("uid", "1000"),
                   failed(SERVICE, ARRAY_FAILED, EACCES), nameSummary("uid", "1000"));
    EXPECT_EQ(Texts{}, seam().statements());
}

} // namespace
