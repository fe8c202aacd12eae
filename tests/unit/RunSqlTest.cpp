// Running statements, waiting for locks, and the purge of expired tokens.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::debugInfo;

namespace {

const std::string UPDATE = "UPDATE token SET extra = '%n%s';"; // of all rows
const std::string UNKNOWN = "Unknow Error!!";

int passOver(void*, int, char**, char**)
{
    return 0;
}

// The log line of a failed try.
std::string tryLine(int nTry, const std::string& strError, const std::string& strSql = UPDATE)
{
    return ordinary(STORE,
                    "i=" + std::to_string(nTry) + ",run sql failed, error=" + strError + ", sql=" + strSql);
}

// An open store with a table of two tokens.
class RunSql : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        insert(R"({"tid":"a","deadline":-1})");
        insert(R"({"tid":"b"})");
        ASSERT_EQ(0, m_db.initDb());
        reset();
    }

    int run(const std::string& strSql, SqlCallback pCallback = nullptr)
    {
        m_db.m_strSql = strSql;
        m_db.m_strErr = "stale";
        const int nResult = m_db.runSql(pCallback, nullptr);
        EXPECT_EQ(strSql, m_db.m_strSql);
        return nResult;
    }
};

TEST_F(RunSql, OpensTheDatabaseButRunSqlExDoesNot)
{
    AccessTokenDbApi db;
    EXPECT_EQ(-1, db.runSqlEx(UPDATE, nullptr, nullptr));
    EXPECT_EQ(UNKNOWN, db.m_strErr);
    EXPECT_EQ("", db.m_strSql);
    EXPECT_LINES(tryLine(0, "(null)"));
    EXPECT_EQ((Texts{"sqlite3_exec " + UPDATE}), seam().callsOf(OPENING_CALLS));
    db.m_strSql = UPDATE;
    EXPECT_EQ(2, db.runSql());
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));
}

TEST_F(RunSql, RefusesAnEmptyStatement)
{
    AccessTokenDbApi db;
    db.m_strErr = "stale";
    errno = EINTR;
    EXPECT_EQ(-1, db.runSql());
    EXPECT_EQ(-1, db.runSql(passOver, nullptr));
    EXPECT_EQ("stale", db.m_strErr);
    EXPECT_EQ(-1, db.runSqlEx("", nullptr, nullptr));
    EXPECT_EQ(UNKNOWN, db.m_strErr);
    const std::string strLine = fail(STORE, "no correct sql", EINTR);
    EXPECT_LINES(strLine, strLine, failed(STORE, "0 >= strSql.length()", EINTR));
    EXPECT_EQ(Texts{}, seam().calls);
}

// The number is SQLite's; statements other than changes do not reset it.
TEST_F(RunSql, ReturnsTheNumberOfTheLastChange)
{
    const auto returns = [&](const char* szSql, int nChanges) {
        SCOPED_TRACE(szSql);
        EXPECT_EQ(nChanges, run(szSql));
        EXPECT_EQ("", m_db.m_strErr);
        m_db.m_strErr = "stale";
        EXPECT_EQ(nChanges, m_db.runSqlEx("SELECT 1", nullptr, nullptr));
        EXPECT_EQ("stale", m_db.m_strErr);
    };
    returns("UPDATE token SET uid = 1", 2);
    returns("SELECT tid FROM token", 2);
    returns("DELETE FROM token WHERE tid = 'c'", 0);
    returns("DELETE FROM token; INSERT INTO token (tid, function) VALUES ('c', '')", 1);
    returns(" ", 1);
    EXPECT_EQ(0, m_db.cleanExpireToken(true)); // it deletes c, but returns no number
    seam().calls.clear();
    EXPECT_EQ(0, api().cleanExpireToken(true));
    EXPECT_EQ((Texts{PURGE}), seam().statements());
}

// The text of the error decides whether a statement is tried again, not the code.
TEST_F(RunSql, TriesAgainOnlyAfterLocks)
{
    // One answer for each try. szError is the error in the failure line, or null if the statement succeeds.
    const auto runs = [&](const char* szName, const std::vector<SqlAnswer>& answers, const char* szErrAfter,
                          const char* szError) {
        for (const bool blCallback : {false, true}) {
            SCOPED_TRACE(::testing::Message() << szName << " " << blCallback);
            const int nWaits = static_cast<int>(answers.size()) - 1;
            reset();
            answerStatements(UPDATE, answers);
            EXPECT_EQ(szError ? -1 : blCallback ? 0 : 2, run(UPDATE, blCallback ? passOver : nullptr));
            EXPECT_EQ(szErrAfter, m_db.m_strErr);
            Texts calls = {"sqlite3_exec " + UPDATE};
            for (int i = 0; i < nWaits; ++i) {
                calls = calls + Texts{"usleep 10000", calls[0]};
            }
            EXPECT_EQ(calls, seam().calls);
            EXPECT_LINES(
                szError ? Texts{tryLine(nWaits, szError), fail(STORE, "run sql failed, sql=" + UPDATE, EIO)}
                        : Texts{});
        }
    };
    runs("success with a text", {{SQLITE_OK, "no matter"}}, "", nullptr);
    runs("lock", {LOCKED, {SQLITE_BUSY, "(2) database is locked"}, RUN}, "(2) database is locked", nullptr);
    runs("lock of another code", {{SQLITE_ERROR, "cannot: database is locked!"}, RUN},
         "cannot: database is locked!", nullptr);
    runs("lock, then error", {LOCKED, DISK_ERROR}, "disk I/O error", "disk I/O error");
    runs("lock, then no text", {LOCKED, {SQLITE_MISUSE, nullptr}}, "Unknow Error!!", "(null)");
    runs("busy with another text", {{SQLITE_BUSY, "busy"}}, "busy", "busy");
    runs("busy without text", {{SQLITE_BUSY, nullptr}}, "Unknow Error!!", "(null)");
    runs("locked table", {{SQLITE_LOCKED, "database table is locked: a"}}, "database table is locked: a",
         "database table is locked: a");
    runs("other spelling", {{SQLITE_BUSY, "Database is locked"}}, "Database is locked", "Database is locked");
    runs("empty text", {{SQLITE_ERROR, ""}}, "", "");
    runs("directives", {{SQLITE_ERROR, "near \"%n%s\""}}, "near \"%n%s\"", "near \"%n%s\"");
}

TEST_F(RunSql, GivesUpAfter500Tries)
{
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        Texts calls, errors, lines;
        std::vector<SqlAnswer> answers;
        for (int i = 0; i < 500; ++i) {
            calls.insert(calls.end(), {"sqlite3_exec " + UPDATE, "usleep 10000"});
            errors.push_back("database is locked (" + std::to_string(i) + ")");
            lines.insert(lines.end(), {ordinary(STORE, "run sql=" + UPDATE), tryLine(i, errors.back())});
        }
        for (const std::string& strError : errors) {
            answers.push_back({SQLITE_BUSY, strError.c_str()});
        }
        answerStatements(UPDATE, answers);
        seam().calls.clear();
        EXPECT_EQ(-1, run(UPDATE));
        EXPECT_EQ(errors.back(), m_db.m_strErr);
        EXPECT_EQ(calls, seam().calls);
        EXPECT_LINES((blDebug ? lines : Texts{}) +
                     Texts{tryLine(500, errors.back()), fail(STORE, "run sql failed, sql=" + UPDATE, EIO)});
    }
}

// The purge

// The purge's own lines can be switched off; those that the store writes for any statement cannot. A purge
// that had to wait for a lock has taken effect, but reports failure.
TEST_F(RunSql, FailedPurgeLogsItsOwnLinesOnlyOnDemand)
{
    const std::string strRun = ordinary(STORE, "run sql=" + PURGE);
    const std::string strLocked = tryLine(0, "database is locked", PURGE);
    const Texts refused = failureOf(PURGE, "disk I/O error", EIO);
    const struct {
        SqlAnswer answer;
        Texts always, debug; // the store's lines
        std::string strOwn;
        const char* szLeft;
    } rows[] = {
        {DISK_ERROR, refused, Texts{strRun} + refused, "run sql failed", "a b"},
        {LOCKED,
         {},
         {strRun, strLocked, strRun, ordinary(STORE, "change rv=1, run sql=" + PURGE)},
         "sql error, sql=" + PURGE,
         "b"},
    };
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        for (const bool blLog : {false, true}) {
            for (const auto& row : rows) {
                SCOPED_TRACE(::testing::Message() << row.strOwn << blLog << blDebug);
                const Texts lines = (blDebug ? row.debug : row.always) +
                                    (blLog || blDebug ? Texts{fail(STORE, row.strOwn, EIO)} : Texts{});
                const auto fail_ = [&](auto purge) {
                    query("DELETE FROM token WHERE tid = 'a'");
                    insert(R"({"tid":"a","deadline":-1})");
                    reset();
                    failStatements(PURGE, row.answer);
                    EXPECT_EQ(-1, purge());
                    EXPECT_EQ(row.szLeft, tids());
                };
                fail_([&] { return m_db.cleanExpireToken(blLog); });
                EXPECT_LINES(lines);
                fail_([&] { return api().cleanExpireToken(blLog); });
                const std::string strCondition = "0 > m_pDb->cleanExpireToken(blLogErr)";
                EXPECT_LINES(lines + (blLog     ? Texts{failed(SERVICE, strCondition, EIO)}
                                      : blDebug ? Texts{fail(SERVICE, "run fail " + strCondition, EIO)}
                                                : Texts{}));
            }
        }
    }
}

} // namespace
