// Deleting tokens of the store.

#include "AccessTokenUtil.h"
#include "QueryTest.h"
#include "Statements.h"

namespace {

class QueryDelete : public QueryTest {};

TEST_F(QueryDelete, DeletesAfterALockThatItWaitedOutAndReportsFailure)
{
    for (const int nErrno : {0, EIO}) {
        seam().calls.clear();
        m_nErrno = nErrno;
        fill();
        const Lock lock(path(), 2);
        EXPECT_EQ(-1, remove(R"({"uid":1024})"));
        EXPECT_EQ("Ef56 ", left());
        EXPECT_EQ("database is locked", m_db.m_strErr);
        EXPECT_EQ((Texts{fail(STORE, "sql error, sql=DELETE FROM token WHERE  (uid=1024 );", nErrno)}),
                  takeLines());
    }
}

TEST_F(QueryDelete, TracesEachTryInDebugMode)
{
    const std::string SQL = "DELETE FROM token WHERE  (uid=1024 );";
    const std::string RUN_LINE = ordinary(STORE, "run sql=" + SQL);
    fill();
    VEMO_ACCESS_TOKEN::debugInfo(true);
    const Lock lock(path(), 2);

    EXPECT_EQ(-1, remove(R"({"uid":1024})"));

    EXPECT_EQ((Texts{RUN_LINE, ordinary(STORE, "i=0,run sql failed, error=database is locked, sql=" + SQL),
                     RUN_LINE, ordinary(STORE, "i=1,run sql failed, error=database is locked, sql=" + SQL),
                     RUN_LINE, ordinary(STORE, "change rv=2, run sql=" + SQL),
                     fail(STORE, "sql error, sql=" + SQL)}),
              takeLines());
}

TEST_F(QueryDelete, GivesUpOnALockThatLasts)
{
    const std::string SQL = "DELETE FROM token;";
    fill();
    const Lock lock(path());

    EXPECT_EQ(-1, remove("{}", true));

    EXPECT_EQ(500u, seam().callsOf({"usleep"}).size());
    EXPECT_EQ("database is locked", m_db.m_strErr);
    EXPECT_EQ((Texts{ordinary(STORE, "i=500,run sql failed, error=database is locked, sql=" + SQL),
                     fail(STORE, "run sql failed, sql=" + SQL), failed(STORE, RUN_DELETE_FAILED)}),
              takeLines());
}

TEST_F(QueryDelete, RunsTheStatementThatTheFilterMakes)
{
    const struct {
        const char* szFilter;
        bool bAll;
        const char* szSql;
        int nResult;
        const char* szLeft;
    } rows[] = {
        {R"({"tid":"Ab12"})", false, "DELETE FROM token WHERE  (tid='Ab12' );", 1, "Cd34 Ef56 "},
        {R"({"bind_sid":"S1","function":"VPN"})", false,
         "DELETE FROM token WHERE  (bind_sid='S1' and function='VPN' );", 1, "Cd34 Ef56 "},
        {"{}", true, "DELETE FROM token;", 3, ""},
        {"{}", false, "earlier", -1, "Ab12 Cd34 Ef56 "},
        {R"({"limit":3})", false, "earlier", -1, "Ab12 Cd34 Ef56 "},
        {R"({"limit":3})", true, "DELETE FROM token;", 3, ""},
        {R"({"foo":"x"})", false, "earlier", -1, "Ab12 Cd34 Ef56 "},
        {R"({"foo":{},"sort_by":5,"limit":"x"})", true, "DELETE FROM token;", 3, ""},
        // A condition counts whatever bAll says; no row is no failure.
        {R"({"uid":7})", true, "DELETE FROM token WHERE  (uid=7 );", 1, "Ab12 Cd34 "},
        {R"({"tid":"nobody"})", false, "DELETE FROM token WHERE  (tid='nobody' );", 0, "Ab12 Cd34 Ef56 "},
        {R"({"uid":1024,"limit":0,"offset":0,"sort_by":"uid"})", false,
         "DELETE FROM token WHERE  (uid=1024 );", 2, "Ef56 "},
        {R"({"tid":"' OR 1; --"})", true, "DELETE FROM token WHERE  (tid=''' OR 1; --' );", 0,
         "Ab12 Cd34 Ef56 "},
    };

    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.szFilter) + (row.bAll ? " all" : ""));
        fill();
        m_db.m_strSql = "earlier";
        EXPECT_EQ(row.nResult, remove(row.szFilter, row.bAll));
        EXPECT_EQ(row.szSql, m_db.m_strSql);
        EXPECT_EQ(row.szLeft, left());
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(0 > row.nResult ? Texts{failed(STORE, "strSql.empty()")} : Texts{}, takeLines());
    }
}

TEST_F(QueryDelete, DeletesNothingWhereSqliteRefusesTheStatement)
{
    fill();
    for (const bool bAll : {false, true}) {
        const std::string strSql = "DELETE FROM token WHERE  ( );";
        m_nErrno = bAll ? EIO : 0;
        EXPECT_EQ(-1, remove(R"({"uid":[]})", bAll));
        EXPECT_EQ(strSql, m_db.m_strSql);
        EXPECT_EQ("near \")\": syntax error", m_db.m_strErr);
        EXPECT_EQ(refused("near \")\": syntax error", strSql, RUN_DELETE_FAILED), takeLines());
    }
    EXPECT_EQ("Ab12 Cd34 Ef56 ", left());
}

TEST_F(QueryDelete, TellsTheNumberInDebugMode)
{
    fill();
    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (const int nNumber : {2, 0}) {
        const std::string strSql = "DELETE FROM token WHERE  (function='VPN' );";
        EXPECT_EQ(nNumber, remove(R"({"function":"VPN"})"));
        EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + strSql),
                         ordinary(STORE, "change rv=" + std::to_string(nNumber) + ", run sql=" + strSql),
                         ordinary(STORE, "delete token number=" + std::to_string(nNumber))}),
                  takeLines());
    }

    EXPECT_EQ(0, get("{}"));
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + SELECT + ";")}), takeLines());
}

} // namespace
