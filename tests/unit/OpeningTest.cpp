// The order of calls in which the database is opened, and how it fails.

#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "BothLogs.h"
#include "Statements.h"

namespace {

Preparation failing(const std::string& strName, int nErrno, int nCall = 1)
{
    return [=](const std::string&) { seam().fail(strName, nErrno, nCall, nCall); };
}

void refusedOpening(const std::string&)
{
    seam().sqliteOpen = refuseOpening;
}

void noPreparation(const std::string&) {}

void existingFile(const std::string& strPath)
{
    std::ofstream{strPath};
}

void existingFileOutOfSight(const std::string& strPath)
{
    existingFile(strPath);
    seam().fail("access", EACCES);
}

void danglingLink(const std::string& strPath)
{
    std::filesystem::create_symlink(strPath + ".elsewhere", strPath);
}

void fullDisk(const std::string&)
{
    failStatements(SCHEMA, {SQLITE_FULL, "database or disk is full"});
}

void unknownUid(const std::string&)
{
    seam().fail("geteuid", EPERM);
}

void unknownAndRefusedUid(const std::string&)
{
    seam().fail("geteuid", EPERM);
    seam().fail("seteuid", EINVAL);
}

struct Opened {
    int nResult;
    bool blHandle;
    uid_t uidAfter;
};

const Opened OPENED = {0, true, UID_CALLER};
const Opened REFUSED = {-1, false, UID_CALLER};

struct OpeningCase {
    const char* szName;
    Preparation prepare;
    Opened opened;
    Texts calls;
    std::vector<Line> lines;
};

const std::vector<OpeningCase> OPENINGS = {
    {"NewFile", noPreparation, OPENED, {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, CHANGES, BACK}, {}},
    {"ExistingFile", existingFile, OPENED, {UID, RAISE, ACCESS, OPEN, BACK}, {}},
    // What cannot be looked at is treated as missing, which does the file no harm.
    {"ExistingFileOutOfSight",
     existingFileOutOfSight,
     OPENED,
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, CHANGES, BACK},
     {}},
    {"UidRefused",
     failing("seteuid", EPERM),
     REFUSED,
     {UID, RAISE, BACK},
     {failedLine("0 > seteuid(0)", EPERM)}},
    {"TouchRefused",
     failing("open", EROFS),
     REFUSED,
     {UID, RAISE, ACCESS, TOUCH, BACK},
     {failedLine("0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", EROFS)}},
    {"DanglingLink",
     danglingLink,
     REFUSED,
     {UID, RAISE, ACCESS, TOUCH, BACK},
     {failedLine("0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)", ENOENT)}},
    {"ChmodRefused",
     failing("chmod", EPERM),
     REFUSED,
     {UID, RAISE, ACCESS, TOUCH, CHMOD, BACK},
     {failedLine("-1 == chmod(VEMO_ATOKEN_DB_PATH, 0700)", EPERM)}},
    // The effective uid stays 0 after a failed opening, and only then.
    {"OpenRefused",
     refusedOpening,
     {-1, true, 0},
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN},
     {failLine("open sqlite failed, path=" VEMO_ATOKEN_DB_PATH ", errno=14", EACCES)}},
    {"OpenWithoutMemory",
     openingWithoutHandle(SQLITE_NOMEM, 0),
     {-1, false, 0},
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN},
     {failLine("open sqlite failed, path=" VEMO_ATOKEN_DB_PATH ", errno=7", 0)}},
    {"NullHandle",
     openingWithoutHandle(SQLITE_OK, ENOMEM),
     {0, false, UID_CALLER},
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, BACK},
     {failedLine("!m_pDb", ENOMEM)}},
    {"TableRefused",
     fullDisk,
     OPENED,
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, BACK},
     {ordinaryLine("i=0,run sql failed, error=database or disk is full, sql=" + SCHEMA, EIO),
      failLine("create table failed, sql=" + SCHEMA, EIO)}},
    // Nobody knows what to put back.
    {"UidUnknown", unknownUid, {0, true, 0}, {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, CHANGES}, {}},
    {"UidUnknownAndRefused",
     unknownAndRefusedUid,
     REFUSED,
     {UID, RAISE},
     {failedLine("0 > seteuid(0)", EINVAL)}},
    {"PuttingBackRefused",
     failing("seteuid", EAGAIN, 2),
     {0, true, 0},
     {UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, CREATE, CHANGES, BACK},
     {}},
};

class Opening : public InBothLogs<OpeningCase> {};

TEST_P(Opening, CallsLogsAndPutsBack)
{
    theCase().prepare(path());
    ASSERT_EQ(0, seteuid(UID_CALLER));
    AccessTokenDbApi db;

    EXPECT_EQ(theCase().opened.nResult, db.initDb());

    EXPECT_EQ(theCase().calls, seam().callsOf(OPENING_CALLS));
    EXPECT_EQ(theCase().opened.blHandle, nullptr != db.m_pDb);
    EXPECT_EQ(theCase().opened.uidAfter, geteuid());
    EXPECT_EQ("", db.m_strSql);
    EXPECT_FALSE(std::filesystem::exists(path() + ".elsewhere"));
    expectLines(theCase().lines);
}

INSTANTIATE_TEST_SUITE_P(All, Opening, inBothLogs(OPENINGS), ::testing::PrintToStringParamName());

} // namespace
