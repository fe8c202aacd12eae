// Processes that grant one shared token at the same time, each as fast as it can for three seconds.
//
// Plain calls meet in the database, where SQLite's locks and the library's retries decide. Serialised
// calls queue at a lock file first, and the wait is part of their time. Each benchmark reports
//
//   grants_per_second   calls that returned 0, over the time from the first call to the end of the last
//   median_us, p99_us   times of single calls, those that returned -1 included
//   failed              share of the calls that returned -1 and had no effect
//   false_failures      share of the calls that returned -1 although the use was spent
//   beyond_count        share of the spent uses that did not lower the stored count: overlapping calls
//                       had read the same count, or wrote back an older one

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sqlite3.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "AccessTokenUtil.h"
#include "Interpose.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

const int TOKENS = 1000;
const long long USES = 100000000;
const int DURATION_SEC = 3;
const size_t CALLS_MAX = 1000000; // in one cell: far more than there is time for

// How often this process has written a token. A grant that raised it spent its use, whatever it returned.
long long g_nWritten = 0;

} // namespace

// Found ahead of SQLite's own, by the library too.
extern "C" INTERPOSED int sqlite3_exec(sqlite3* pDb, const char* szSql,
                                       int (*callback)(void*, int, char**, char**), void* arg, char** pszErr)
{
    const int nResult = NEXT(sqlite3_exec)(pDb, szSql, callback, arg, pszErr);
    if (SQLITE_OK == nResult && 0 == strncmp(szSql, "REPLACE", strlen("REPLACE"))) {
        ++g_nWritten;
    }
    return nResult;
}

namespace {

struct Cell {
    bool blWriteAheadLog;
    bool blSerialised;
    size_t nProcesses;
};

struct Call {
    double dStart; // seconds on the clock that all processes share
    double dEnd;
    bool blGranted;
    bool blSpent;
};

[[noreturn]] void fail(const char* szWhat)
{
    perror(szWhat);
    exit(1);
}

// The calls of all processes, in memory that they share.
class CallLog {
public:
    CallLog();
    ~CallLog() { munmap(m_pContent, sizeof(Content)); }
    CallLog(const CallLog&) = delete;
    CallLog& operator=(const CallLog&) = delete;

    // False when the log is full.
    bool add(const Call& call);

    // To be read when the processes have ended.
    const Call* begin() const { return m_pContent->rgCall; }
    const Call* end() const { return m_pContent->rgCall + m_pContent->nCalls; }

private:
    struct Content {
        std::atomic<size_t> nCalls{0};
        Call rgCall[CALLS_MAX];
    };

    Content* m_pContent;
};

CallLog::CallLog()
{
    void* pMemory = mmap(nullptr, sizeof(Content), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (MAP_FAILED == pMemory) {
        fail("mmap");
    }
    m_pContent = new (pMemory) Content;
}

bool CallLog::add(const Call& call)
{
    const size_t nIndex = m_pContent->nCalls++;
    if (CALLS_MAX <= nIndex) {
        return false;
    }
    m_pContent->rgCall[nIndex] = call;
    return true;
}

double now()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

// Failures are counted here; a line about each would only fill the system log.
void discardLogLines()
{
    VEMO_ACCESS_TOKEN::logToStdout(true);
    dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
}

int grant(std::string& strTid)
{
    Json::Value jToken;
    return VemoAccessTokenGrantEx(strTid, webapi(), method(), jToken);
}

int grantSerialised(std::string& strTid, int nLockFile)
{
    flock(nLockFile, LOCK_EX);
    const int nResult = grant(strTid);
    flock(nLockFile, LOCK_UN);
    return nResult;
}

Call timedGrant(std::string& strTid, bool blSerialised, int nLockFile)
{
    const long long nWritten = g_nWritten;
    Call call = {};
    call.dStart = now();
    call.blGranted = 0 == (blSerialised ? grantSerialised(strTid, nLockFile) : grant(strTid));
    call.dEnd = now();
    call.blSpent = nWritten != g_nWritten;
    return call;
}

// What a forked process does, from the end of file on nGate. Neither return, exit() nor an exception
// may take it to the parent's business, which includes the removal of the store.
[[noreturn]] void grantAndExit(const Cell& cell, const std::string& strLockFile, int nGate,
                               CallLog& log) noexcept
{
    std::string strTid = tokenOf(0).strTid;
    discardLogLines();
    // A lock belongs to an opening of the file, so each process needs its own.
    const int nLockFile = open(strLockFile.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    char cNone = 0;
    bool blGood = 0 <= nLockFile && 0 == read(nGate, &cNone, 1);
    const double dDeadline = now() + DURATION_SEC;
    while (blGood && now() < dDeadline) {
        blGood = log.add(timedGrant(strTid, cell.blSerialised, nLockFile));
    }
    _exit(blGood ? 0 : 1);
}

// Ends the program, and the processes ahead of it: they would miss their store.
[[noreturn]] void abandon(const std::vector<pid_t>& rgPid, const char* szWhy)
{
    for (const pid_t pid : rgPid) {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
    }
    fprintf(stderr, "%s\n", szWhy);
    exit(1);
}

std::vector<pid_t> startProcesses(const Cell& cell, const std::string& strLockFile, CallLog& log)
{
    // Its end of file comes when the parent and every process have closed the writing end; so none
    // starts before all are there, and none waits for a parent that died.
    int rgnGate[2];
    if (0 != pipe(rgnGate)) {
        fail("pipe");
    }
    std::vector<pid_t> rgPid;
    while (rgPid.size() < cell.nProcesses) {
        const pid_t pid = fork();
        if (0 == pid) {
            close(rgnGate[1]);
            grantAndExit(cell, strLockFile, rgnGate[0], log);
        } else if (0 > pid) {
            abandon(rgPid, "cannot fork");
        }
        rgPid.push_back(pid);
    }
    close(rgnGate[0]);
    close(rgnGate[1]);
    return rgPid;
}

sigset_t interruptions()
{
    sigset_t signals;
    sigemptyset(&signals);
    for (const int nSignal : {SIGHUP, SIGINT, SIGQUIT, SIGTERM}) {
        sigaddset(&signals, nSignal);
    }
    return signals;
}

// Returns whether all processes ended well. Interruptions are blocked everywhere else.
bool awaitProcesses(const std::vector<pid_t>& rgPid)
{
    const sigset_t signals = interruptions();
    const timespec duration = {DURATION_SEC, 0};
    if (0 < sigtimedwait(&signals, nullptr, &duration)) {
        abandon(rgPid, "interrupted");
    }
    bool blGood = true;
    for (const pid_t pid : rgPid) {
        int nStatus = 0;
        waitpid(pid, &nStatus, 0);
        blGood = blGood && 0 == nStatus;
    }
    return blGood;
}

// From the start of the first call to the end of the last.
double secondsOf(const CallLog& log)
{
    double dStart = log.begin()->dStart;
    double dEnd = log.begin()->dEnd;
    for (const Call& call : log) {
        dStart = std::min(dStart, call.dStart);
        dEnd = std::max(dEnd, call.dEnd);
    }
    return dEnd - dStart;
}

void report(benchmark::State& state, const CallLog& log, long long nLowered)
{
    Samples times;
    double dGranted = 0;
    double dSpent = 0;
    double dFailed = 0;
    double dFalse = 0;
    for (const Call& call : log) {
        if (call.blGranted && !call.blSpent) {
            state.SkipWithError("a grant spent no use");
            return;
        }
        times.add(call.dEnd - call.dStart);
        dGranted += call.blGranted;
        dSpent += call.blSpent;
        dFailed += !call.blGranted && !call.blSpent;
        dFalse += !call.blGranted && call.blSpent;
    }
    const double dCalls = static_cast<double>(log.end() - log.begin());
    state.counters["grants_per_second"] = dGranted / secondsOf(log);
    state.counters["median_us"] = times.percentile(50) * 1e6;
    state.counters["p99_us"] = times.percentile(99) * 1e6;
    state.counters["failed"] = dFailed / dCalls;
    state.counters["false_failures"] = dFalse / dCalls;
    state.counters["beyond_count"] = (dSpent - static_cast<double>(nLowered)) / dSpent;
}

void measure(benchmark::State& state, const Cell& cell, Store& store)
{
    store.grow(TOKENS);
    BareToken token = tokenOf(0);
    token.nCount = USES;
    BareEngine().save(token);
    if (cell.blWriteAheadLog) {
        store.useWriteAheadLog();
    }
    CallLog log;
    for (auto _ : state) {
        if (!awaitProcesses(startProcesses(cell, store.directory() + "/calls.lock", log))) {
            state.SkipWithError("a process failed");
            return;
        }
        state.SetIterationTime(secondsOf(log));
    }
    report(state, log, USES - BareEngine().read(token.strTid).nCount);
}

void contention(benchmark::State& state, const Cell& cell)
{
    static std::unique_ptr<Store> pStore; // static, so that exit() removes it
    pStore = std::make_unique<Store>(Place::Disk);
    measure(state, cell, *pStore);
    pStore.reset();
}

std::string nameOf(const Cell& cell)
{
    return std::string("Contention/") + (cell.blWriteAheadLog ? "wal/" : "rollback/") +
           (cell.blSerialised ? "serialised/" : "plain/") + std::to_string(cell.nProcesses);
}

} // namespace

int main(int argc, char** argv)
{
    const sigset_t signals = interruptions();
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    for (const bool blWriteAheadLog : {false, true}) {
        for (const bool blSerialised : {false, true}) {
            for (size_t nProcesses = 1; nProcesses <= 64; nProcesses *= 2) {
                const Cell cell = {blWriteAheadLog, blSerialised, nProcesses};
                benchmark::RegisterBenchmark(nameOf(cell).c_str(), contention, cell)
                    ->UseManualTime()
                    ->Unit(benchmark::kSecond)
                    ->Iterations(1);
            }
        }
    }
    return runBenchmarks(argc, argv);
}
