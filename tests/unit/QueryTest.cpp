// Reading tokens of the store.

#include "QueryTest.h"
#include "AccessTokenUtil.h"
#include "StandIns.h"
#include "Statements.h"

namespace {

class Query : public QueryTest {};
class QueryOne : public QueryTest {};

TEST_F(Query, RunsTheStatementThatTheFilterMakes)
{
    const struct {
        const char* szFilter;
        std::string strCondition;
        const char* szFound;
    } rows[] = {
        {"{}", "", "Ab12 Cd34 Ef56 "},
        {R"({"tid":"Ab12"})", " WHERE  (tid='Ab12' )", "Ab12 "},
        {R"({"uid":1024,"sort_by":"create_time","sort_direction":"desc"})",
         " WHERE  (uid=1024 ) order by 'create_time' DESC", "Ab12 Cd34 "}, // sorted by a constant
        {R"({"tid":"nobody"})", " WHERE  (tid='nobody' )", ""},
        {R"({"foo":"x","offset":3,"sort_direction":"desc"})", "", "Ab12 Cd34 Ef56 "},
        {R"({"limit":7,"offset":8})", "", "Ab12 Cd34 Ef56 "},
        {R"({"uid":7,"limit":6})", " WHERE  (uid=7 ) ", "Ef56 "},
        {R"({"function":"VPN","bind_sid":"S1"})", " WHERE  (bind_sid='S1' and function='VPN' )", "Ab12 "},
        {R"({"uid":"7"})", " WHERE  (uid=7 )", "Ef56 "},
        {R"({"uid":"7 or 1"})", " WHERE  (uid=7 or 1 )", "Ab12 Cd34 Ef56 "},
        {R"({"tid":"x' OR '1'='1"})", " WHERE  (tid='x'' OR ''1''=''1' )", ""},
        {R"({"tid":"'; DELETE FROM token; --"})", " WHERE  (tid='''; DELETE FROM token; --' )", ""},
        {R"({"tid":["Cd34"]})", " WHERE  (tid in ('Cd34' ) )", "Cd34 "},
        {R"({"extra":[{"a":"it's"}]})", R"( WHERE  (extra in ('{"a":"it''s"}' ) ))", "Ab12 "},
        {R"({"webapi_allow":[{"api":{"method":["get"]}}]})",
         R"( WHERE  (webapi_allow in ('{"api":{"method":["get"]}}' ) ))", "Cd34 "},
    };

    fill();
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szFilter);
        EXPECT_EQ(0, get(row.szFilter));
        EXPECT_EQ(SELECT + row.strCondition + ";", m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(row.szFound, found());
        EXPECT_EQ(!row.szFound[0], m_jOut.isNull());
        EXPECT_EQ(Texts{}, takeLines());
    }
    EXPECT_EQ("Ab12 Cd34 Ef56 ", left());
}

TEST_F(Query, FailsWhereSqliteRefusesTheStatement)
{
    const struct {
        const char* szFilter;
        std::string strCondition, strError;
    } rows[] = {
        {R"({"sort_by":"uid"})", " order by 'uid'", "near \"order\": syntax error"},
        {R"({"function":"VPN","limit":0})", " (function='VPN' ) LIMIT ", "near \";\": syntax error"},
        {R"({"function":"VPN","limit":0,"offset":0})", " (function='VPN' ) LIMIT  OFFSET ",
         "no such column: OFFSET"},
        {R"({"limit":0})", " LIMIT ", "near \"LIMIT\": syntax error"},
        {R"({"limit":6})", " ", "near \";\": syntax error"},
        {R"({"limit":2})", "IMIT ", "no such column: IMIT"},
        {R"({"uid":[]})", " ( )", "near \")\": syntax error"},
        {R"({"uid":null})", " (uid= )", "near \")\": syntax error"},
        {R"({"uid":"x"})", " (uid=x )", "no such column: x"},
    };

    fill();
    for (const auto& row : rows) {
        for (const int nErrno : {0, EIO}) {
            SCOPED_TRACE(row.szFilter);
            const std::string strSql = SELECT + " WHERE " + row.strCondition + ";";
            m_nErrno = nErrno;
            EXPECT_EQ(-1, get(row.szFilter));
            EXPECT_EQ(strSql, m_db.m_strSql);
            EXPECT_EQ(row.strError, m_db.m_strErr);
            EXPECT_TRUE(m_jOut.isNull());
            EXPECT_EQ(refused(row.strError, strSql, RUN_QUERY_FAILED), takeLines());
        }
    }

    // Nothing of a failure outlives it.
    m_nErrno = 0;
    EXPECT_EQ(0, get("{}"));
    EXPECT_EQ("", m_db.m_strErr);
}

TEST_F(Query, AppendsDecodedRecordsToTheOutput)
{
    fill();
    m_jOut = json(R"(["held"])");
    EXPECT_EQ(0, get(R"({"tid":"Cd34"})", m_jOut));
    EXPECT_EQ(0, get(R"({"tid":"nobody"})", m_jOut));
    EXPECT_EQ(0, get(R"({"tid":"Ab12"})", m_jOut));
    EXPECT_EQ(json(R"(["held",
        {"tid":"Cd34","bind_sid":"S2","uid":1024,"deadline":4000000000,"count":-1,"create_time":300,
         "function":"VPN","webapi_allow":{"api":{"method":["get"]}},"extra":{}},
        {"tid":"Ab12","bind_sid":"S1","uid":1024,"deadline":4000000000,"count":1,"create_time":100,
         "function":"VPN","webapi_allow":{},"extra":{"a":"it's"}}])"),
              m_jOut);
}

TEST_F(Query, FindsWhatWasSavedByTheValuesThatWereSaved)
{
    Json::Value jSaved = json(R"({"tid":"t'1","bind_sid":"\u00e9","uid":7,"deadline":-1,"count":-1,
        "create_time":9007199254740993,"function":"it's","webapi_allow":{"b":{"method":["a"]},"a":{}},
        "extra":{"n":0.1,"u":"\u00fc\u0001","q":"'\"","big":18446744073709551615}})");
    ASSERT_EQ(0, m_db.tokenCreate(jSaved));

    for (const std::string& strName : jSaved.getMemberNames()) {
        SCOPED_TRACE(strName);
        Json::Value jFilter;
        jFilter[strName].append(jSaved[strName]);
        m_jOut = Json::Value();
        EXPECT_EQ(0, m_db.tokenGet(jFilter, m_jOut));
        EXPECT_EQ(1u, m_jOut.size());
        EXPECT_EQ(jSaved, m_jOut[0]);
    }
}

TEST_F(Query, ReadsListsAsOneValue)
{
    makeDatabase();
    for (const char* szTid : {"a", "b", "ab", "a''b"}) {
        insert(szTid, "'',12,0,0,0,'','{}','{}'");
    }
    query("UPDATE token SET uid = 1 WHERE tid = 'a'; UPDATE token SET uid = 2 WHERE tid = 'b'");

    EXPECT_EQ(0, get(R"({"tid":["a","b"]})"));
    EXPECT_EQ("a'b ", found());
    EXPECT_EQ(0, get(R"({"uid":[1,2]})"));
    EXPECT_EQ("ab a'b ", found());
    EXPECT_EQ(1, remove(R"({"tid":["a","b"]})"));
    EXPECT_EQ(1, remove(R"({"uid":[1,2]})"));
    EXPECT_EQ("a b ", left());
}

TEST_F(Query, RefusesWhatItCannotUseAndRunsNothing)
{
    const std::string NO_FILTER = "jTokenParam.type() != Json::objectValue";
    const std::string NO_OUTPUT =
        "jTokenArrayOut.type() != Json::nullValue && jTokenArrayOut.type() != Json::arrayValue";
    const struct {
        const char *szFilter, *szOut;
        std::string strCondition;
    } rows[] = {
        {"null", "null", NO_FILTER},     {"[1,2]", "[]", NO_FILTER}, {R"("x")", "null", NO_FILTER},
        {"5", "null", NO_FILTER},        {"true", "{}", NO_FILTER},  {"{}", "{}", NO_OUTPUT},
        {"{}", R"({"a":1})", NO_OUTPUT}, {"{}", R"("")", NO_OUTPUT}, {"{}", "0", NO_OUTPUT},
        {"{}", "false", NO_OUTPUT},      {"{}", "1.5", NO_OUTPUT},
    };

    m_db.m_strSql = "earlier";
    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.szFilter) + " to " + row.szOut);
        m_jOut = json(row.szOut);
        EXPECT_EQ(-1, get(row.szFilter, m_jOut));
        EXPECT_EQ(json(row.szOut), m_jOut);
        EXPECT_EQ((Texts{failed(STORE, row.strCondition)}), takeLines());
    }
    for (const char* szFilter : {"null", "[1,2]", R"("x")", "5", "true"}) {
        SCOPED_TRACE(szFilter);
        EXPECT_EQ(-1, remove(szFilter, true));
        EXPECT_EQ((Texts{failed(STORE, NO_FILTER)}), takeLines());
    }
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

TEST_F(Query, PassesOnTheFailuresOfTheFilter)
{
    const std::string OBJECT_LINE = fail(STORE, "err input type, jTokenParam=(null)");

    m_db.m_strSql = "earlier";
    EXPECT_EQ(-1, get(R"({"tid":{"a":1}})"));
    EXPECT_EQ((Texts{OBJECT_LINE, failed(STORE, WHERE_FAILED)}), takeLines());
    EXPECT_EQ(-1, remove(R"({"tid":{"a":1}})", true));
    EXPECT_EQ((Texts{OBJECT_LINE, failed(STORE, WHERE_FAILED)}), takeLines());

    // The text of the field is the first, that of the order the second.
    seam().fail("sqlite3_mprintf", ENOMEM, 2, 2);
    EXPECT_EQ(-1, get(R"({"uid":7,"sort_by":"uid"})"));
    EXPECT_EQ((Texts{failed(STORE, "!szSql", ENOMEM),
                     failed(STORE, "0 > SqlFilterConditionFromJson(jTokenParam, strSql)", ENOMEM)}),
              takeLines());

    EXPECT_THROW(get(R"({"sort_by":5})"), Json::Exception);
    EXPECT_THROW(get(R"({"limit":"5"})"), Json::Exception);
    EXPECT_THROW(get(R"({"tid":[[]]})"), Json::Exception);
    EXPECT_THROW(remove(R"({"uid":[{}]})", true), Json::Exception);
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Query, FailsWithoutItsColumns)
{
    fill();
    standIns().sqlExpandMemberName = [](std::string&) { return -1; };
    m_db.m_strSql = "earlier";
    EXPECT_EQ(-1, get("{}"));
    EXPECT_EQ((Texts{failed(STORE, "0 > SqlExpandMemberName(VEMO_ATOKEN_SELECT_SQL)")}), takeLines());
    EXPECT_EQ("earlier", m_db.m_strSql);
}

TEST_F(Query, KeepsTheRowsBeforeOneThatCannotBeDecoded)
{
    fill();
    query("UPDATE token SET extra = NULL WHERE tid = 'Cd34'");
    for (const int nErrno : {0, EIO}) {
        m_nErrno = nErrno;
        const Texts decoding = {
            failed(STORE, "NULL == column_name[i] || NULL == column_value[i]", nErrno),
            failed(STORE, "0 > FillToken(&jTmp, n_column, column_value, column_name)", nErrno)};
        EXPECT_EQ(-1, get("{}"));
        EXPECT_EQ("Ab12 ", found());
        EXPECT_EQ(sqlite3_errstr(SQLITE_ABORT), m_db.m_strErr);
        EXPECT_EQ(decoding + refused(sqlite3_errstr(SQLITE_ABORT), SELECT + ";", RUN_QUERY_FAILED),
                  takeLines());
    }

    EXPECT_EQ(-1, getOne("tid", "Cd34"));
    EXPECT_EQ(json("{}"), m_jOut);
}

TEST_F(Query, OpensTheDatabaseOnceAndWhenItIsNeeded)
{
    EXPECT_EQ(0, get("{}"));
    EXPECT_EQ(0, remove("{}", true));
    EXPECT_EQ(0, getOne("tid", "a"));

    EXPECT_EQ((Texts{"sqlite3_open " VEMO_ATOKEN_DB_PATH}), seam().callsOf({"sqlite3_open"}));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Query, FailsWhereTheDatabaseCannotBeOpened)
{
    const Texts reading = NOT_OPENED + Texts{failed(STORE, RUN_QUERY_FAILED, EPERM)};
    seam().fail("seteuid", EPERM, 1, 99);

    EXPECT_EQ(-1, get(R"({"uid":7})"));
    EXPECT_EQ(reading, takeLines());
    EXPECT_EQ(SELECT + " WHERE  (uid=7 );", m_db.m_strSql);

    EXPECT_EQ(-1, getOne("uid", "8"));
    EXPECT_EQ(reading + Texts{failed(STORE, "0 > tokenGet(jParam, jTokenArray)", EPERM)}, takeLines());
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_EQ(SELECT + " WHERE  (uid=8 );", m_db.m_strSql);

    EXPECT_EQ(-1, remove(R"({"uid":9})"));
    EXPECT_EQ(NOT_OPENED + Texts{failed(STORE, RUN_DELETE_FAILED, EPERM)}, takeLines());
    EXPECT_EQ("DELETE FROM token WHERE  (uid=9 );", m_db.m_strSql);
}

TEST_F(Query, ReportsFailureAfterALockThatItWaitedOut)
{
    fill();
    const Lock lock(path(), 2);
    EXPECT_EQ(-1, get(R"({"uid":1024})"));
    EXPECT_EQ("Ab12 Cd34 ", found());
    EXPECT_EQ("database is locked", m_db.m_strErr);
    EXPECT_EQ((Texts{"usleep 10000", "usleep 10000"}), seam().callsOf({"usleep"}));
    EXPECT_EQ((Texts{fail(STORE, "sql error, sql=" + SELECT + " WHERE  (uid=1024 );")}), takeLines());

    EXPECT_EQ(0, get(R"({"uid":1024})"));
    EXPECT_EQ("", m_db.m_strErr);
}

TEST_F(QueryOne, TakesTheFirstRowWhoseFieldMatches)
{
    const struct {
        const char *szName, *szValue;
        std::string strCondition;
        const char* szTid; // null when none matches
    } rows[] = {
        {"tid", "Ab12", " WHERE  (tid='Ab12' )", "Ab12"},
        {"uid", "1024", " WHERE  (uid=1024 )", "Ab12"},
        {"uid", "7", " WHERE  (uid=7 )", "Ef56"},
        {"create_time", "300", " WHERE  (create_time=300 )", "Cd34"},
        {"bind_sid", "S1", " WHERE  (bind_sid='S1' )", "Ab12"},
        {"bind_sid", "s'1", " WHERE  (bind_sid='s''1' )", nullptr},
        {"tid", "nobody", " WHERE  (tid='nobody' )", nullptr},
        {"uid", "8", " WHERE  (uid=8 )", nullptr},
        // The value is a text, in JSON too.
        {"extra", "{}", " WHERE  (extra='\"{}\"' )", nullptr},
        // What is no field selects the whole table.
        {"foo", "x", "", "Ab12"},
        {"Tid", "Ef56", "", "Ab12"},
        {"offset", "3", "", "Ab12"},
        {"sort_direction", "desc", "", "Ab12"},
    };

    fill();
    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.szName) + "=" + row.szValue);
        EXPECT_EQ(row.szTid ? 1 : 0, getOne(row.szName, row.szValue));
        EXPECT_EQ(SELECT + row.strCondition + ";", m_db.m_strSql);
        if (row.szTid) {
            EXPECT_EQ(row.szTid, m_jOut["tid"].asString());
            EXPECT_EQ(9u, m_jOut.size());
        } else {
            EXPECT_EQ(json("{}"), m_jOut);
        }
        EXPECT_EQ(Texts{}, takeLines());
    }

    query("DELETE FROM token");
    EXPECT_EQ(0, getOne("foo", "x"));
    EXPECT_EQ(json("{}"), m_jOut);
}

TEST_F(QueryOne, RefusesEmptyNameAndEmptyValueAndRunsNothing)
{
    const std::string NO_NAME = "!szName || !szName[0]";
    const struct {
        const char *szName, *szValue;
        std::string strCondition;
    } rows[] = {
        {nullptr, "x", NO_NAME},         {"", "x", NO_NAME},
        {nullptr, "", NO_NAME},          {"tid", "", "strValue.empty()"},
        {"foo", "", "strValue.empty()"},
    };

    m_db.m_strSql = "earlier";
    for (const auto& row : rows) {
        EXPECT_EQ(-1, getOne(row.szName, row.szValue));
        EXPECT_EQ(json(R"({"old":1})"), m_jOut);
        EXPECT_EQ((Texts{failed(STORE, row.strCondition)}), takeLines());
    }
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

TEST_F(QueryOne, LeavesAnEmptyObjectAfterAFailedQuery)
{
    const std::string SQL = SELECT + " WHERE  order by 'uid';";
    fill();
    // The name of an ordering key is one as well.
    EXPECT_EQ(-1, getOne("sort_by", "uid"));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_EQ(refused("near \"order\": syntax error", SQL, RUN_QUERY_FAILED) +
                  Texts{failed(STORE, "0 > tokenGet(jParam, jTokenArray)")},
              takeLines());

    EXPECT_THROW(getOne("limit", "0"), Json::Exception);
    EXPECT_EQ(json("{}"), m_jOut);

    const Lock lock(path(), 2);
    EXPECT_EQ(-1, getOne("tid", "Ab12"));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_EQ((Texts{fail(STORE, "sql error, sql=" + SELECT + " WHERE  (tid='Ab12' );"),
                     failed(STORE, "0 > tokenGet(jParam, jTokenArray)")}),
              takeLines());
}

class QueryInSystemLog : public QueryTest {
protected:
    QueryInSystemLog() : QueryTest(Destination::Syslog) {}
};

TEST_F(QueryInSystemLog, TellsTheErrorInFrontWhenThereIsOne)
{
    const std::string SQL = "DELETE FROM token WHERE  (uid=7 );";
    const std::string SORTED = SELECT + " WHERE  order by 'uid';";
    const std::string SYNTAX_ERROR = "near \"order\": syntax error";
    makeDatabase();
    ASSERT_EQ(0, m_db.initDb());

    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (const int nErrno : {0, EIO}) {
        m_nErrno = nErrno;
        failStatements("DELETE", {SQLITE_BUSY, "database is locked", nErrno});
        EXPECT_EQ(-1, remove(R"({"uid":7})"));
        EXPECT_EQ(0, remove(R"({"uid":7})"));
        EXPECT_EQ(-1, get(R"({"sort_by":"uid"})"));

        EXPECT_EQ(inSystemLog(
                      Texts{ordinary(STORE, "run sql=" + SQL),
                            ordinary(STORE, "i=0,run sql failed, error=database is locked, sql=" + SQL),
                            ordinary(STORE, "run sql=" + SQL), ordinary(STORE, "change rv=0, run sql=" + SQL),
                            fail(STORE, "sql error, sql=" + SQL, nErrno), ordinary(STORE, "run sql=" + SQL),
                            ordinary(STORE, "change rv=0, run sql=" + SQL),
                            ordinary(STORE, "delete token number=0"), ordinary(STORE, "run sql=" + SORTED)} +
                          refused(SYNTAX_ERROR, SORTED, RUN_QUERY_FAILED),
                      nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
