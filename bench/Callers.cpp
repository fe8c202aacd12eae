#include "Callers.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <optional>
#include <stdexcept>

#include "AccessTokenUtil.h"
#include "CallLock.h"
#include "Interpose.h"
#include "Processes.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

const size_t CALLS_MAX = 200000; // of one process: many more than it has time for

// How often this process has written a token. A grant that increases it has spent a use.
long long g_nWritten = 0;

struct GrantCall {
    double dStart; // seconds on the clock that all processes share
    double dEnd;
    bool blGranted;
    bool blSpent;
};

double now()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

GrantCall timedGrant(int nToken, Calls calls)
{
    std::string strTid = tokenOf(nToken).strTid;
    Json::Value jToken;
    const long long nWritten = g_nWritten;
    GrantCall call = {now(), 0, false, false};
    {
        std::optional<CallLock> lock;
        if (Calls::Serialised == calls) {
            lock.emplace();
        }
        call.blGranted = 0 == VemoAccessTokenGrantEx(strTid, WEBAPI, METHOD, jToken);
    }
    call.dEnd = now();
    call.blSpent = nWritten != g_nWritten;
    return call;
}

} // namespace

// The library calls this function, which counts the writes.
extern "C" INTERPOSED int sqlite3_exec(sqlite3* pDb, const char* szSql,
                                       int (*callback)(void*, int, char**, char**), void* arg, char** pszErr)
{
    const int nResult = NEXT(sqlite3_exec)(pDb, szSql, callback, arg, pszErr);
    g_nWritten += SQLITE_OK == nResult && 0 == strncmp(szSql, "REPLACE", strlen("REPLACE"));
    return nResult;
}

CallsMade grantAtOnce(int nProcesses, int nTokens, double dSeconds, Calls calls)
{
    const auto nSize = static_cast<size_t>(nProcesses);
    SharedArray<GrantCall> all(nSize * CALLS_MAX);
    SharedArray<size_t> numbers(nSize);
    const int nBad = runProcesses(nProcesses, [&](int nProcess) {
        const auto nFirst = static_cast<size_t>(nProcess);
        const double dEnd = now() + dSeconds;
        // Failures are counted; log lines about them would only fill the system log.
        VEMO_ACCESS_TOKEN::logToStdout(true);
        dup2(open("/dev/null", O_WRONLY), STDOUT_FILENO);
        for (int nToken = nProcess % nTokens; now() < dEnd; nToken = (nToken + nProcesses) % nTokens) {
            if (CALLS_MAX == numbers[nFirst]) {
                throw std::logic_error("too many calls");
            }
            all[nFirst * CALLS_MAX + numbers[nFirst]++] = timedGrant(nToken, calls);
        }
    });
    if (0 != nBad) {
        throw std::runtime_error("a process failed");
    }
    CallsMade made;
    double dGranted = 0;
    double dStart = now();
    double dEnd = 0;
    for (size_t nProcess = 0; nProcess < nSize; ++nProcess) {
        for (size_t nCall = 0; nCall < numbers[nProcess]; ++nCall) {
            const GrantCall& call = all[nProcess * CALLS_MAX + nCall];
            if (call.blGranted && !call.blSpent) {
                throw std::runtime_error("a grant spent no use");
            }
            dStart = std::min(dStart, call.dStart);
            dEnd = std::max(dEnd, call.dEnd);
            dGranted += call.blGranted;
            made.took.add((call.dEnd - call.dStart) * 1e6);
            ++made.dAll;
            made.dSpent += call.blSpent;
            made.dFailed += !call.blGranted && !call.blSpent;
            made.dFalse += !call.blGranted && call.blSpent;
        }
    }
    made.dGrantsPerSecond = dGranted / (dEnd - dStart);
    return made;
}
