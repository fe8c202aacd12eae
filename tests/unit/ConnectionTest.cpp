// The connection to the database: the calls that open it, how opening fails, and how it is closed.
// EnvironmentTest shows what else can be in the place of the file.

#include <unistd.h>

#include <cstddef>
#include <filesystem>
#include <fstream>
#include <type_traits>

#include "Statements.h"
#include "StoreTest.h"

// Compiled callers hold these objects by value.
static_assert(std::is_standard_layout_v<AccessTokenDbApi>);
static_assert(0 == offsetof(AccessTokenDbApi, m_pDb));
static_assert(sizeof(sqlite3*) == offsetof(AccessTokenDbApi, m_strSql));
static_assert(sizeof(sqlite3*) + sizeof(std::string) == offsetof(AccessTokenDbApi, m_strErr));
static_assert(sizeof(sqlite3*) + 2 * sizeof(std::string) == sizeof(AccessTokenDbApi));
static_assert(std::is_same_v<decltype(AccessTokenDbApi::m_pDb), sqlite3*>);

namespace {

const std::string UPDATE = "UPDATE token SET uid = 1";
const std::string OPEN_FAILED = "open sqlite failed, path=" VEMO_ATOKEN_DB_PATH ", errno=";

// The state after an opening.
struct Outcome {
    int nResult;
    bool blHandle;
    uid_t uidAfter;
};

const Outcome OPENED = {0, true, UID_CALLER};
const Outcome REFUSED = {-1, false, UID_CALLER};

class Connection : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        ASSERT_EQ(0, seteuid(UID_CALLER));
    }

    // SQLite refuses to open a directory, and returns a handle that can only be closed.
    static void refuseOpening()
    {
        seam().sqliteOpen = [](const char*, sqlite3** ppDb) {
            const int nResult = sqlite3_open("/", ppDb);
            errno = EACCES;
            return nResult;
        };
    }

    static void openWithoutHandle(int nResult)
    {
        seam().sqliteOpen = [=](const char*, sqlite3**) { return errno = ENOMEM, nResult; };
    }
};

TEST_F(Connection, OpensInAFixedOrderOfCallsAndRestoresTheUid)
{
    const Texts touched = {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN};
    const Texts created = touched + Texts{CREATE};
    const Texts back = {BACK};
    const auto opens = [&](const auto& prepare, const Outcome& outcome, const Texts& calls,
                           const Texts& lines) {
        SCOPED_TRACE(joined(calls, ", "));
        std::filesystem::remove(path());
        reset();
        prepare();
        ASSERT_EQ(0, seteuid(UID_CALLER));
        AccessTokenDbApi db;
        EXPECT_EQ(outcome.nResult, db.initDb());
        EXPECT_EQ(calls, seam().callsOf(OPENING_CALLS));
        EXPECT_EQ(outcome.blHandle, nullptr != db.m_pDb);
        EXPECT_EQ(outcome.uidAfter, geteuid());
        EXPECT_EQ("", db.m_strSql);
        EXPECT_LINES(lines);
        EXPECT_FALSE(std::filesystem::exists(path() + ".elsewhere"));
    };
    opens([] {}, OPENED, created + back, {});
    opens([&] { std::ofstream{path()}; }, OPENED, {UID, RAISE, ACCESS, OPEN, BACK}, {});
    // A file that cannot be examined is treated as missing, which does not harm it.
    opens([&] { makeTable(), insert(), seam().fail("access", EACCES); }, OPENED, created + back, {});
    EXPECT_EQ("t", tids());
    opens([] { seam().fail("seteuid", EPERM); }, REFUSED, {UID, RAISE, BACK}, {NOT_ROOT});
    opens([] { seam().fail("open", EROFS); }, REFUSED, {UID, RAISE, ACCESS, TOUCH, BACK},
          {failed(STORE, "0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", EROFS)});
    opens([&] { std::filesystem::create_symlink(path() + ".elsewhere", path()); }, REFUSED,
          {UID, RAISE, ACCESS, TOUCH, BACK},
          {failed(STORE, "0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", ENOENT)});
    opens([] { seam().fail("chmod", EPERM); }, REFUSED, {UID, RAISE, ACCESS, TOUCH, CHMOD, BACK},
          {failed(STORE, "-1 == chmod(VEMO_ATOKEN_DB_PATH, 0700)", EPERM)});
    // The effective uid stays 0 after a failed opening, and only then.
    opens(refuseOpening, {-1, true, 0}, touched, {fail(STORE, OPEN_FAILED + "14", EACCES)});
    opens([] { openWithoutHandle(SQLITE_NOMEM); }, {-1, false, 0}, touched,
          {fail(STORE, OPEN_FAILED + "7", ENOMEM)});
    opens([] { openWithoutHandle(SQLITE_OK); }, {0, false, UID_CALLER}, touched + back,
          {failed(STORE, "!m_pDb", ENOMEM)});
    opens([] { failStatements(SCHEMA, DISK_ERROR); }, OPENED, created + back,
          {ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + SCHEMA),
           fail(STORE, "create table failed, sql=" + SCHEMA, EIO)});
    // If the earlier uid is unknown, none is restored.
    opens([] { seam().fail("geteuid", EPERM); }, {0, true, 0}, created, {});
    opens([] { seam().fail("geteuid", 0), seam().fail("seteuid", EPERM); }, REFUSED, {UID, RAISE},
          {NOT_ROOT});
    opens([] { seam().fail("seteuid", EAGAIN, 2, 2); }, {0, true, 0}, created + back, {});
}

TEST_F(Connection, OpensOnceAndNotBeforeItMust)
{
    {
        AccessTokenDbApi db;
        EXPECT_EQ(nullptr, db.m_pDb);
        EXPECT_EQ("", db.m_strSql + db.m_strErr);
        EXPECT_EQ(Texts{}, seam().calls);
        EXPECT_EQ(0, db.initDb());
        seam().calls.clear();
        EXPECT_EQ(0, db.initDb());
        EXPECT_EQ(0, db.freeDb());
        EXPECT_EQ(0, db.freeDb());
        EXPECT_EQ(nullptr, db.m_pDb);
        EXPECT_EQ((Texts{CLOSE}), seam().calls);
        db.m_strSql = UPDATE;
        EXPECT_EQ(0, db.runSql());
        EXPECT_EQ((Texts{CLOSE, OPEN}), seam().callsOf({CLOSE, "sqlite3_open"}));
        seam().calls.clear();
    }
    EXPECT_EQ((Texts{CLOSE}), seam().calls); // by the destructor
}

TEST_F(Connection, RestoresTheUidWhenAnExceptionPasses)
{
    seam().sqliteExec = [](sqlite3*, const char*, SqlCallback, void*, char**) -> int {
        throw std::bad_alloc();
    };
    AccessTokenDbApi db;
    EXPECT_THROW(db.initDb(), std::bad_alloc);
    EXPECT_EQ(UID_CALLER, geteuid());
    EXPECT_EQ((Texts{UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, BACK}), seam().callsOf(OPENING_CALLS));
    EXPECT_NE(nullptr, db.m_pDb);
}

TEST_F(Connection, KeepsTheHandleOfARefusedOpening)
{
    refuseOpening();
    AccessTokenDbApi db;
    db.m_strSql = UPDATE;
    db.m_strErr = "stale";
    EXPECT_EQ(-1, db.runSql());
    EXPECT_EQ("stale", db.m_strErr); // nothing was run
    EXPECT_LINES(fail(STORE, OPEN_FAILED + "14", EACCES), failed(STORE, "0 > initDb()", EACCES));

    errno = 0;
    EXPECT_EQ(-1, db.runSql());
    EXPECT_EQ("Unknow Error!!", db.m_strErr);
    EXPECT_LINES(failureOf(UPDATE, "(null)"));
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));

    EXPECT_EQ(0, db.freeDb());
    reset();
    EXPECT_EQ(-1, db.runSql()); // the first try has made an empty file
    EXPECT_LINES(failureOf(UPDATE, "no such table: token"));
}

// A failure to restore the uid does not hide why the opening failed.
TEST_F(Connection, KeepsErrnoOfTheFailedCallInEachLine)
{
    seam().fail("open", EROFS);
    seam().fail("seteuid", EAGAIN, 2, 2);
    EXPECT_FAILURE(
        AccessTokenDbApi().createTable(),
        allFailed(STORE, {"0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", "0 > initDb()", "0 > runSql()"}, EROFS));
}

TEST_F(Connection, CreatesTheTableWhereItIsMissing)
{
    std::ofstream{path()};
    AccessTokenDbApi db;
    db.m_strErr = "stale";
    EXPECT_EQ(0, db.createTable());
    EXPECT_EQ(SCHEMA, db.m_strSql);
    EXPECT_EQ("", db.m_strErr);
    insert();
    EXPECT_EQ(0, db.createTable());
    EXPECT_EQ("t", tids());
    std::string strSql = "replaced";
    EXPECT_EQ(0, db.SqlExpandCreateTable(strSql));
    EXPECT_EQ(SCHEMA, strSql);
}

TEST_F(Connection, StaysOpenWhenItCannotBeClosed)
{
    AccessTokenDbApi db;
    ASSERT_EQ(0, db.initDb());
    const sqlite3* const pDb = db.m_pDb;
    seam().sqliteClose = [](sqlite3*) { return SQLITE_BUSY; };
    errno = EINTR;
    EXPECT_EQ(0, db.freeDb());
    EXPECT_EQ(pDb, db.m_pDb);
    EXPECT_LINES(failed(STORE, "SQLITE_OK != sqlite3_close(m_pDb)", EINTR));
    seam().sqliteClose = nullptr; // the destructor closes it
}

} // namespace
