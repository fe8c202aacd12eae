// What CallLock promises: to threads, to forked children, when a signal comes and when a holder is killed.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <deque>
#include <filesystem>
#include <optional>
#include <random>
#include <thread>
#include <vector>

#include "AccessTokenUtil.h"
#include "CallLock.h"
#include "Figures.h"
#include "Interpose.h"
#include "ProcessState.h"
#include "Processes.h"
#include "StormCalls.h"

namespace {

namespace fs = std::filesystem;

// The errno with which the next calls of flock() and fstat() fail; 0 makes the real call. When the list is
// empty, all calls are real.
std::deque<int> g_rgErrors;
std::atomic<int> g_nLocks(0); // calls of flock()

bool isAnswered()
{
    if (g_rgErrors.empty()) {
        return false;
    }
    errno = g_rgErrors.front();
    g_rgErrors.pop_front();
    return 0 != errno;
}

} // namespace

extern "C" int flock(int nFile, int nOperation) noexcept
{
    ++g_nLocks;
    return isAnswered() ? -1 : static_cast<int>(syscall(SYS_flock, nFile, nOperation));
}

extern "C" int fstat(int nFile, struct stat* pStatus) noexcept
{
    return isAnswered() ? -1 : NEXT(fstat)(nFile, pStatus);
}

namespace {

class SerialisingLock : public ::testing::Test {
protected:
    // Takes the lock of a file and releases it. Returns 0, or the errno of the failure.
    template <typename... Wait>
    static int lockOnce(const std::string& strFile, Wait... wait)
    {
        try {
            const CallLock lock(strFile.c_str(), wait...);
            return 0;
        } catch (const std::system_error& error) {
            return error.code().value();
        }
    }

    bool isHeld() const { return ETIMEDOUT == lockOnce(m_strFile, std::chrono::milliseconds(0)); }

    const StormCalls m_calls{Calls::Serialised};
    const std::string m_strFile = m_calls.lockFile();
};

} // namespace

TEST_F(SerialisingLock, GrantsToThreadsExactly)
{
    const int nUses = static_cast<int>(scaled(50));
    const unsigned int nThreads = 4;
    m_calls.prepare({{"shared", nUses}});
    VEMO_ACCESS_TOKEN::tokenType(); // filled without a lock, so before the threads start

    std::atomic<int> nGranted(0);
    std::vector<std::thread> threads;
    for (unsigned int nThread = 0; nThread < nThreads; ++nThread) {
        threads.emplace_back([&] {
            for (int i = 0; i < nUses; ++i) {
                nGranted += 0 == m_calls.grant("shared");
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(nUses, nGranted);
    EXPECT_EQ(Tokens(), m_calls.tokens());
}

// Wherever a process is killed, the others' calls succeed: the kernel releases its lock, and the next call
// undoes the change that it has not finished.
TEST_F(SerialisingLock, GoesOnWhenAHolderIsKilled)
{
    const int nKills = static_cast<int>(scaled(50));
    std::mt19937_64 random(seed());
    m_calls.prepare({{"shared", 1000000}});
    for (int nKill = 0; nKill < nKills; ++nKill) {
        const pid_t pid = startProcess([&] {
            for (;;) {
                m_calls.grant("shared");
            }
        });
        for (uint64_t nLeft = random() % 8; 0 < nLeft; --nLeft) {
            EXPECT_EQ(0, m_calls.grant("shared"));
        }
        EXPECT_EQ(0, kill(pid, SIGKILL));
        EXPECT_FALSE(endsWell(pid));
        EXPECT_EQ(0, m_calls.grant("shared"));
    }
    EXPECT_EQ(1U, m_calls.tokens().size());
}

// A child that is forked meanwhile has the descriptor too. It neither releases nor keeps the lock.
TEST_F(SerialisingLock, BelongsToItsMakerAlone)
{
    std::optional<CallLock> lock(std::in_place, m_strFile.c_str());
    EXPECT_TRUE(endsWell(startProcess([] {})));
    EXPECT_TRUE(isHeld());

    const pid_t pid = startProcess([] { pause(); });
    lock.reset();
    EXPECT_FALSE(isHeld());
    kill(pid, SIGKILL);
    EXPECT_FALSE(endsWell(pid));
}

TEST_F(SerialisingLock, MakesAPrivateFileAndFollowsNoLink)
{
    const std::string strBefore = processState();
    EXPECT_EQ(0, lockOnce(m_strFile));
    EXPECT_EQ(fs::perms(0600), fs::status(m_strFile).permissions());
    EXPECT_EQ(strBefore, processState());
    const std::string strLink = m_strFile + ".link";
    fs::create_symlink(m_strFile, strLink);
    EXPECT_EQ(ELOOP, lockOnce(strLink));
    EXPECT_EQ(ENOENT, lockOnce(m_strFile + ".missing/lock"));
}

TEST_F(SerialisingLock, ReportsWhyItCannotBeTakenAndLeavesNothingOpen)
{
    const struct {
        std::deque<int> rgErrors; // of fstat(), and then of flock()
        int nExpected;
    } rows[] = {{{EIO}, EIO}, {{0, EIO}, EIO}, {{0, EINTR, EINTR}, 0}, {{0, EINTR, ENOLCK}, ENOLCK}};
    const std::string strBefore = processState();
    for (const auto& row : rows) {
        g_rgErrors = row.rgErrors;
        EXPECT_EQ(row.nExpected, lockOnce(m_strFile));
        g_rgErrors = row.rgErrors;
        EXPECT_EQ(row.nExpected, lockOnce(m_strFile, std::chrono::milliseconds(0)));
    }
    EXPECT_EQ(strBefore, processState());
}

// A process may have no standard input; the lock file then gets its descriptor. A program that the process
// starts does not keep it.
TEST_F(SerialisingLock, MayHaveTheFirstDescriptor)
{
    close(STDIN_FILENO);
    errno = EBADF;
    {
        const CallLock lock(m_strFile.c_str());
        EXPECT_EQ(FD_CLOEXEC, fcntl(STDIN_FILENO, F_GETFD));
    }
    EXPECT_EQ(STDIN_FILENO, open("/dev/null", O_RDONLY));
}

// Other users could hold a lock forever on a file that they can open.
TEST_F(SerialisingLock, RefusesAFileThatIsNotItsOwnersAlone)
{
    EXPECT_EQ(0, lockOnce(m_strFile));
    for (const int nMode : {0644, 0620, 0604, 0601}) {
        fs::permissions(m_strFile, fs::perms(nMode));
        EXPECT_EQ(EPERM, lockOnce(m_strFile));
    }
    fs::permissions(m_strFile, fs::perms(0700));
    EXPECT_EQ(0, lockOnce(m_strFile));
    if (0 == getuid() && 0 == chown(m_strFile.c_str(), 1, 1)) {
        EXPECT_EQ(EPERM, lockOnce(m_strFile));
    }
    fs::remove(m_strFile);
    ASSERT_EQ(0, mkfifo(m_strFile.c_str(), 0600));
    EXPECT_EQ(EPERM, lockOnce(m_strFile));
}

TEST_F(SerialisingLock, WaitsNoLongerThanItIsAskedTo)
{
    typedef std::chrono::steady_clock Clock;
    std::optional<CallLock> lock(std::in_place, m_strFile.c_str());
    for (const auto& [nWait, nTries] : {std::pair(0, 1), {1, 2}, {30, 4}}) {
        const std::chrono::milliseconds wait(nWait);
        const auto start = Clock::now();
        g_nLocks = 0;
        EXPECT_EQ(ETIMEDOUT, lockOnce(m_strFile, wait));
        EXPECT_LE(wait, Clock::now() - start);
        EXPECT_EQ(nTries, g_nLocks);
    }
    lock.reset();
    EXPECT_EQ(0, lockOnce(m_strFile, std::chrono::milliseconds(0)));
}
