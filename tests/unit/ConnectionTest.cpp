// Creating the database, keeping it open, closing it, and the schema.

#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <filesystem>
#include <fstream>
#include <new>
#include <type_traits>

#include "BothLogs.h"
#include "StandIns.h"
#include "Statements.h"

// Compiled callers hold these objects by value and call these members by their mangled names.
static_assert(std::is_standard_layout_v<AccessTokenDbApi>);
static_assert(0 == offsetof(AccessTokenDbApi, m_pDb));
static_assert(sizeof(sqlite3*) == offsetof(AccessTokenDbApi, m_strSql));
static_assert(sizeof(sqlite3*) + sizeof(std::string) == offsetof(AccessTokenDbApi, m_strErr));
static_assert(sizeof(sqlite3*) + 2 * sizeof(std::string) == sizeof(AccessTokenDbApi));
static_assert(std::is_same_v<decltype(AccessTokenDbApi::m_pDb), sqlite3*>);
static_assert(std::is_same_v<decltype(&AccessTokenDbApi::runSqlEx),
                             int (AccessTokenDbApi::*)(std::string, SqlCallback, void*)>);
static_assert(std::is_same_v<decltype(&AccessTokenDbApi::cleanExpireToken), int (AccessTokenDbApi::*)(bool)>);

namespace {

class Connection : public StoreTest {
protected:
    mode_t mode() const
    {
        struct stat status;
        EXPECT_EQ(0, stat(path().c_str(), &status));
        return status.st_mode & 07777;
    }
};

TEST_F(Connection, OpensAndClosesNothingUnasked)
{
    {
        const AccessTokenDbApi db;
        EXPECT_EQ(nullptr, db.m_pDb);
        EXPECT_EQ("", db.m_strSql);
        EXPECT_EQ("", db.m_strErr);
    }

    EXPECT_EQ(Texts{}, seam().calls);
    EXPECT_FALSE(std::filesystem::exists(path()));
}

TEST_F(Connection, CreatesPrivateFileWithTableOnFirstUse)
{
    AccessTokenDbApi db;

    EXPECT_EQ(0, db.initDb());

    EXPECT_EQ(0700u, mode());
    EXPECT_EQ((Texts{"1"}), query("PRAGMA auto_vacuum"));
    EXPECT_EQ(
        (Texts{"tid|TEXT|1|NULL|1", "bind_sid|TEXT|0|NULL|0", "uid|INTEGER|0|NULL|0",
               "deadline|INTEGER|0|-1|0", "count|INTEGER|0|1|0", "create_time|INTEGER|0|CURRENT_TIMESTAMP|0",
               "function|TEXT|1|NULL|0", "webapi_allow|TEXT|0|NULL|0", "extra|TEXT|0|NULL|0"}),
        query("SELECT name, type, \"notnull\", dflt_value, pk FROM pragma_table_info('token')"));
    EXPECT_EQ("", db.m_strErr);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Connection, MakesTheModeWhateverTheUmask)
{
    for (const mode_t mask : {0000u, 0022u, 0077u, 0777u}) {
        SCOPED_TRACE(mask);
        AccessTokenDbApi db;
        const mode_t maskBefore = umask(mask);
        EXPECT_EQ(0, db.initDb());
        umask(maskBefore);
        EXPECT_EQ(0700u, mode());
        std::filesystem::remove(path());
    }
}

TEST_F(Connection, DoesNothingWhenOpen)
{
    AccessTokenDbApi db;
    ASSERT_EQ(0, db.initDb());
    std::filesystem::remove(path());
    seam() = Seam();
    seam().fail("seteuid", EPERM);

    EXPECT_EQ(0, db.initDb());

    EXPECT_EQ(Texts{}, seam().calls);
}

// The file's existence counts, not the table's.
TEST_F(Connection, LeavesAnEmptyFileWithoutTable)
{
    std::ofstream{path()};
    ASSERT_EQ(0, chmod(path().c_str(), 0640));
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;

    EXPECT_EQ(-1, db.runSql());

    EXPECT_EQ("no such table: token", db.m_strErr);
    EXPECT_EQ(0640u, mode());
    EXPECT_EQ((Texts{"sqlite3_exec " + UPDATE}),
              seam().callsOf({"sqlite3_exec", "usleep", "sqlite3_changes"}));
    EXPECT_EQ(failureOf(UPDATE, "no such table: token"), takeLines());

    EXPECT_EQ(0, db.createTable());

    EXPECT_EQ(SCHEMA, db.m_strSql);
    EXPECT_EQ("", db.m_strErr);
    EXPECT_EQ((Texts{COLUMNS}), query("SELECT group_concat(name) FROM pragma_table_info('token')"));
}

TEST_F(Connection, LeavesAForeignFileAlone)
{
    const std::string strContent(4096, 'x');
    std::ofstream{path()} << strContent;
    AccessTokenDbApi db;

    EXPECT_EQ(0, db.initDb());
    db.m_strSql = UPDATE;
    EXPECT_EQ(-1, db.runSql());

    EXPECT_EQ(failureOf(UPDATE, "file is not a database"), takeLines());
    EXPECT_EQ("file is not a database", db.m_strErr);
    std::string strAfter;
    std::ifstream{path()} >> strAfter;
    EXPECT_EQ(strContent, strAfter);
}

TEST_F(Connection, PutsTheUidBackWhenAnExceptionPasses)
{
    seam().sqliteExec = [](sqlite3*, const char*, SqlCallback, void*, char**) -> int {
        throw std::bad_alloc();
    };
    ASSERT_EQ(0, seteuid(UID_CALLER));
    AccessTokenDbApi db;

    EXPECT_THROW(db.initDb(), std::bad_alloc);

    EXPECT_EQ(UID_CALLER, geteuid());
    EXPECT_EQ((Texts{UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, BACK}), seam().callsOf(OPENING_CALLS));
    EXPECT_NE(nullptr, db.m_pDb);
    EXPECT_EQ(0, db.freeDb());
}

TEST_F(Connection, KeepsTheUselessHandleOfARefusedOpening)
{
    seam().sqliteOpen = refuseOpening;
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;
    db.m_strErr = "stale";

    EXPECT_EQ(-1, db.runSql());

    EXPECT_EQ("stale", db.m_strErr); // nothing was run
    EXPECT_EQ((Texts{fail(STORE, "open sqlite failed, path=" VEMO_ATOKEN_DB_PATH ", errno=14", EACCES),
                     failed(STORE, "0 > initDb()", EACCES)}),
              takeLines());

    errno = 0;
    EXPECT_EQ(-1, db.runSql());

    EXPECT_EQ(UNKNOWN, db.m_strErr);
    EXPECT_EQ(failureOf(UPDATE, "(null)"), takeLines());
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));

    EXPECT_EQ(0, db.freeDb());
    seam() = Seam();
    EXPECT_EQ(-1, db.runSql()); // the empty file that the first try made is there by now
    EXPECT_EQ("no such table: token", db.m_strErr);
}

// No handle counts as closed, so each statement opens anew.
TEST_F(Connection, RunsStatementsOverNoHandleInVain)
{
    openingWithoutHandle(SQLITE_OK, 0)(path());
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;

    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(-1, db.runSql());
        EXPECT_EQ(UNKNOWN, db.m_strErr);
        EXPECT_EQ((Texts{failed(STORE, "!m_pDb"),
                         ordinary(STORE, "i=0,run sql failed, error=(null), sql=" + UPDATE),
                         fail(STORE, "run sql failed, sql=" + UPDATE)}),
                  takeLines());
    }
    EXPECT_EQ((Texts{OPEN, OPEN}), seam().callsOf({"sqlite3_open"}));
    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_close"}));
}

// The uid that cannot be put back must not hide why the opening failed.
TEST_F(Connection, TellsErrnoOfTheFailedCallUpToTheStatement)
{
    seam().fail("open", EROFS);
    seam().fail("seteuid", EAGAIN, 2, 2);
    AccessTokenDbApi db;

    EXPECT_EQ(-1, db.createTable());

    EXPECT_EQ((Texts{failed(STORE, "0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", EROFS),
                     failed(STORE, "0 > initDb()", EROFS), failed(STORE, "0 > runSql()", EROFS)}),
              takeLines());
}

TEST_F(Connection, ReopensAfterFree)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);

    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ(nullptr, db.m_pDb);
    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
    ASSERT_EQ(0, seteuid(UID_CALLER));
    seam() = Seam();

    db.m_strSql = UPDATE;
    EXPECT_EQ(2, db.runSql());

    EXPECT_EQ((Texts{UID, RAISE, ACCESS, OPEN, BACK, "sqlite3_exec " + UPDATE, CHANGES}),
              seam().callsOf(OPENING_CALLS));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Connection, DestructorCloses)
{
    {
        AccessTokenDbApi db;
        ASSERT_EQ(0, db.initDb());
        seam() = Seam();
    }

    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
}

TEST_F(Connection, StaysOpenWhileAStatementIsUnfinished)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    sqlite3_stmt* pStatement = nullptr;
    ASSERT_EQ(SQLITE_OK, sqlite3_prepare_v2(db.m_pDb, "SELECT tid FROM token", -1, &pStatement, nullptr));
    sqlite3* const pDb = db.m_pDb;

    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ(pDb, db.m_pDb);
    EXPECT_EQ((Texts{failed(STORE, "SQLITE_OK != sqlite3_close(m_pDb)")}), takeLines());

    sqlite3_finalize(pStatement);
    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ(nullptr, db.m_pDb);
    EXPECT_EQ(Texts{}, takeLines());
}

struct ErrnoCase {
    const char* szName;
    int nErrno;
};

class WithErrno : public InBothLogs<ErrnoCase> {};

TEST_P(WithErrno, RefusedClosingIsLogged)
{
    sqlite3* pDb = nullptr;
    {
        AccessTokenDbApi db;
        ASSERT_EQ(0, db.initDb());
        pDb = db.m_pDb;
        seam().sqliteClose = [this](sqlite3*) {
            errno = theCase().nErrno;
            return SQLITE_BUSY;
        };
        EXPECT_EQ(0, db.freeDb());
        EXPECT_EQ(pDb, db.m_pDb);
    }

    const Line line = failedLine("SQLITE_OK != sqlite3_close(m_pDb)", theCase().nErrno);
    expectLines({line, line}); // the second by the destructor
    EXPECT_EQ(SQLITE_OK, sqlite3_close(pDb));
}

TEST_P(WithErrno, EmptyStatementIsRefusedTwice)
{
    AccessTokenDbApi db;
    db.m_strErr = "stale";
    errno = theCase().nErrno;

    EXPECT_EQ(-1, db.runSql());
    EXPECT_EQ(-1, db.runSql(countRow, nullptr));
    EXPECT_EQ("stale", db.m_strErr);
    EXPECT_EQ(-1, db.runSqlEx("", nullptr, nullptr));
    EXPECT_EQ(UNKNOWN, db.m_strErr);

    const Line line = failLine("no correct sql", theCase().nErrno);
    expectLines({line, line, failedLine("0 >= strSql.length()", theCase().nErrno)});
    EXPECT_EQ(nullptr, db.m_pDb);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

INSTANTIATE_TEST_SUITE_P(All, WithErrno, inBothLogs<ErrnoCase>({{"Zero", 0}, {"Set", EINTR}}),
                         ::testing::PrintToStringParamName());

// The schema

TEST_F(Connection, SchemaReplacesTheText)
{
    std::string strSql = "anything";
    AccessTokenDbApi db;

    EXPECT_EQ(0, db.SqlExpandCreateTable(strSql));

    EXPECT_EQ(SCHEMA, strSql);
    EXPECT_EQ("", db.m_strSql);
}

TEST_F(Connection, CreateTableKeepsATableThatIsThere)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);

    EXPECT_EQ(0, db.createTable());

    EXPECT_EQ(SCHEMA, db.m_strSql);
    EXPECT_EQ((Texts{"2"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Connection, CreateTableReportsItsFailure)
{
    AccessTokenDbApi db;
    openWithTwoRows(db);
    failStatements(SCHEMA, {SQLITE_CORRUPT, "database disk image is malformed"});

    EXPECT_EQ(-1, db.createTable());

    EXPECT_EQ(SCHEMA, db.m_strSql);
    EXPECT_EQ("database disk image is malformed", db.m_strErr);
    EXPECT_EQ(failureOf(SCHEMA, "database disk image is malformed", EIO) +
                  Texts{failed(STORE, "0 > runSql()", EIO)},
              takeLines());
}

TEST_F(Connection, LogsASchemaThatCannotBeBuilt)
{
    standIns().sqlExpandCreateTable = [](std::string&) {
        errno = ENOMEM;
        return -1;
    };
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;

    EXPECT_EQ(0, db.initDb());
    EXPECT_EQ((Texts{failed(STORE, "0 > SqlExpandCreateTable(strSql)", ENOMEM)}), takeLines());
    EXPECT_EQ((Texts{UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, RAISE}), seam().callsOf(OPENING_CALLS));

    EXPECT_EQ(-1, db.createTable());
    EXPECT_EQ((Texts{failed(STORE, "0 > AccessTokenDbApi::SqlExpandCreateTable(strSql)", ENOMEM)}),
              takeLines());
    EXPECT_EQ(UPDATE, db.m_strSql);
}

} // namespace
