// Reading and deleting the tokens of the store that a filter selects: the statements, and what is refused.
// The test of the model shows what is found and deleted.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

const std::string RUN_FAILED = "0 > runSql(FillList, &jTokenArrayOut)";
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
        insert(R"({"tid":"Cd34","uid":1024,"create_time":300,"bind_sid":"S2"})");
        insert(R"({"tid":"Ef56","uid":7,"create_time":200,"function":"FTP"})");
    }

    // The operations, with the filter as text.
    int get(const std::string& strFilter, const char* szOut = "null")
    {
        Json::Value jFilter = json(strFilter);
        m_jOut = json(szOut);
        return m_db.tokenGet(jFilter, m_jOut);
    }
    int remove(const std::string& strFilter, bool bAll = false)
    {
        Json::Value jFilter = json(strFilter);
        return m_db.tokenDelete(jFilter, bAll);
    }
    int getOne(const char* szName, std::string strValue)
    {
        m_jOut = json(R"({"old":1})");
        return m_db.tokenGetOne(szName, strValue, m_jOut);
    }

    // The ids in m_jOut, separated by blanks.
    std::string found() const
    {
        Texts ids;
        for (const Json::Value& jToken : m_jOut) {
            ids.push_back(jToken["tid"].asString());
        }
        return joined(ids, " ");
    }

    Json::Value m_jOut;
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
    finds(R"({"function":"VPN","bind_sid":"S1"})", " WHERE  (bind_sid='S1' and function='VPN' )", "Ab12");
    finds(R"({"tid":["Cd34"]})", " WHERE  (tid in ('Cd34' ) )", "Cd34");
    finds(R"({"tid":["Ab12","Cd34"]})", " WHERE  (tid in ('Ab12''Cd34' ) )", ""); // one value
}

TEST_F(Query, FailsWhenSqliteRefusesTheStatement)
{
    const auto fails = [&](const char* szFilter, const std::string& strCondition,
                           const std::string& strError) {
        SCOPED_TRACE(szFilter);
        const std::string strSql = SELECT + " WHERE " + strCondition + ";";
        errno = EIO;
        EXPECT_EQ(-1, get(szFilter));
        EXPECT_EQ(strError, m_db.m_strErr);
        EXPECT_TRUE(m_jOut.isNull());
        EXPECT_LINES(failureOf(strSql, strError, EIO) + Texts{failed(STORE, RUN_FAILED, EIO)});
    };
    fails(R"({"sort_by":"uid"})", " order by 'uid'", "near \"order\": syntax error");
    fails(R"({"function":"VPN","limit":0})", " (function='VPN' ) LIMIT ", "near \";\": syntax error");
    fails(R"({"limit":2})", "IMIT ", "no such column: IMIT");
    fails(R"({"uid":[]})", " ( )", "near \")\": syntax error");
}

TEST_F(Query, RefusesUnusableArgumentsAndRunsNothing)
{
    const std::string strNoFilter = failed(STORE, "jTokenParam.type() != Json::objectValue");
    const std::string strNoName = failed(STORE, "!szName || !szName[0]");
    const Texts nested = {fail(STORE, "err input type, jTokenParam=(null)"),
                          failed(STORE, "0 > SqlWhereFromJson(jTokenParam, strSql, true)")};
    m_db.m_strSql = "earlier";
    EXPECT_FAILURE(get("null", "{}"), strNoFilter);
    EXPECT_FAILURE(remove("[1,2]", true), strNoFilter);
    EXPECT_FAILURE(get("{}", "{}"), failed(STORE, "jTokenArrayOut.type() != Json::nullValue && "
                                                  "jTokenArrayOut.type() != Json::arrayValue"));
    EXPECT_FAILURE(getOne(nullptr, ""), strNoName);
    EXPECT_FAILURE(getOne("", "x"), strNoName);
    EXPECT_FAILURE(getOne("tid", ""), failed(STORE, "strValue.empty()"));
    EXPECT_EQ(json(R"({"old":1})"), m_jOut);
    EXPECT_FAILURE(get(R"({"tid":{"a":1}})"), nested);
    EXPECT_FAILURE(remove(R"({"tid":{"a":1}})", true), nested);
    // The first text is the field's, the second the order's.
    seam().fail("sqlite3_mprintf", ENOMEM, 2, 2);
    EXPECT_FAILURE(
        get(R"({"uid":7,"sort_by":"uid"})"),
        allFailed(STORE, {"!szSql", "0 > SqlFilterConditionFromJson(jTokenParam, strSql)"}, ENOMEM));
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

// The statement has taken effect. FailedStore in ServiceTest shows how the service reports it.
TEST_F(Query, ReportsFailureAfterWaitingForALock)
{
    Json::Value jToken = token();
    const std::string strDelete = "DELETE FROM token WHERE  (uid=7 );";
    failStatements("SELECT", LOCKED);
    EXPECT_FAILURE(get("{}"), fail(STORE, "sql error, sql=" + SELECT + ";", EIO));
    EXPECT_EQ(ALL, found());
    failStatements("DELETE", LOCKED);
    EXPECT_FAILURE(remove(R"({"uid":7})"), fail(STORE, "sql error, sql=" + strDelete, EIO));
    failStatements("INSERT", LOCKED);
    EXPECT_FAILURE(m_db.tokenCreate(jToken), fail(STORE, "sql error, sql=" + saveSql("INSERT", jToken), EIO));
    EXPECT_EQ("Ab12 Cd34 t", tids());
    EXPECT_EQ("database is locked", m_db.m_strErr);
}

TEST_F(Query, KeepsTheRowsBeforeOneThatCannotBeDecoded)
{
    query("UPDATE token SET extra = NULL WHERE tid = 'Cd34'");
    EXPECT_EQ(-1, get("{}"));
    EXPECT_EQ("Ab12", found());
    const Texts lines = allFailed(STORE, {"NULL == column_name[i] || NULL == column_value[i]",
                                          "0 > FillToken(&jTmp, n_column, column_value, column_name)"});
    EXPECT_LINES(lines + failureOf(SELECT + ";", "query aborted") + Texts{failed(STORE, RUN_FAILED)});
    EXPECT_FAILURE(getOne("tid", "Cd34"),
                   lines + failureOf(selectSql("Cd34"), "query aborted") +
                       allFailed(STORE, {RUN_FAILED, "0 > tokenGet(jParam, jTokenArray)"}));
    EXPECT_EQ(json("{}"), m_jOut);
}

TEST_F(Query, GetsTheFirstRowWhoseFieldMatches)
{
    const auto getsOne = [&](const char* szName, const char* szValue, const std::string& strCondition) {
        SCOPED_TRACE(std::string(szName) + "=" + szValue);
        EXPECT_EQ(1, getOne(szName, szValue));
        EXPECT_EQ(SELECT + strCondition + ";", m_db.m_strSql);
        EXPECT_EQ("Ab12", m_jOut["tid"].asString());
    };
    getsOne("tid", "Ab12", " WHERE  (tid='Ab12' )");
    getsOne("uid", "1024", " WHERE  (uid=1024 )");
    getsOne("foo", "x", ""); // an unknown field selects the whole table
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
        EXPECT_LINES(0 > nResult ? Texts{failed(STORE, "strSql.empty()")} : Texts{});
    };
    deletes(R"({"bind_sid":"S1","function":"VPN"})", false,
            "DELETE FROM token WHERE  (bind_sid='S1' and function='VPN' );", 1, "Cd34 Ef56");
    deletes("{}", true, "DELETE FROM token;", 3, "");
    deletes("{}", false, "earlier", -1, ALL);
    // A condition has effect whatever bAll is; order and paging have none.
    deletes(R"({"uid":7,"sort_by":5})", true, "DELETE FROM token WHERE  (uid=7 );", 1, "Ab12 Cd34");
    deletes(R"({"limit":3})", true, "DELETE FROM token;", 3, "");
}

} // namespace
