// What operations do in a bad environment: one row for each environment.

#include <cstdio>

#include "AccessTokenApi.h"
#include "Environments.h"
#include "Figures.h"
#include "Operations.h"
#include "Oracle.h"
#include "ProcessState.h"
#include "ShortWaits.h"

namespace {

enum class Needs { Nothing, Root, FileSystem };

// The expected outcomes of a first creation, of the operations that change the store, and of a listing, in
// the words of outcomeOf(). An empty outcome means that the environment cannot occur at a first creation.
struct Row {
    const char* szName;
    Environment enter;
    std::string strFirst;
    std::string strChange;
    std::string strListing;
    Needs needs = Needs::Nothing;
};

const std::string DONE = "done";
const std::string DONE_FIRST = "done, mode 0700";

std::string refused(const std::string& strWhy)
{
    return "refused: " + strWhy;
}

std::string noTable(const std::string& strWhy)
{
    return "leaves no table, mode 0700: " + strWhy;
}

std::string noTouch(const std::string& strErrno)
{
    return refused("Failed [0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH)], err=" + strErrno);
}

std::string noOpen(const std::string& strErrno)
{
    return refused("open sqlite failed, path=/usr/vemo/etc/private/session/vemo-access-token.db, errno=" +
                   strErrno);
}

std::string sqlError(const std::string& strError)
{
    return "i=0,run sql failed, error=" + strError;
}

const std::string READ_ONLY = sqlError("attempt to write a readonly database");
const std::string NO_JOURNAL = sqlError("unable to open database file");
const std::string IO_ERROR = sqlError("disk I/O error");
const std::string FULL = sqlError("database or disk is full");
const std::string NO_TABLE = sqlError("no such table: token");
const std::string LOCKED = "i=500,run sql failed, error=database is locked, 500 waits";

Row everywhere(const char* szName, const Environment& enter, const std::string& strOutcome)
{
    return {szName, enter, strOutcome, strOutcome, strOutcome};
}

const std::vector<Row> ROWS = {
    {"Umask0", umaskOf(0), DONE_FIRST, DONE, DONE},
    {"Umask022", umaskOf(022), DONE_FIRST, DONE, DONE},
    {"Umask077", umaskOf(077), DONE_FIRST, DONE, DONE},
    {"Umask0777", umaskOf(0777), DONE_FIRST, DONE, DONE},

    everywhere("NoDirectory", directoryIs("true"), noTouch("No such file or directory")),
    everywhere("FileAsDirectory", directoryIs("touch"), noTouch("Not a directory")),
    everywhere("DanglingLinkAsDirectory", directoryIs("ln -s nowhere"), noTouch("No such file or directory")),
    {"LinkAsDirectory", directoryIs("ln -s ."), DONE_FIRST, DONE, DONE},

    // The library makes no table in an existing file. After a failed opening the effective uid stays 0.
    everywhere("EmptyDatabase", databaseIs("touch"), refused(NO_TABLE)),
    everywhere("DirectoryAsDatabase", databaseIs("mkdir"), noOpen("14")),
    everywhere("FifoAsDatabase", databaseIs("mkfifo -m 0600"), noOpen("10")),
    everywhere("DanglingLinkAsDatabase", databaseIs("ln -s nowhere"), noTouch("No such file or directory")),
    {"LinkAsDatabase", databaseIs("ln -s aside"), "", DONE, DONE},

    // Modes restrict all users except root.
    {"OrdinaryUser", modes(User::Other, 0700, 0600), DONE_FIRST, DONE, DONE},
    {"ReadOnlyDirectory", modes(User::Other, 0500, 0600), noTouch("Permission denied"), refused(READ_ONLY),
     DONE},
    {"ReadOnlyDatabase", modes(User::Other, 0700, 0400), "", refused(READ_ONLY), DONE},
    {"UnreadableDatabase", modes(User::Other, 0700, 0), "", noOpen("14"), noOpen("14")},
    {"ReadOnlyForRoot", modes(User::Same, 0500, 0400), DONE_FIRST, DONE, DONE, Needs::Root},

    {"NoStandardInput", closedDescriptors({0}), DONE_FIRST, DONE, DONE},
    {"NoStandardOutput", closedDescriptors({1}), DONE_FIRST, DONE, DONE},
    {"NoStandardError", closedDescriptors({2}), DONE_FIRST, DONE, DONE},
    {"NoStandardStreams", closedDescriptors({0, 1, 2}), DONE_FIRST, DONE, DONE},

    // The database needs one descriptor and its journal another. The third, for the directory, is not
    // necessary.
    {"NoDescriptor", freeDescriptors(0), noTouch("Too many open files"), noOpen("14"), noOpen("14")},
    {"OneDescriptor", freeDescriptors(1U), noTable(NO_JOURNAL), refused(NO_JOURNAL), DONE},
    {"TwoDescriptors", freeDescriptors(2U), DONE_FIRST, DONE, DONE},

    {"NoFileMayGrow", fileSizeLimit(0), noTable(IO_ERROR), refused(IO_ERROR), DONE},
    {"FilesOfTwoPages", fileSizeLimit(8192), noTable(IO_ERROR), refused(IO_ERROR), DONE},
    {"FilesOfFourPages", fileSizeLimit(16384), DONE_FIRST, refused(IO_ERROR), DONE},

    {"StoppedWriter", stoppedHolder("BEGIN EXCLUSIVE"), "", refused(LOCKED), refused(LOCKED)},
    {"StoppedBeforeItWrites", stoppedHolder("BEGIN IMMEDIATE"), "", refused(LOCKED), DONE},
    {"StoppedReader", stoppedHolder("BEGIN; SELECT * FROM token"), "", refused(LOCKED), DONE},

    {"FullFileSystem", fullFileSystem(0), noTable(FULL), refused(FULL), DONE, Needs::FileSystem},
    {"NearlyFullFileSystem", fullFileSystem(8192), noTable(FULL), refused(FULL), DONE, Needs::FileSystem},
    {"ReadOnlyFileSystem", readOnlyFileSystem(), noTouch("Read-only file system"), refused(READ_ONLY), DONE,
     Needs::FileSystem},
};

const std::string& expectedOf(const Row& row, const Operation& operation)
{
    return operation.blCreatesStore ? row.strFirst : &LISTING == &operation ? row.strListing : row.strChange;
}

std::string modeOf(const std::string& strPath)
{
    struct stat status;
    if (0 != stat(strPath.c_str(), &status)) {
        return "";
    }
    char szMode[16];
    snprintf(szMode, sizeof(szMode), ", mode %04o", status.st_mode & 07777);
    return szMode;
}

// How the operation ended, judged by the store and by the next call after leaving the environment.
std::string endOf(const TokenStore& store, const Operation& operation, int nResult)
{
    if (0 <= nResult) {
        return "done";
    }
    const std::string strAfter = store.state();
    const bool blWorksAgain = 0 <= operation.run();
    if (strAfter == STATE_NO_TABLE) {
        return blWorksAgain ? "leaves no table for the moment" : "leaves no table";
    }
    prepareStore(store, operation);
    if (strAfter != store.state()) {
        return "fails late";
    }
    return blWorksAgain ? "refused" : "refused for good";
}

// Runs an operation in an environment, and lets the oracle judge it. Returns
// - "done": it succeeded
// - "refused: WHY": it failed, the store is unchanged, and the next call works. WHY is its first log line.
// - "leaves no table: WHY": it failed and left a file without the table, so the next call fails too
// - "fails late: WHY": it failed, but has changed the store
// A first creation adds the mode of the file: "done, mode 0700". Waits for a lock are added for each
// statement: ", 500 waits". What the oracle finds wrong comes last: "; WRONG: ".
std::string outcomeOf(const TokenStore& store, const Operation& operation, const Environment& enter)
{
    int nResult = -1;
    Operation watched = operation;
    watched.run = [&] {
        nResult = -1;
        return nResult = operation.run();
    };
    const Oracle oracle(store, watched);
    std::function<void()> leave;
    std::string strModeBefore;
    std::string strMode;
    const auto arm = [&] {
        leave = enter(store);
        strModeBefore = modeOf(store.path());
        g_nWaits = 0;
    };
    const auto disarm = [&] {
        strMode = modeOf(store.path());
        leave();
    };
    const std::string strWrong = oracle.judge(arm, disarm);

    std::string strDetails = strMode == strModeBefore ? "" : strMode;
    if (0 > nResult) {
        strDetails += ": " + Log::firstLine();
    }
    if (0 != g_nWaits) {
        strDetails += ", " + std::to_string(g_nWaits / (operation.blPurges ? 2 : 1)) + " waits";
    }
    if (!strWrong.empty()) {
        strDetails += "; WRONG: " + strWrong;
    }
    return endOf(store, operation, nResult) + strDetails;
}

class InEnvironment : public ::testing::TestWithParam<size_t> {};

} // namespace

TEST_P(InEnvironment, HasItsOutcomeForEachOperation)
{
    const Row& row = ROWS[GetParam()];
    if (Needs::Root == row.needs && 0 != getuid()) {
        GTEST_SKIP() << "needs root, whom modes do not restrict";
    }
    try {
        const TokenStore store;
        const auto unmount = Needs::FileSystem == row.needs ? smallFileSystem()(store) : [] {};
        for (const Operation& operation : operations()) {
            SCOPED_TRACE(operation.szName);
            const std::string& strExpected = expectedOf(row, operation);
            if (!strExpected.empty()) {
                EXPECT_EQ(strExpected, outcomeOf(store, operation, row.enter));
            }
        }
        unmount();
    } catch (const Unavailable& unavailable) {
        GTEST_SKIP() << unavailable.what();
    }
}

INSTANTIATE_TEST_SUITE_P(In, InEnvironment, ::testing::Range<size_t>(0, ROWS.size()),
                         [](const auto& instance) { return ROWS[instance.param].szName; });

// This is why a process must stay at effective uid 0 while it holds a connection: at another uid it cannot
// see the journal that undoes the half change of a crashed writer.
TEST(HotJournal, IsNotSeenByAReaderAtAnotherEffectiveUid)
{
    if (0 != getuid()) {
        GTEST_SKIP() << "only root can take another effective uid";
    }
    const TokenStore store;
    makeTable(store);
    store.run("WITH RECURSIVE number(n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM number WHERE n < 300) "
              "INSERT INTO token SELECT 'token-' || n, '', 0, 4102444800, 1, 1, 'VPN', '{}', "
              "json_object('filling', printf('%.1000c', 'f')) FROM number"); // three rows on a page
    AccessTokenApi api;                                                      // its connection is open already
    const auto tokensWith99Uses = [&] {
        Json::Value jFilter(Json::objectValue);
        jFilter["count"] = 99;
        Json::Value jTokenArray(Json::arrayValue);
        EXPECT_EQ(0, api.tokenList(jFilter, jTokenArray));
        return jTokenArray.size();
    };
    // The writer's cache is so small that it has written most of the pages before it is killed.
    const int nStatus = statusOf(startProcess([&] {
        const Database pDb = store.open();
        run(pDb, "PRAGMA cache_size = 1; BEGIN; UPDATE token SET count = 99");
        raise(SIGKILL);
    }));
    EXPECT_TRUE(WIFSIGNALED(nStatus));
    becomeReally(UID_NOBODY);
    const Json::ArrayIndex nHalfChange = tokensWith99Uses();
    becomeReally(0);
    EXPECT_LT(100U, nHalfChange); // read from a change that was never committed
    EXPECT_GT(300U, nHalfChange);
    EXPECT_EQ(0U, tokensWith99Uses()); // the journal was rolled back
    figure("hot journal", std::to_string(nHalfChange) + " of 300 tokens read from a change that never was");
}
