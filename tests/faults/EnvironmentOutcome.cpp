#include "EnvironmentOutcome.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <stdexcept>

#include "Oracle.h"
#include "ProcessState.h"

namespace {

int (*g_pRun)() = nullptr;
int g_nResult = 0;
int g_nWaits = 0;

int runAndRemember()
{
    g_nResult = -1;
    return g_nResult = g_pRun();
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

// How the operation ended, judged by the store and by the next call, which nothing disturbs.
std::string endOf(const TokenStore& store, const Operation& operation)
{
    if (0 <= g_nResult) {
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

} // namespace

// Nobody waits for a lock here, but the waits are counted.
extern "C" int usleep(useconds_t)
{
    ++g_nWaits;
    return 0;
}

std::string firstLine(const std::string& strLog)
{
    std::string strLine = strLog.substr(0, strLog.find('\n'));
    strLine.erase(0, strLine.find(' ') + 1);
    while ('(' == strLine[0]) {
        strLine.erase(0, strLine.find(')') + 1);
    }
    return strLine.substr(0, strLine.find(", sql="));
}

std::string outcomeOf(const TokenStore& store, const Operation& operation, const std::function<void()>& arm,
                      const std::function<void()>& disarm)
{
    g_pRun = operation.run;
    Operation watched = operation;
    watched.run = &runAndRemember;
    const Oracle oracle(store, watched);

    std::string strModeBefore;
    std::string strMode;
    const std::string strWrong = oracle.judge(
        [&] {
            arm();
            strModeBefore = modeOf(store.path());
            g_nWaits = 0;
        },
        [&] {
            strMode = modeOf(store.path());
            disarm();
        });

    std::string strDetails;
    if (strMode != strModeBefore) {
        strDetails += strMode;
    }
    if (0 > g_nResult) {
        strDetails += ": " + firstLine(Log::text());
    }
    if (0 < g_nWaits) {
        strDetails += ", " + std::to_string(g_nWaits / (operation.blPurges ? 2 : 1)) + " waits";
    }
    if (!strWrong.empty()) {
        strDetails += "; WRONG: " + strWrong;
    }
    return endOf(store, operation) + strDetails;
}

const Operation& operationNamed(const char* szName)
{
    for (const Operation& operation : operations()) {
        if (std::string(szName) == operation.szName) {
            return operation;
        }
    }
    throw std::logic_error(std::string("no operation ") + szName);
}
