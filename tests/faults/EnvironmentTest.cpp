// What operations do in a bad environment: one row for each environment.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "AccessTokenApi.h"
#include "Oracle.h"
#include "ProcessState.h"
#include "Processes.h"
#include "ShortWaits.h"

namespace {

namespace fs = std::filesystem;

// Enters an environment, and returns how to leave it.
typedef std::function<void()> Leave;
typedef std::function<Leave(const TokenStore&)> Environment;

// Thrown when this machine or user cannot provide an environment.
struct Unavailable : std::runtime_error {
    using std::runtime_error::runtime_error;
};

const uid_t UID_NOBODY = 65534;
const uid_t UID_ORDINARY = 0 == getuid() ? UID_NOBODY : getuid(); // not root

void provide(bool blSucceeded, const char* szWhat)
{
    if (!blSucceeded) {
        throw Unavailable(std::string("cannot ") + szWhat + ": " + strerror(errno));
    }
}

// By the system call: the redirection has replaced seteuid().
void becomeReally(uid_t uid)
{
    provide(0 == syscall(SYS_setresuid, -1, uid, -1), "change the user");
}

// Sets the owner and the modes of the directory and of the database, if there is one.
void giveTo(uid_t uid, const TokenStore& store, mode_t modeDirectory, mode_t modeFile)
{
    for (const auto& [strPath, mode] :
         {std::pair(store.path(), modeFile), {store.directory(), modeDirectory}}) {
        if (fs::exists(strPath)) {
            provide(0 == chmod(strPath.c_str(), mode) &&
                        0 == chown(strPath.c_str(), uid, static_cast<gid_t>(-1)),
                    "give a file away");
        }
    }
}

void shell(const std::string& strCommand)
{
    EXPECT_EQ(0, system(strCommand.c_str())) << strCommand;
}

// Sets a limit, and returns how to restore it.
Leave limit(__rlimit_resource resource, rlim_t nLimit)
{
    struct rlimit before = {};
    getrlimit(resource, &before);
    const struct rlimit limit = {nLimit, before.rlim_max};
    EXPECT_EQ(0, setrlimit(resource, &limit));
    return [=] { setrlimit(resource, &before); };
}

// A umask, which the library must leave as it is.
Environment umaskOf(mode_t mode)
{
    return [=](const TokenStore&) -> Leave {
        const mode_t before = umask(mode);
        return [=] { EXPECT_EQ(mode, umask(before)); };
    };
}

// What a command makes is in the place of the private directory.
Environment directoryIs(const std::string& strCommand)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strPath = store.directory() + "/directory";
        shell(strCommand + " '" + strPath + "'");
        setenv("VEMO_REDIRECT_DIR", strPath.c_str(), 1);
        return [&store] { setenv("VEMO_REDIRECT_DIR", store.directory().c_str(), 1); };
    };
}

// What a command makes is in the place of the database, and must still be there afterwards. The database, if
// there was one, is renamed to "aside".
Environment databaseIs(const std::string& strCommand)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strPath = store.path();
        const std::string strAside = store.directory() + "/aside";
        std::error_code missing;
        fs::rename(strPath, strAside, missing);
        shell(strCommand + " '" + strPath + "'");
        const fs::file_type type = fs::symlink_status(strPath).type();
        return [=] {
            EXPECT_EQ(type, fs::symlink_status(strPath).type());
            fs::remove(strPath);
            if (!missing) {
                fs::rename(strAside, strPath);
            }
        };
    };
}

// The directory and the database belong to the user who makes the call, and have these modes.
Environment modes(uid_t uid, mode_t modeDirectory, mode_t modeFile)
{
    return [=](const TokenStore& store) -> Leave {
        giveTo(uid, store, modeDirectory, modeFile);
        becomeReally(uid);
        if (std::error_code ignored; !fs::exists(store.directory(), ignored)) {
            becomeReally(getuid());
            throw Unavailable("another user cannot reach " + store.directory());
        }
        return [&store] {
            becomeReally(getuid());
            giveTo(getuid(), store, 0700, 0600);
        };
    };
}

// Some of the descriptors 0 to 2 are closed. SQLite opens /dev/null in their places.
Environment closedDescriptors(const std::vector<int>& descriptors)
{
    return [=](const TokenStore&) -> Leave {
        std::vector<int> kept;
        for (const int nDescriptor : descriptors) {
            kept.push_back(fcntl(nDescriptor, F_DUPFD_CLOEXEC, 3));
            close(nDescriptor);
        }
        return [=] {
            for (size_t i = descriptors.size(); 0 < i--;) {
                const fs::path target = fs::read_symlink("/proc/self/fd/" + std::to_string(descriptors[i]));
                dup2(kept[i], descriptors[i]);
                close(kept[i]);
                EXPECT_EQ("/dev/null", target);
            }
        };
    };
}

// Only nFree descriptors are free.
Environment freeDescriptors(int nFree)
{
    return [=](const TokenStore&) -> Leave {
        int nLimit = 0;
        for (int nFound = 0; nFound < nFree; ++nLimit) {
            nFound += -1 == fcntl(nLimit, F_GETFD) ? 1 : 0;
        }
        return limit(RLIMIT_NOFILE, static_cast<rlim_t>(nLimit));
    };
}

// Files cannot grow beyond cbMax, and the signal for that is ignored.
Environment fileSizeLimit(rlim_t cbMax)
{
    return [=](const TokenStore&) -> Leave {
        signal(SIGXFSZ, SIG_IGN);
        return limit(RLIMIT_FSIZE, cbMax);
    };
}

// Another process holds a lock on the database and is stopped (SIGSTOP). Once continued, it succeeds.
Environment stoppedHolder(const char* szSql)
{
    return [=](const TokenStore& store) -> Leave {
        const pid_t pid = startProcess([&] {
            const Database pDb = store.open();
            run(pDb, szSql);
            raise(SIGSTOP);
            run(pDb, "COMMIT");
        });
        int nStatus = 0;
        EXPECT_EQ(pid, waitpid(pid, &nStatus, WUNTRACED));
        EXPECT_TRUE(WIFSTOPPED(nStatus));
        return [=] {
            kill(pid, SIGCONT);
            EXPECT_TRUE(endsWell(pid));
        };
    };
}

// Mounts a small file system on the directory of the store. Only this process sees it.
void mountSmallFileSystem(const TokenStore& store)
{
    provide(0 == unshare(CLONE_NEWNS) && 0 == mount(nullptr, "/", "", MS_REC | MS_PRIVATE, nullptr) &&
                0 == mount("tmpfs", store.directory().c_str(), "tmpfs", 0, "size=256k,mode=0700"),
            "mount a file system that nobody else sees");
}

// The file system has only cbFree bytes left.
Environment fullFileSystem(size_t cbFree)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strFiller = store.directory() + "/filler";
        shell("cat /dev/zero 2>&- >'" + strFiller + "'; truncate -s -" + std::to_string(cbFree) + " '" +
              strFiller + "'");
        return [=] { fs::remove(strFiller); };
    };
}

Environment readOnlyFileSystem()
{
    return [=](const TokenStore& store) -> Leave {
        const auto remount = [&store](unsigned long nFlags) {
            EXPECT_EQ(0, mount(nullptr, store.directory().c_str(), "", MS_REMOUNT | nFlags, nullptr));
        };
        remount(MS_RDONLY);
        return [=] { remount(0); };
    };
}

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
    {"OrdinaryUser", modes(UID_ORDINARY, 0700, 0600), DONE_FIRST, DONE, DONE},
    {"ReadOnlyDirectory", modes(UID_ORDINARY, 0500, 0600), noTouch("Permission denied"), refused(READ_ONLY),
     DONE},
    {"ReadOnlyDatabase", modes(UID_ORDINARY, 0700, 0400), "", refused(READ_ONLY), DONE},
    {"UnreadableDatabase", modes(UID_ORDINARY, 0700, 0), "", noOpen("14"), noOpen("14")},
    {"ReadOnlyForRoot", modes(0, 0500, 0400), DONE_FIRST, DONE, DONE, Needs::Root},

    {"NoStandardInput", closedDescriptors({0}), DONE_FIRST, DONE, DONE},
    {"NoStandardOutput", closedDescriptors({1}), DONE_FIRST, DONE, DONE},
    {"NoStandardError", closedDescriptors({2}), DONE_FIRST, DONE, DONE},
    {"NoStandardStreams", closedDescriptors({0, 1, 2}), DONE_FIRST, DONE, DONE},

    // The database needs one descriptor and its journal another. The third, for the directory, is not
    // necessary.
    {"NoDescriptor", freeDescriptors(0), noTouch("Too many open files"), noOpen("14"), noOpen("14")},
    {"OneDescriptor", freeDescriptors(1), noTable(NO_JOURNAL), refused(NO_JOURNAL), DONE},
    {"TwoDescriptors", freeDescriptors(2), DONE_FIRST, DONE, DONE},

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
    prepareStore(store, operation);
    const bool blUnchanged = strAfter == store.state();
    return blUnchanged && blWorksAgain                   ? "refused"
           : STATE_NO_TABLE == strAfter && !blWorksAgain ? "leaves no table"
                                                         : "fails in another way";
}

// Runs an operation in an environment, and lets the oracle judge it. Returns
// - "done": it succeeded
// - "refused: WHY": it failed, the store is unchanged, and the next call works. WHY is its first log line.
// - "leaves no table: WHY": it failed and left a file without the table, so the next call fails too
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
        if (Needs::FileSystem == row.needs) {
            mountSmallFileSystem(store);
        }
        for (const Operation& operation : operations()) {
            SCOPED_TRACE(operation.szName);
            const std::string& strExpected = expectedOf(row, operation);
            if (!strExpected.empty()) {
                EXPECT_EQ(strExpected, outcomeOf(store, operation, row.enter));
            }
        }
        umount2(store.directory().c_str(), MNT_DETACH); // fails if nothing is mounted there
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
}
