#include "ProcessState.h"

#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>
#include <filesystem>
#include <set>

namespace {

char g_szLog[1 << 16];
size_t g_cchLog = 0;

mode_t currentUmask()
{
    const mode_t mode = ::umask(0);
    ::umask(mode);
    return mode;
}

std::string blockedSignals()
{
    sigset_t blocked;
    sigprocmask(SIG_SETMASK, nullptr, &blocked);
    std::string strBlocked;
    for (int nSignal = 1; nSignal < NSIG; ++nSignal) {
        strBlocked.append(1 == sigismember(&blocked, nSignal) ? "1" : "0");
    }
    return strBlocked;
}

// The open descriptors, each with the file that it refers to.
std::string openDescriptors()
{
    std::set<std::string> descriptors;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
        std::error_code ignored; // that of the iteration itself is gone already
        const std::string strTarget = std::filesystem::read_symlink(entry.path(), ignored);
        if (0 != strTarget.compare(0, 6, "/proc/")) {
            descriptors.insert(entry.path().filename().string() + "=" + strTarget);
        }
    }
    std::string strDescriptors;
    for (const std::string& strDescriptor : descriptors) {
        strDescriptors.append(strDescriptor).append(" ");
    }
    return strDescriptors;
}

template <typename Value>
std::string difference(const char* szName, const Value& before, const Value& after)
{
    return before == after ? "" : std::string(szName) + " changed; ";
}

} // namespace

ProcessState ProcessState::now()
{
    return {geteuid(), currentUmask(), std::filesystem::current_path().string(), blockedSignals(),
            openDescriptors()};
}

std::string ProcessState::differenceTo(const ProcessState& other) const
{
    return difference("effective uid", uidEffective, other.uidEffective) +
           difference("umask", umask, other.umask) +
           difference("working directory", strDirectory, other.strDirectory) +
           difference("signal mask", strBlockedSignals, other.strBlockedSignals) +
           difference("open descriptors", strDescriptors, other.strDescriptors);
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
