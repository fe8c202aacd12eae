// What operations give where the environment is not as it should be: a row for each environment.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <functional>
#include <memory>
#include <optional>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "EnvironmentOutcome.h"
#include "Environments.h"

namespace {

// An environment, until it is released. Nothing virtual here: where there are no descriptors,
// UndefinedBehaviorSanitizer cannot look at objects and takes them for broken.
typedef std::unique_ptr<void, void (*)(void*)> Stay;
typedef std::function<Stay(const TokenStore&)> Entry;

template <typename Environment, typename... Arguments>
Entry in(Arguments... arguments)
{
    return [=](const TokenStore& store) {
        return Stay(new Environment(store, arguments...),
                    [](void* pEnvironment) { delete static_cast<Environment*>(pEnvironment); });
    };
}

enum class Needs { Nothing, Root, FileSystem };

// The outcomes of a first creation, of the operations that change a store, and of a listing. They are the
// words of EnvironmentOutcome.h; a first creation without any does not meet the environment.
struct Row {
    const char* szName;
    Entry enter;
    std::string strFirst;
    std::string strChange;
    std::string strListing;
    Needs needs = Needs::Nothing;
};

// For the messages of GoogleTest.
void PrintTo(const Row& row, std::ostream* pStream)
{
    *pStream << row.szName;
}

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

Row everywhere(const char* szName, const Entry& enter, const std::string& strOutcome)
{
    return {szName, enter, strOutcome, strOutcome, strOutcome};
}

const std::vector<Row> ROWS = {
    {"Umask0", in<Umask>(0U), DONE_FIRST, DONE, DONE},
    {"Umask022", in<Umask>(022U), DONE_FIRST, DONE, DONE},
    {"Umask077", in<Umask>(077U), DONE_FIRST, DONE, DONE},
    {"Umask0777", in<Umask>(0777U), DONE_FIRST, DONE, DONE},

    everywhere("NoDirectory", in<DirectoryIs>(Thing::Nothing), noTouch("No such file or directory")),
    everywhere("FileAsDirectory", in<DirectoryIs>(Thing::EmptyFile), noTouch("Not a directory")),
    everywhere("DanglingLinkAsDirectory", in<DirectoryIs>(Thing::DanglingLink),
               noTouch("No such file or directory")),
    {"LinkAsDirectory", in<DirectoryIs>(Thing::Link), DONE_FIRST, DONE, DONE},

    // A file that is there is never given the table, and a directory in its place costs the effective uid.
    everywhere("EmptyDatabase", in<DatabaseIs>(Thing::EmptyFile), refused(NO_TABLE)),
    everywhere("DirectoryAsDatabase", in<DatabaseIs>(Thing::Directory), noOpen("14")),
    everywhere("FifoAsDatabase", in<DatabaseIs>(Thing::Fifo), noOpen("10")),
    everywhere("DanglingLinkAsDatabase", in<DatabaseIs>(Thing::DanglingLink),
               noTouch("No such file or directory")),
    {"LinkAsDatabase", in<DatabaseIs>(Thing::Link), "", DONE, DONE},

    // Without root, modes bind.
    {"OrdinaryUser", in<Modes>(User::Other, 0700U, 0600U), DONE_FIRST, DONE, DONE},
    {"ReadOnlyDirectory", in<Modes>(User::Other, 0500U, 0600U), noTouch("Permission denied"),
     refused(READ_ONLY), DONE},
    {"ReadOnlyDatabase", in<Modes>(User::Other, 0700U, 0400U), "", refused(READ_ONLY), DONE},
    {"UnreadableDatabase", in<Modes>(User::Other, 0700U, 0U), "", noOpen("14"), noOpen("14")},
    {"ReadOnlyForRoot", in<Modes>(User::Same, 0500U, 0400U), DONE_FIRST, DONE, DONE, Needs::Root},

    {"NoStandardInput", in<ClosedDescriptors>(std::vector<int>{0}), DONE_FIRST, DONE, DONE},
    {"NoStandardOutput", in<ClosedDescriptors>(std::vector<int>{1}), DONE_FIRST, DONE, DONE},
    {"NoStandardError", in<ClosedDescriptors>(std::vector<int>{2}), DONE_FIRST, DONE, DONE},
    {"NoStandardStreams", in<ClosedDescriptors>(std::vector<int>{0, 1, 2}), DONE_FIRST, DONE, DONE},

    // The database takes one descriptor, its journal another. A third would be for the directory, and is not
    // missed.
    {"NoDescriptor", in<FreeDescriptors>(0U), noTouch("Too many open files"), noOpen("14"), noOpen("14")},
    {"OneDescriptor", in<FreeDescriptors>(1U), noTable(NO_JOURNAL), refused(NO_JOURNAL), DONE},
    {"TwoDescriptors", in<FreeDescriptors>(2U), DONE_FIRST, DONE, DONE},

    {"NoFileMayGrow", in<FileSizeLimit>(0U), noTable(IO_ERROR), refused(IO_ERROR), DONE},
    {"FilesOfTwoPages", in<FileSizeLimit>(8192U), noTable(IO_ERROR), refused(IO_ERROR), DONE},
    {"FilesOfFourPages", in<FileSizeLimit>(16384U), DONE_FIRST, refused(IO_ERROR), DONE},

    {"StoppedWriter", in<StoppedHolder>("BEGIN EXCLUSIVE"), "", refused(LOCKED), refused(LOCKED)},
    {"StoppedBeforeItWrites", in<StoppedHolder>("BEGIN IMMEDIATE"), "", refused(LOCKED), DONE},
    {"StoppedReader", in<StoppedHolder>("BEGIN; SELECT * FROM token"), "", refused(LOCKED), DONE},

    {"FullFileSystem", in<FullFileSystem>(0U), noTable(FULL), refused(FULL), DONE, Needs::FileSystem},
    {"NearlyFullFileSystem", in<FullFileSystem>(8192U), noTable(FULL), refused(FULL), DONE,
     Needs::FileSystem},
    {"ReadOnlyFileSystem", in<ReadOnlyFileSystem>(), noTouch("Read-only file system"), refused(READ_ONLY),
     DONE, Needs::FileSystem},
};

const std::string& expectedOf(const Row& row, const Operation& operation)
{
    return operation.blCreatesStore                   ? row.strFirst
           : 0 == strcmp("listing", operation.szName) ? row.strListing
                                                      : row.strChange;
}

void expectOutcomes(const TokenStore& store, const Row& row)
{
    for (const Operation& operation : operations()) {
        SCOPED_TRACE(operation.szName);
        const std::string& strExpected = expectedOf(row, operation);
        Stay stay(nullptr, [](void*) {});
        if (!strExpected.empty()) {
            EXPECT_EQ(strExpected,
                      outcomeOf(
                          store, operation, [&] { stay = row.enter(store); }, [&] { stay.reset(); }));
        }
    }
}

// The wait status of a child process, which exits with 1 when an expectation fails in it.
int statusOfChild(const std::function<void()>& run)
{
    const pid_t nProcess = fork();
    if (0 == nProcess) {
        run();
        _exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int nStatus = -1;
    EXPECT_EQ(nProcess, waitpid(nProcess, &nStatus, 0));
    return nStatus;
}

class Environment : public ::testing::TestWithParam<Row> {};

} // namespace

TEST_P(Environment, HasItsOutcomeForEachOperation)
{
    const Row& row = GetParam();
    if (Needs::Root == row.needs && 0 != getuid()) {
        GTEST_SKIP() << "needs root, whom modes do not bind";
    }
    try {
        const TokenStore store;
        std::optional<SmallFileSystem> fileSystem;
        if (Needs::FileSystem == row.needs) {
            fileSystem.emplace(store);
        }
        expectOutcomes(store, row);
    } catch (const Unavailable& unavailable) {
        GTEST_SKIP() << unavailable.what();
    }
}

INSTANTIATE_TEST_SUITE_P(In, Environment, ::testing::ValuesIn(ROWS),
                         [](const auto& instance) { return instance.param.szName; });

// The signal that tells of the limit kills a process that does not ignore it; what it was writing is undone.
TEST(FileSizeSignal, EndsTheProcessAndLeavesTheStoreAsItWas)
{
    const TokenStore store;
    const Operation& operation = operationNamed("update");
    for (const rlim_t cbMax : {0U, 8192U, 16384U}) {
        SCOPED_TRACE(cbMax);
        prepareStore(store, operation);
        const std::string strBefore = store.state();
        const int nStatus = statusOfChild([&] {
            const struct rlimit noCore = {};
            setrlimit(RLIMIT_CORE, &noCore);
            const FileSizeLimit limit(store, cbMax);
            signal(SIGXFSZ, SIG_DFL);
            operation.run();
        });
        EXPECT_TRUE(WIFSIGNALED(nStatus));
        EXPECT_EQ(SIGXFSZ, WTERMSIG(nStatus));
        EXPECT_EQ(strBefore, store.state());
    }
}

// Were the database to become the standard output, the log would be written into it.
TEST(ClosedStandardStreams, KeepLogLinesOutOfTheDatabase)
{
    const TokenStore store;
    const Operation& operation = operationNamed("creation under a given id");
    const int nStatus = statusOfChild([&] {
        VEMO_ACCESS_TOKEN::logToStdout(true);
        setvbuf(stdout, nullptr, _IONBF, 0);
        const ClosedDescriptors closed(store, {0, 1, 2});
        const AccessTokenApi api; // creates the store, and keeps it open
        EXPECT_EQ(0, operation.run());
        EXPECT_EQ(-1, operation.run()); // logs why
    });
    EXPECT_EQ(0, nStatus);
    EXPECT_EQ(1U, store.files().size());
    EXPECT_EQ(std::string::npos, store.files().begin()->second.find("Failed ["));
    EXPECT_EQ(0U, store.state().find("known-given|")) << store.state();
}
