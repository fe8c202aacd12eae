#include "Callers.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <new>
#include <optional>
#include <vector>

#include "AccessTokenUtil.h"
#include "CallLock.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

typedef std::chrono::steady_clock Clock;

// In a process of its own, which ends without touching what is its parent's.
[[noreturn]] void call(int nFirst, int nStep, int nTokens, double dSeconds, bool blLock,
                       std::atomic<long>& nGranted)
{
    VEMO_ACCESS_TOKEN::logToStdout(true); // failures are counted; a line about each would only fill the log
    dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
    const auto end = Clock::now() + std::chrono::duration<double>(dSeconds);
    for (int nToken = nFirst; Clock::now() < end; nToken = (nToken + nStep) % nTokens) {
        std::string strTid = tokenOf(nToken).strTid;
        Json::Value jToken;
        std::optional<CallLock> lock;
        if (blLock) {
            lock.emplace();
        }
        nGranted += 0 == VemoAccessTokenGrantEx(strTid, webapi(), method(), jToken);
    }
    _exit(0);
}

} // namespace

double grantsPerSecond(int nProcesses, int nTokens, double dSeconds, bool blLock)
{
    void* pMemory =
        mmap(nullptr, sizeof(std::atomic<long>), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (MAP_FAILED == pMemory) {
        perror("mmap");
        exit(1);
    }
    auto& nGranted = *new (pMemory) std::atomic<long>(0);
    const auto start = Clock::now();
    std::vector<pid_t> pids;
    for (int i = 0; i < nProcesses; ++i) {
        const pid_t pid = fork();
        if (0 == pid) {
            call(i, nProcesses, nTokens, dSeconds, blLock, nGranted);
        }
        pids.push_back(pid);
    }
    for (const pid_t pid : pids) {
        waitpid(pid, nullptr, 0);
    }
    const double dTook = std::chrono::duration<double>(Clock::now() - start).count();
    const double dRate = static_cast<double>(nGranted) / dTook;
    munmap(pMemory, sizeof(nGranted));
    return dRate;
}
