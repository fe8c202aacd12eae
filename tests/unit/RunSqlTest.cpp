// Running statements and waiting for locks.

#include <unistd.h>

#include "BothLogs.h"
#include "Statements.h"

namespace {

int stop(void*, int, char**, char**)
{
    return 1;
}

class RunSql : public StoreTest {};

TEST_F(RunSql, FirstStatementOpens)
{
    ASSERT_EQ(0, seteuid(UID_CALLER));
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;

    EXPECT_EQ(0, db.runSql());

    EXPECT_EQ((Texts{UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, CHANGES, BACK, "sqlite3_exec " + UPDATE,
                     CHANGES}),
              seam().callsOf(OPENING_CALLS));
    EXPECT_EQ(UPDATE, db.m_strSql);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(RunSql, NeverOpensAsRunSqlEx)
{
    AccessTokenDbApi db;

    EXPECT_EQ(-1, db.runSqlEx(UPDATE, nullptr, nullptr));

    EXPECT_EQ(14u, db.m_strErr.size());
    EXPECT_EQ(UNKNOWN, db.m_strErr);
    EXPECT_EQ("", db.m_strSql);
    EXPECT_EQ((Texts{"sqlite3_exec " + UPDATE}), seam().callsOf(OPENING_CALLS));
    EXPECT_EQ((Texts{ordinary(STORE, "i=0,run sql failed, error=(null), sql=" + UPDATE)}), takeLines());
}

TEST_F(RunSql, PassesConnectionStatementCallbackAndArgument)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    db.m_strSql = "SELECT tid FROM token";
    int nRows = 0;

    EXPECT_EQ(0, db.runSql(countRow, &nRows));
    EXPECT_EQ(2, nRows);
    EXPECT_EQ(0, db.runSqlEx("SELECT 1", countRow, &nRows));
    EXPECT_EQ(3, nRows);
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_changes"}));

    seam().sqliteExec = [&](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                            char** pszError) {
        EXPECT_EQ(db.m_pDb, pDb);
        EXPECT_STREQ("SELECT 2", szSql);
        EXPECT_EQ(&countRow, callback);
        EXPECT_EQ(&nRows, pArgument);
        EXPECT_NE(nullptr, pszError);
        EXPECT_EQ(nullptr, *pszError);
        return SQLITE_OK;
    };
    EXPECT_EQ(0, db.runSqlEx("SELECT 2", countRow, &nRows));
    EXPECT_EQ("SELECT tid FROM token", db.m_strSql);
}

TEST_F(RunSql, CallbackThatStopsFailsTheStatement)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    db.m_strSql = "SELECT tid FROM token";

    EXPECT_EQ(-1, db.runSql(stop, nullptr));

    EXPECT_EQ("query aborted", db.m_strErr);
    EXPECT_EQ((Texts{"sqlite3_exec SELECT tid FROM token"}), seam().callsOf({"sqlite3_exec", "usleep"}));
    EXPECT_EQ(failureOf(db.m_strSql, "query aborted"), takeLines());
}

// The number is SQLite's own, which outlives statements that change no row.
TEST_F(RunSql, ReturnsTheNumberOfTheLastChange)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);

    const std::pair<const char*, int> cases[] = {
        {"UPDATE token SET uid = 1", 2},
        {"SELECT tid FROM token", 2},
        {"DELETE FROM token WHERE tid = 'c'", 0},
        {"DELETE FROM token; INSERT INTO token (tid, function) VALUES ('c', '')", 1},
        {" ", 1},
        {"-- nothing", 1},
    };
    for (const auto& [szSql, nChanges] : cases) {
        SCOPED_TRACE(szSql);
        db.m_strSql = szSql;
        EXPECT_EQ(nChanges, db.runSql());
        EXPECT_EQ("", db.m_strErr);
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(RunSql, EmptiesTheErrorTextWhichRunSqlExDoesNot)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    db.m_strSql = UPDATE;

    db.m_strErr = "stale";
    EXPECT_EQ(2, db.runSqlEx(UPDATE, nullptr, nullptr));
    EXPECT_EQ("stale", db.m_strErr);
    EXPECT_EQ(2, db.runSql());
    EXPECT_EQ("", db.m_strErr);
}

// Locks

struct StatementCase {
    const char* szName;
    std::vector<Answer> answers; // one for each try
    bool blSuccess;
    std::string strErrAfter;
    const char* szLine; // of the failure, up to the statement
};

const std::vector<StatementCase> STATEMENTS = {
    {"Success", {RUN}, true, "", ""},
    {"SuccessWithText", {{SQLITE_OK, "no matter"}}, true, "", ""},
    {"LockEndsAfterTwoTries",
     {LOCKED, {SQLITE_BUSY, "(2) database is locked"}, RUN},
     true,
     "(2) database is locked",
     ""},
    {"LockTextOfAnotherCode",
     {{SQLITE_ERROR, "cannot commit: database is locked, somehow"}, RUN},
     true,
     "cannot commit: database is locked, somehow",
     ""},
    {"LockThenError",
     {LOCKED, DISK_ERROR},
     false,
     "disk I/O error",
     "i=1,run sql failed, error=disk I/O error"},
    {"LockThenNoText",
     {LOCKED, {SQLITE_MISUSE, nullptr}},
     false,
     UNKNOWN,
     "i=1,run sql failed, error=(null)"},
    {"BusyWithoutTheText", {{SQLITE_BUSY, "busy"}}, false, "busy", "i=0,run sql failed, error=busy"},
    {"BusyWithoutText", {{SQLITE_BUSY, nullptr}}, false, UNKNOWN, "i=0,run sql failed, error=(null)"},
    {"LockedTable",
     {{SQLITE_LOCKED, "database table is locked: token"}},
     false,
     "database table is locked: token",
     "i=0,run sql failed, error=database table is locked: token"},
    {"OtherSpelling",
     {{SQLITE_BUSY, "Database is locked"}},
     false,
     "Database is locked",
     "i=0,run sql failed, error=Database is locked"},
    {"EmptyText", {{SQLITE_ERROR, ""}}, false, "", "i=0,run sql failed, error="},
    {"TextWithDirectives",
     {{SQLITE_ERROR, "near \"%n%s\""}},
     false,
     "near \"%n%s\"",
     "i=0,run sql failed, error=near \"%n%s\""},
};

class RunSqlAnswered : public InBothLogs<StatementCase> {
protected:
    Texts calls(bool blCallback) const
    {
        Texts calls(1, "sqlite3_exec " + UPDATE);
        for (size_t i = 1; i < theCase().answers.size(); ++i) {
            calls.insert(calls.end(), {"usleep 10000", "sqlite3_exec " + UPDATE});
        }
        if (theCase().blSuccess && !blCallback) {
            calls.push_back("sqlite3_changes");
        }
        return calls;
    }
};

TEST_P(RunSqlAnswered, RetriesOnlyLocks)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    db.m_strSql = UPDATE;
    std::vector<Line> lines;
    if (!theCase().blSuccess) {
        lines = {ordinaryLine(theCase().szLine + (", sql=" + UPDATE), EIO),
                 failLine("run sql failed, sql=" + UPDATE, EIO)};
    }

    for (const bool blCallback : {false, true}) {
        SCOPED_TRACE(blCallback);
        seam().calls.clear();
        errno = 0;
        answerStatements(UPDATE, theCase().answers);
        db.m_strErr = "stale";
        EXPECT_EQ(theCase().blSuccess ? (blCallback ? 0 : 2) : -1,
                  db.runSql(blCallback ? countRow : nullptr, nullptr));
        EXPECT_EQ(theCase().strErrAfter, db.m_strErr);
        EXPECT_EQ(calls(blCallback), seam().callsOf({"sqlite3_exec", "usleep", "sqlite3_changes"}));
        expectLines(lines);
    }
}

INSTANTIATE_TEST_SUITE_P(All, RunSqlAnswered, inBothLogs(STATEMENTS), ::testing::PrintToStringParamName());

TEST_F(RunSql, WaitsForAnotherConnection)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    const Lock lock(path(), 3, "DELETE FROM token WHERE tid = 'a'");
    db.m_strSql = UPDATE;

    EXPECT_EQ(1, db.runSql());

    EXPECT_EQ("database is locked", db.m_strErr);
    EXPECT_EQ((Texts{"usleep 10000", "usleep 10000", "usleep 10000"}), seam().callsOf({"usleep"}));
    EXPECT_EQ((Texts{"b|%n%s"}), query("SELECT tid, extra FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

class RunSqlLocked : public WithSwitches {};

TEST_P(RunSqlLocked, TellsStatementTriesAndChangesInDebugMode)
{
    const std::string strTail = ",run sql failed, error=database is locked, sql=" + UPDATE;
    sayInDebug(ordinaryLine("run sql=" + UPDATE, 0));
    sayInDebug(ordinaryLine("i=0" + strTail, EIO));
    sayInDebug(ordinaryLine("run sql=" + UPDATE, EIO));
    sayInDebug(ordinaryLine("i=1" + strTail, EIO));
    sayInDebug(ordinaryLine("run sql=" + UPDATE, EIO));
    const std::vector<Line> linesOfTries = m_lines;
    sayInDebug(ordinaryLine("change rv=2, run sql=" + UPDATE, EIO));

    failStatements(UPDATE, LOCKED, 2);
    EXPECT_EQ(2, m_db.runSqlEx(UPDATE, nullptr, nullptr));
    expectLines(m_lines);

    failStatements(UPDATE, LOCKED, 2);
    errno = 0;
    EXPECT_EQ(0, m_db.runSqlEx(UPDATE, countRow, nullptr));
    expectLines(linesOfTries);
}

TEST_P(RunSqlLocked, GivesUpAfter500Tries)
{
    Texts calls;
    Texts errors;
    for (int i = 0; i < 500; ++i) {
        calls.insert(calls.end(), {"sqlite3_exec " + UPDATE, "usleep 10000"});
        errors.push_back("database is locked (" + std::to_string(i) + ")");
        sayInDebug(ordinaryLine("run sql=" + UPDATE, 0 == i ? 0 : EIO));
        sayInDebug(ordinaryLine(
            "i=" + std::to_string(i) + ",run sql failed, error=" + errors.back() + ", sql=" + UPDATE, EIO));
    }
    say(ordinaryLine("i=500,run sql failed, error=database is locked (499), sql=" + UPDATE, EIO));
    say(failLine("run sql failed, sql=" + UPDATE, EIO));
    std::vector<Answer> answers;
    for (const std::string& strError : errors) {
        answers.push_back({SQLITE_BUSY, strError.c_str()});
    }
    answerStatements(UPDATE, answers);
    m_db.m_strSql = UPDATE;

    EXPECT_EQ(-1, m_db.runSql());

    EXPECT_EQ("database is locked (499)", m_db.m_strErr);
    EXPECT_EQ(calls, seam().callsOf({"sqlite3_exec", "usleep", "sqlite3_changes"}));
    expectLines(m_lines);
}

INSTANTIATE_TEST_SUITE_P(All, RunSqlLocked, inBothLogs<Switches>({QUIET, DEBUG}),
                         ::testing::PrintToStringParamName());

} // namespace
