// Reading and deleting the tokens of the store that a filter selects.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::debugInfo;

namespace {

const std::string RUN_QUERY_FAILED = "0 > runSql(FillList, &jTokenArrayOut)";
const std::string RUN_DELETE_FAILED = "0 > (err = runSql())";
const std::string GET_FAILED = "0 > tokenGet(jParam, jTokenArray)";
const std::string NO_FILTER = "jTokenParam.type() != Json::objectValue";
const std::string ALL = "Ab12 Cd34 Ef56";

class Query : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        fill();
    }

    // Three tokens: Ab12 and Cd34 of user 1024, Ef56 of user 7.
    void fill() const
    {
        query("DELETE FROM token");
        insert(R"({"tid":"Ab12","uid":1024,"create_time":100})");
        insert(
            R"({"tid":"Cd34","uid":1024,"create_time":300,"bind_sid":"S2","webapi_allow":{"a":{}},"extra":{}})");
        insert(R"({"tid":"Ef56","uid":7,"create_time":200,"function":"FTP"})");
    }

    // The operations, given their filter as text, which they leave as it is.
    int get(const std::string& strFilter, const char* szOut = "null")
    {
        m_jOut = json(szOut);
        return keeps(strFilter, [&](Json::Value& jFilter) { return m_db.tokenGet(jFilter, m_jOut); });
    }
    int remove(const std::string& strFilter, bool bAll = false)
    {
        return keeps(strFilter, [&](Json::Value& jFilter) { return m_db.tokenDelete(jFilter, bAll); });
    }
    int getOne(const char* szName, std::string strValue)
    {
        m_jOut = json(R"({"old":1})");
        return m_db.tokenGetOne(szName, strValue, m_jOut);
    }

    // The ids in m_jOut, with blanks between.
    std::string found() const
    {
        Texts ids;
        for (const Json::Value& jToken : m_jOut) {
            ids.push_back(jToken["tid"].asString());
        }
        return joined(ids, " ");
    }

    Json::Value m_jOut;

private:
    template <typename Operation>
    static int keeps(const std::string& strFilter, Operation operation)
    {
        Json::Value jFilter = json(strFilter);
        const int nResult = operation(jFilter);
        EXPECT_EQ(json(strFilter), jFilter);
        return nResult;
    }
};

TEST_F(Query, RunsTheStatementThatTheFilterMakes)
{
    const auto finds = [&](const char* szFilter, const std::string& strCondition,
                           const std::string& strFound) {
        SCOPED_TRACE(szFilter);
        EXPECT_EQ(0, get(szFilter));
        EXPECT_EQ(SELECT + strCondition + ";", m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(strFound, found());
        EXPECT_EQ(strFound.empty(), m_jOut.isNull());
    };
    finds("{}", "", ALL);
    finds(R"({"tid":"Ab12"})", " WHERE  (tid='Ab12' )", "Ab12");
    finds(R"({"uid":1024,"sort_by":"create_time","sort_direction":"desc"})",
          " WHERE  (uid=1024 ) order by 'create_time' DESC", "Ab12 Cd34"); // sorted by a constant
    finds(R"({"tid":"nobody"})", " WHERE  (tid='nobody' )", "");
    finds(R"({"foo":"x","offset":3,"sort_direction":"desc"})", "", ALL);
    finds(R"({"limit":7,"offset":8})", "", ALL);
    finds(R"({"function":"VPN","bind_sid":"S1"})", " WHERE  (bind_sid='S1' and function='VPN' )", "Ab12");
    finds(R"({"uid":7,"limit":6})", " WHERE  (uid=7 ) ", "Ef56");
    finds(R"({"uid":"7 or 1"})", " WHERE  (uid=7 or 1 )", ALL);
    finds(R"({"tid":["Cd34"]})", " WHERE  (tid in ('Cd34' ) )", "Cd34");
    finds(R"({"tid":["Ab12","Cd34"]})", " WHERE  (tid in ('Ab12''Cd34' ) )", ""); // one value
    finds(R"({"webapi_allow":[{"a":{}}]})", R"( WHERE  (webapi_allow in ('{"a":{}}' ) ))", "Cd34");
    EXPECT_EQ(ALL, tids());
}

TEST_F(Query, FailsWhereSqliteRefusesTheStatement)
{
    const auto fails = [&](const char* szFilter, const std::string& strCondition,
                           const std::string& strError) {
        SCOPED_TRACE(szFilter);
        const std::string strSql = SELECT + " WHERE " + strCondition + ";";
        errno = EIO;
        EXPECT_EQ(-1, get(szFilter));
        EXPECT_EQ(strSql, m_db.m_strSql);
        EXPECT_EQ(strError, m_db.m_strErr);
        EXPECT_TRUE(m_jOut.isNull());
        EXPECT_LINES(failureOf(strSql, strError, EIO) + Texts{failed(STORE, RUN_QUERY_FAILED, EIO)});
    };
    fails(R"({"sort_by":"uid"})", " order by 'uid'", "near \"order\": syntax error");
    fails(R"({"function":"VPN","limit":0})", " (function='VPN' ) LIMIT ", "near \";\": syntax error");
    fails(R"({"limit":2})", "IMIT ", "no such column: IMIT");
    fails(R"({"uid":[]})", " ( )", "near \")\": syntax error");
    EXPECT_EQ(0, get("{}"));
    EXPECT_EQ("", m_db.m_strErr);
}

TEST_F(Query, RefusesWhatItCannotUseAndRunsNothing)
{
    m_db.m_strSql = "earlier";
    for (const char* szFilter : {"null", "[1,2]", R"("x")", "5", "true"}) {
        SCOPED_TRACE(szFilter);
        EXPECT_EQ(-1, get(szFilter));
        EXPECT_EQ(-1, get(szFilter, "{}"));
        EXPECT_FAILURE(remove(szFilter, true), allFailed(STORE, {NO_FILTER, NO_FILTER, NO_FILTER}));
    }
    for (const char* szOut : {"{}", R"({"a":1})", R"("")", "0", "false", "1.5"}) {
        SCOPED_TRACE(szOut);
        EXPECT_EQ(-1, get("{}", szOut));
        EXPECT_EQ(json(szOut), m_jOut);
        EXPECT_LINES(failed(STORE, "jTokenArrayOut.type() != Json::nullValue && "
                                   "jTokenArrayOut.type() != Json::arrayValue"));
    }
    const struct {
        const char *szName, *szValue, *szCondition;
    } rows[] = {
        {nullptr, "x", "!szName || !szName[0]"}, {"", "x", "!szName || !szName[0]"},
        {nullptr, "", "!szName || !szName[0]"},  {"tid", "", "strValue.empty()"},
        {"foo", "", "strValue.empty()"},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(-1, getOne(row.szName, row.szValue));
        EXPECT_EQ(json(R"({"old":1})"), m_jOut);
        EXPECT_LINES(failed(STORE, row.szCondition));
    }
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

TEST_F(Query, PassesOnTheFailuresOfTheFilter)
{
    const Texts nested = {fail(STORE, "err input type, jTokenParam=(null)"),
                          failed(STORE, "0 > SqlWhereFromJson(jTokenParam, strSql, true)")};
    m_db.m_strSql = "earlier";
    EXPECT_FAILURE(get(R"({"tid":{"a":1}})"), nested);
    EXPECT_FAILURE(remove(R"({"tid":{"a":1}})", true), nested);
    // The text of the field is the first, that of the order the second.
    seam().fail("sqlite3_mprintf", ENOMEM, 2, 2);
    EXPECT_FAILURE(
        get(R"({"uid":7,"sort_by":"uid"})"),
        allFailed(STORE, {"!szSql", "0 > SqlFilterConditionFromJson(jTokenParam, strSql)"}, ENOMEM));

    EXPECT_THROW(get(R"({"sort_by":5})"), Json::Exception);
    EXPECT_THROW(get(R"({"tid":[[]]})"), Json::Exception);
    EXPECT_THROW(remove(R"({"uid":[{}]})", true), Json::Exception);
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

TEST_F(Query, KeepsTheRowsBeforeOneThatCannotBeDecoded)
{
    query("UPDATE token SET extra = NULL WHERE tid = 'Cd34'");
    EXPECT_EQ(-1, get("{}"));
    EXPECT_EQ("Ab12", found());
    const Texts lines = allFailed(STORE, {"NULL == column_name[i] || NULL == column_value[i]",
                                          "0 > FillToken(&jTmp, n_column, column_value, column_name)"});
    EXPECT_LINES(lines + failureOf(SELECT + ";", "query aborted") + Texts{failed(STORE, RUN_QUERY_FAILED)});
    EXPECT_FAILURE(getOne("tid", "Cd34"), lines + failureOf(selectSql("Cd34"), "query aborted") +
                                              allFailed(STORE, {RUN_QUERY_FAILED, GET_FAILED}));
    EXPECT_EQ(json("{}"), m_jOut);
}

TEST_F(Query, OpensTheDatabaseOnceAndWhenItIsNeeded)
{
    seam().fail("seteuid", EPERM, 1, 6); // each opening raises and puts back
    EXPECT_FAILURE(get("{}"), NOT_OPENED + Texts{failed(STORE, RUN_QUERY_FAILED, EPERM)});
    EXPECT_FAILURE(getOne("tid", "8"), NOT_OPENED + allFailed(STORE, {RUN_QUERY_FAILED, GET_FAILED}, EPERM));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_FAILURE(remove(R"({"uid":9})"), NOT_OPENED + Texts{failed(STORE, RUN_DELETE_FAILED, EPERM)});
    EXPECT_EQ("DELETE FROM token WHERE  (uid=9 );", m_db.m_strSql);

    EXPECT_EQ(0, get("{}"));
    EXPECT_EQ(1, getOne("tid", "Ab12"));
    EXPECT_EQ(3, remove("{}", true));
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));
}

TEST_F(Query, ReportsFailureAfterALockThatItWaitedOut)
{
    failStatements("SELECT", LOCKED);
    EXPECT_FAILURE(get(R"({"uid":1024})"),
                   fail(STORE, "sql error, sql=" + SELECT + " WHERE  (uid=1024 );", EIO));
    EXPECT_EQ("Ab12 Cd34", found());
    EXPECT_EQ("database is locked", m_db.m_strErr);
    failStatements("SELECT", LOCKED);
    EXPECT_EQ(-1, getOne("tid", "Ab12"));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_LINES(fail(STORE, "sql error, sql=" + selectSql("Ab12"), EIO), failed(STORE, GET_FAILED, EIO));
    failStatements("DELETE", LOCKED);
    EXPECT_FAILURE(remove(R"({"uid":7})"),
                   fail(STORE, "sql error, sql=DELETE FROM token WHERE  (uid=7 );", EIO));
    EXPECT_EQ("Ab12 Cd34", tids());
    EXPECT_EQ(0, get(R"({"uid":1024})"));
    EXPECT_EQ("", m_db.m_strErr);
}

TEST_F(Query, GetsTheFirstRowWhoseFieldMatches)
{
    // szTid is null when no row matches.
    const auto getsOne = [&](const char* szName, const char* szValue, const std::string& strCondition,
                             const char* szTid) {
        SCOPED_TRACE(std::string(szName) + "=" + szValue);
        EXPECT_EQ(szTid ? 1 : 0, getOne(szName, szValue));
        EXPECT_EQ(SELECT + strCondition + ";", m_db.m_strSql);
        EXPECT_EQ(szTid ? 9u : 0u, m_jOut.size());
        EXPECT_EQ(szTid ? szTid : "", m_jOut["tid"].asString());
    };
    getsOne("tid", "Ab12", " WHERE  (tid='Ab12' )", "Ab12");
    getsOne("uid", "1024", " WHERE  (uid=1024 )", "Ab12");
    getsOne("bind_sid", "S1", " WHERE  (bind_sid='S1' )", "Ab12");
    getsOne("tid", "nobody", " WHERE  (tid='nobody' )", nullptr);
    getsOne("extra", "{}", " WHERE  (extra='\"{}\"' )", nullptr); // the value is a text, in JSON too
    // What is no field selects the whole table.
    getsOne("foo", "x", "", "Ab12");
    getsOne("offset", "3", "", "Ab12");
    // The name of an ordering key is one as well.
    EXPECT_EQ(-1, getOne("sort_by", "uid"));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_LINES(failureOf(SELECT + " WHERE  order by 'uid';", "near \"order\": syntax error") +
                 allFailed(STORE, {RUN_QUERY_FAILED, GET_FAILED}));
    EXPECT_THROW(getOne("limit", "0"), Json::Exception);
    EXPECT_EQ(json("{}"), m_jOut);
    query("DELETE FROM token");
    EXPECT_EQ(0, getOne("foo", "x"));
    EXPECT_EQ(json("{}"), m_jOut);
}

TEST_F(Query, DeletesWhatTheFilterSelects)
{
    const auto deletes = [&](const char* szFilter, bool bAll, const char* szSql, int nResult,
                             const std::string& strLeft) {
        SCOPED_TRACE(std::string(szFilter) + (bAll ? " all" : ""));
        fill();
        m_db.m_strSql = "earlier";
        EXPECT_EQ(nResult, remove(szFilter, bAll));
        EXPECT_EQ(szSql, m_db.m_strSql);
        EXPECT_EQ(strLeft, tids());
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_LINES(0 > nResult ? Texts{failed(STORE, "strSql.empty()")} : Texts{});
    };
    deletes(R"({"tid":"Ab12"})", false, "DELETE FROM token WHERE  (tid='Ab12' );", 1, "Cd34 Ef56");
    deletes(R"({"bind_sid":"S1","function":"VPN"})", false,
            "DELETE FROM token WHERE  (bind_sid='S1' and function='VPN' );", 1, "Cd34 Ef56");
    deletes("{}", true, "DELETE FROM token;", 3, "");
    deletes("{}", false, "earlier", -1, ALL);
    deletes(R"({"foo":{},"sort_by":5,"limit":"x"})", true, "DELETE FROM token;", 3, "");
    // A condition counts whatever bAll says; no row is no failure.
    deletes(R"({"uid":7})", true, "DELETE FROM token WHERE  (uid=7 );", 1, "Ab12 Cd34");
    deletes(R"({"tid":"nobody"})", false, "DELETE FROM token WHERE  (tid='nobody' );", 0, ALL);
    deletes(R"({"uid":1024,"limit":0,"offset":0,"sort_by":"uid"})", false,
            "DELETE FROM token WHERE  (uid=1024 );", 2, "Ef56");
}

TEST_F(Query, DeletesNothingWhereSqliteRefusesTheStatement)
{
    for (const bool bAll : {false, true}) {
        const std::string strSql = "DELETE FROM token WHERE  ( );";
        errno = EIO;
        EXPECT_EQ(-1, remove(R"({"uid":[]})", bAll));
        EXPECT_EQ("near \")\": syntax error", m_db.m_strErr);
        EXPECT_LINES(failureOf(strSql, m_db.m_strErr, EIO) + Texts{failed(STORE, RUN_DELETE_FAILED, EIO)});
    }
}

TEST_F(Query, TellsTheNumberOfDeletedTokensInDebugMode)
{
    debugInfo(true);
    for (const std::string strNumber : {"2", "0"}) {
        const std::string strSql = "DELETE FROM token WHERE  (function='VPN' );";
        EXPECT_EQ(std::stoi(strNumber), remove(R"({"function":"VPN"})"));
        EXPECT_LINES(ordinary(STORE, "run sql=" + strSql),
                     ordinary(STORE, "change rv=" + strNumber + ", run sql=" + strSql),
                     ordinary(STORE, "delete token number=" + strNumber));
    }
    EXPECT_EQ(0, get("{}"));
    EXPECT_LINES(ordinary(STORE, "run sql=" + SELECT + ";"));
}

} // namespace
