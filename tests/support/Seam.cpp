#include "Seam.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <link.h>
#include <sys/random.h>
#include <sys/time.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <sstream>

#include "Interpose.h"
#include "internal/ErrnoKeeper.h"

using VEMO_ACCESS_TOKEN::ErrnoKeeper;

namespace {

bool isIn(const char* szLibrary, void* pCode)
{
    struct dl_find_object object;
    return 0 == _dl_find_object(pCode, &object) && strstr(object.dlfo_link_map->l_name, szLibrary);
}

// Records a call. Returns true and sets errno if this call must fail; otherwise leaves errno unchanged.
bool fails(const std::string& strName, const std::string& strArguments = "")
{
    const int nErrno = errno;
    seam().calls.push_back(strArguments.empty() ? strName : strName + " " + strArguments);
    const int nCall = ++seam().counts[strName];
    const auto failure = seam().failures.find(strName);
    const bool blFails =
        seam().failures.end() != failure && failure->second.nFirst <= nCall && nCall <= failure->second.nLast;
    errno = blFails ? failure->second.nErrno : nErrno;
    return blFails;
}

void record(const std::string& strName, const std::string& strArguments = "")
{
    fails(strName, strArguments);
}

// "util.cpp:123" becomes "util.cpp:#".
std::string withoutLineNumbers(std::string strText)
{
    const std::string strSuffix = ".cpp:";
    for (size_t nAt = 0; std::string::npos != (nAt = strText.find(strSuffix, nAt));) {
        nAt += strSuffix.size();
        strText.replace(nAt, strText.find_first_not_of("0123456789", nAt) - nAt, "#");
    }
    return strText;
}

// Records a log line. szFormat may contain "%m". A line in the system log must have its priority and, after
// its place, errno unless that is 0. These are left out, so that the line reads as on standard output.
void logged(const int* pnPriority, const char* szFormat, va_list args)
{
    const int nErrno = errno;
    char* szText = nullptr;
    if (0 > vasprintf(&szText, szFormat, args)) {
        throw std::bad_alloc();
    }
    std::string strLine = withoutLineNumbers(szText);
    free(szText);
    const size_t nMessage = strLine.find(' ') + 1;
    const std::string strErrno = pnPriority && 0 != nErrno ? std::string("(") + strerror(nErrno) + ")" : "";
    const bool blErrno = 0 == strLine.compare(nMessage, strErrno.size(), strErrno);
    strLine.erase(nMessage, blErrno ? strErrno.size() : 0);
    seam().lines.push_back(std::string(blErrno ? "" : "without errno: ") +
                           (pnPriority && LOG_ERR != *pnPriority ? "of another priority: " : "") + strLine);
    seam().blInSystemLog = pnPriority;
    errno = nErrno;
}

// A callback of the library. It must see errno as the library left it.
struct Receiver {
    SqlCallback callback;
    void* pArgument;
    int nErrno;

    static int call(void* pReceiver, int nColumns, char** szValues, char** szNames)
    {
        const Receiver& receiver = *static_cast<Receiver*>(pReceiver);
        errno = receiver.nErrno;
        return receiver.callback(receiver.pArgument, nColumns, szValues, szNames);
    }
};

template <typename Allocation>
void* withoutThrowing(Allocation allocation)
{
    try {
        return allocation();
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

} // namespace

// Whether the library calls the function that this is called from.
#define CALLED_BY_LIBRARY isIn("libvemoaccesstoken.so", __builtin_return_address(0))

Seam& seam()
{
    // Never destroyed, since the library is used until the very end of the process.
    static Seam& theSeam = *new Seam;
    return theSeam;
}

std::vector<std::string> Seam::callsOf(const std::vector<std::string>& names) const
{
    std::vector<std::string> found;
    for (const std::string& strCall : calls) {
        const std::string strName = strCall.substr(0, strCall.find(' '));
        if (names.end() != std::find(names.begin(), names.end(), strName)) {
            found.push_back(strCall);
        }
    }
    return found;
}

std::vector<std::string> Seam::statements() const
{
    std::vector<std::string> found = callsOf({"sqlite3_exec"});
    for (std::string& strCall : found) {
        strCall.erase(0, strlen("sqlite3_exec "));
    }
    return found;
}

void Seam::fail(const std::string& strName, int nErrno, int nFirst, int nLast)
{
    failures[strName] = {nFirst, nLast, nErrno};
}

int Seam::exec(sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument, char** pszError)
{
    const ErrnoKeeper keeper;
    Receiver receiver = {callback, pArgument, errno};
    return NEXT(sqlite3_exec)(pDb, szSql, callback ? &Receiver::call : nullptr, &receiver, pszError);
}

extern "C" {

uid_t geteuid() noexcept
{
    return CALLED_BY_LIBRARY && fails("geteuid") ? static_cast<uid_t>(-1) : NEXT(geteuid)();
}

int seteuid(uid_t uid) noexcept
{
    return CALLED_BY_LIBRARY && fails("seteuid", std::to_string(uid)) ? -1 : NEXT(seteuid)(uid);
}

int access(const char* szPath, int nMode) noexcept
{
    return CALLED_BY_LIBRARY && fails("access", szPath) ? -1 : NEXT(access)(szPath, nMode);
}

int chmod(const char* szPath, mode_t mode) noexcept
{
    std::ostringstream arguments;
    arguments << szPath << " 0" << std::oct << mode;
    return CALLED_BY_LIBRARY && fails("chmod", arguments.str()) ? -1 : NEXT(chmod)(szPath, mode);
}

int open(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;
    va_end(args);
    return CALLED_BY_LIBRARY && fails("open", szPath) ? -1 : NEXT(open)(szPath, nFlags, mode);
}

int usleep(useconds_t nMicroseconds)
{
    if (!CALLED_BY_LIBRARY) {
        return NEXT(usleep)(nMicroseconds);
    }
    record("usleep", std::to_string(nMicroseconds));
    errno = EINTR; // the library ignores the result and the errno of its sleep
    return -1;
}

time_t time(time_t* pTime) noexcept
{
    if (!CALLED_BY_LIBRARY) {
        return NEXT(time)(pTime);
    }
    record("time");
    const time_t now = seam().clock ? *seam().clock : NEXT(time)(nullptr);
    if (pTime) {
        *pTime = now;
    }
    return now;
}

int gettimeofday(struct timeval* pTime, void* pZone) noexcept
{
    if (seam().clock && isIn("libsqlite3.so", __builtin_return_address(0))) {
        pTime->tv_sec = *seam().clock;
        pTime->tv_usec = 0;
        return 0;
    }
    return NEXT(gettimeofday)(pTime, pZone);
}

int printf(const char* szFormat, ...)
{
    const bool blLibrary = CALLED_BY_LIBRARY;
    int nResult = 0;
    va_list args;
    va_start(args, szFormat);
    if (blLibrary) {
        logged(nullptr, szFormat, args);
    } else {
        nResult = vprintf(szFormat, args);
    }
    va_end(args);
    return nResult;
}

void syslog(int nPriority, const char* szFormat, ...)
{
    const bool blLibrary = CALLED_BY_LIBRARY;
    va_list args;
    va_start(args, szFormat);
    if (blLibrary) {
        logged(&nPriority, szFormat, args);
        errno = EDESTADDRREQ; // as on a system without a log daemon
    } else {
        vsyslog(nPriority, szFormat, args);
    }
    va_end(args);
}

ssize_t getrandom(void* pBuffer, size_t cbBuffer, unsigned int nFlags)
{
    if (fails("getrandom")) {
        return -1;
    }
    return seam().random ? seam().random(pBuffer, cbBuffer, nFlags)
                         : NEXT(getrandom)(pBuffer, cbBuffer, nFlags);
}

int getpwuid_r(uid_t uid, struct passwd* pEntry, char* szBuffer, size_t cbBuffer, struct passwd** ppEntry)
{
    if (fails("getpwuid_r", std::to_string(uid))) {
        *ppEntry = nullptr;
        return errno;
    }
    return seam().getUser ? seam().getUser(uid, pEntry, szBuffer, cbBuffer, ppEntry)
                          : NEXT(getpwuid_r)(uid, pEntry, szBuffer, cbBuffer, ppEntry);
}

int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    if (!CALLED_BY_LIBRARY) {
        return NEXT(sqlite3_open)(szPath, ppDb);
    }
    record("sqlite3_open", szPath);
    if (seam().sqliteOpen) {
        return seam().sqliteOpen(szPath, ppDb);
    }
    const ErrnoKeeper keeper;
    return NEXT(sqlite3_open)(szPath, ppDb);
}

int sqlite3_exec(sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument, char** pszError)
{
    if (!CALLED_BY_LIBRARY) {
        return NEXT(sqlite3_exec)(pDb, szSql, callback, pArgument, pszError);
    }
    record("sqlite3_exec", szSql);
    return seam().sqliteExec ? seam().sqliteExec(pDb, szSql, callback, pArgument, pszError)
                             : Seam::exec(pDb, szSql, callback, pArgument, pszError);
}

int sqlite3_close(sqlite3* pDb)
{
    if (!CALLED_BY_LIBRARY) {
        return NEXT(sqlite3_close)(pDb);
    }
    record("sqlite3_close");
    if (seam().sqliteClose) {
        return seam().sqliteClose(pDb);
    }
    const ErrnoKeeper keeper;
    return NEXT(sqlite3_close)(pDb);
}

char* sqlite3_mprintf(const char* szFormat, ...)
{
    const bool blFails = CALLED_BY_LIBRARY && fails("sqlite3_mprintf", szFormat);
    va_list args;
    va_start(args, szFormat);
    char* szText = blFails ? nullptr : sqlite3_vmprintf(szFormat, args);
    va_end(args);
    return szText;
}

} // extern "C"

void (*g_pAllocation)() = nullptr;

// Each allocation of the process comes here, those of the C++ libraries too.
void* operator new(std::size_t cbSize)
{
    if (nullptr != g_pAllocation) {
        g_pAllocation();
    }
    void* const pMemory = malloc(0 == cbSize ? 1 : cbSize);
    if (nullptr == pMemory) {
        throw std::bad_alloc();
    }
    return pMemory;
}

void operator delete(void* pMemory) noexcept
{
    free(pMemory);
}

void operator delete(void* pMemory, std::size_t) noexcept
{
    free(pMemory);
}

void* operator new(std::size_t cbSize, const std::nothrow_t&) noexcept
{
    if (CALLED_BY_LIBRARY && fails("operator new")) {
        return nullptr;
    }
    return withoutThrowing([cbSize] { return ::operator new(cbSize); });
}

void* operator new[](std::size_t cbSize, const std::nothrow_t&) noexcept
{
    return fails("operator new[]") ? nullptr : withoutThrowing([cbSize] { return ::operator new[](cbSize); });
}
