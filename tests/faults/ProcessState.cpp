#include "ProcessState.h"

#include <syslog.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <set>

namespace {

char g_szLog[1 << 16];
size_t g_cchLog = 0;

} // namespace

std::string processState()
{
    std::set<std::string> parts = {std::filesystem::current_path()};
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
        std::error_code ignored; // the iteration's own descriptor is closed already
        const std::string strTarget = std::filesystem::read_symlink(entry.path(), ignored);
        if (0 != strTarget.compare(0, 6, "/proc/")) {
            parts.insert(entry.path().filename().string() + "=" + strTarget);
        }
    }
    std::ifstream status("/proc/thread-self/status");
    for (std::string strLine; std::getline(status, strLine);) {
        if (0 == strLine.find("Umask:") || 0 == strLine.find("SigBlk:")) {
            parts.insert(strLine);
        }
    }
    std::string strState;
    for (const std::string& strPart : parts) {
        strState.append(strPart).append(" ");
    }
    return strState;
}

void Log::clear()
{
    g_cchLog = 0;
    g_szLog[0] = '\0';
}

const char* Log::text()
{
    return g_szLog;
}

std::string Log::firstLine()
{
    const std::string strLog = text();
    std::string strLine = strLog.substr(0, strLog.find('\n'));
    strLine.erase(0, strLine.find(' ') + 1);
    while ('(' == strLine[0]) {
        strLine.erase(0, strLine.find(')') + 1);
    }
    return strLine.substr(0, strLine.find(", sql="));
}

extern "C" void vsyslog(int, const char* szFormat, va_list args)
{
    const int cch = vsnprintf(g_szLog + g_cchLog, sizeof(g_szLog) - g_cchLog, szFormat, args);
    g_cchLog = std::min(g_cchLog + static_cast<size_t>(std::max(cch, 0)), sizeof(g_szLog) - 1);
}

extern "C" void syslog(int nPriority, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    vsyslog(nPriority, szFormat, args);
    va_end(args);
}

// The hardened tool calls this one.
extern "C" void __syslog_chk(int nPriority, int, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    vsyslog(nPriority, szFormat, args);
    va_end(args);
}
