// Purging the tokens whose deadline has passed.

#include "BothLogs.h"
#include "Statements.h"

namespace {

class Purge : public WithSwitches {
protected:
    // The line that the switch asks for, and debug mode as well.
    void sayIfAsked(const Line& line)
    {
        if (theCase().blLog || theCase().blDebug) {
            say(line);
        }
    }
};

TEST_P(Purge, ReportsAFailure)
{
    sayInDebug(ordinaryLine("run sql=" + PURGE, 0));
    say(ordinaryLine("i=0,run sql failed, error=disk I/O error, sql=" + PURGE, EIO));
    say(failLine("run sql failed, sql=" + PURGE, EIO));
    sayIfAsked(failLine("run sql failed", EIO));
    failStatements(PURGE, DISK_ERROR);

    EXPECT_EQ(-1, m_db.cleanExpireToken(theCase().blLog));

    EXPECT_EQ(PURGE, m_db.m_strSql);
    expectLines(m_lines);
}

// The purge took effect; -1 is the answer none the less.
TEST_P(Purge, ReportsALockThatWasWaitedOut)
{
    sayInDebug(ordinaryLine("run sql=" + PURGE, 0));
    sayInDebug(ordinaryLine("i=0,run sql failed, error=database is locked, sql=" + PURGE, EIO));
    sayInDebug(ordinaryLine("run sql=" + PURGE, EIO));
    sayInDebug(ordinaryLine("change rv=1, run sql=" + PURGE, EIO));
    sayIfAsked(failLine("sql error, sql=" + PURGE, EIO));
    failStatements(PURGE, LOCKED);

    EXPECT_EQ(-1, m_db.cleanExpireToken(theCase().blLog));

    expectLines(m_lines);
    int nRows = 0;
    seam() = Seam();
    EXPECT_EQ(0, m_db.runSqlEx("SELECT tid FROM token", countRow, &nRows));
    EXPECT_EQ(1, nRows);
}

TEST_P(Purge, ReturnsNoNumber)
{
    sayInDebug(ordinaryLine("run sql=" + PURGE, 0));
    sayInDebug(ordinaryLine("change rv=1, run sql=" + PURGE, 0));
    m_db.m_strErr = "stale";

    EXPECT_EQ(0, m_db.cleanExpireToken(theCase().blLog));

    EXPECT_EQ("", m_db.m_strErr);
    expectLines(m_lines);
}

INSTANTIATE_TEST_SUITE_P(All, Purge, inBothLogs<Switches>({QUIET, LOUD, DEBUG, LOUD_DEBUG}),
                         ::testing::PrintToStringParamName());

class PurgeByDeadline : public StoreTest {};

TEST_F(PurgeByDeadline, TakesDeadlinesBeforeNow)
{
    makeDatabase();
    for (const time_t now : {time_t(0), time_t(1700000000), time_t(4102444800)}) {
        SCOPED_TRACE(now);
        const std::string strNow = std::to_string(now);
        const std::string strBefore = std::to_string(now - 1);
        const std::string strAfter = std::to_string(now + 1);
        query("DELETE FROM token");
        int nTid = 0;
        for (const std::string& strDeadline :
             {std::string("-1"), std::string("-9223372036854775808"), strBefore, strBefore + ".5",
              "'" + strBefore + "'", std::string("NULL"), strNow, "'" + strNow + "'", strAfter,
              std::string("9223372036854775807"), std::string("'never'")}) {
            insert(std::to_string(nTid++), "NULL,0," + strDeadline + ",1,0,'','{}','{}'");
        }
        seam().clock = now;
        AccessTokenDbApi db;

        EXPECT_EQ(0, db.cleanExpireToken(true));

        // A text that is no number comes after all numbers.
        const Texts kept = {"NULL", strNow, strNow, strAfter, "9223372036854775807", "'never'"};
        EXPECT_EQ(kept, query("SELECT quote(deadline) FROM token ORDER BY rowid"));
        EXPECT_EQ(0, db.cleanExpireToken(true)); // with none to delete
        EXPECT_EQ(Texts{}, takeLines());
    }
}

} // namespace
