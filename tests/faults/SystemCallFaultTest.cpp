// Each system call that is needed to open the store fails, the library's own and SQLite's: that call alone,
// or that call and all later ones. (ShortWaits.h lets waits for a lock fail.)

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>

#include "Interpose.h"
#include "Oracle.h"

namespace {

struct Injection {
    const char* szFunction = "";
    int64_t nFirst = 0;
    int64_t nLast = -1;
    int64_t nCalls = 0;
    bool blUidUnknown = false; // at the last time of asking
    bool blUidRaised = false;  // to 0
    bool blUidLost = false;    // raised while unknown, or the last try to put it back failed

    bool fails(const char* szName)
    {
        if (0 != strcmp(szName, szFunction)) {
            return false;
        }
        ++nCalls;
        errno = EACCES;
        return nFirst <= nCalls && nCalls <= nLast;
    }
};

Injection g_injection;

class SystemCallFault : public ::testing::TestWithParam<const char*> {};

} // namespace

extern "C" {

uid_t geteuid() noexcept
{
    g_injection.blUidUnknown = g_injection.fails("geteuid");
    return g_injection.blUidUnknown ? static_cast<uid_t>(-1) : NEXT(geteuid)();
}

int seteuid(uid_t uid) noexcept
{
    const bool blFails = g_injection.fails("seteuid");
    if (0 == uid) {
        g_injection.blUidRaised = !blFails;
    }
    g_injection.blUidLost = g_injection.blUidRaised && (0 == uid ? g_injection.blUidUnknown : blFails);
    return blFails ? -1 : NEXT(seteuid)(uid);
}

int access(const char* szPath, int nMode) noexcept
{
    return g_injection.fails("access") ? -1 : NEXT(access)(szPath, nMode);
}

int chmod(const char* szPath, mode_t mode) noexcept
{
    return g_injection.fails("chmod") ? -1 : NEXT(chmod)(szPath, mode);
}

#define OPEN(name)                                                                                           \
    int name(const char* szPath, int nFlags, ...)                                                            \
    {                                                                                                        \
        va_list args;                                                                                        \
        va_start(args, nFlags);                                                                              \
        const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;                                   \
        va_end(args);                                                                                        \
        return g_injection.fails("open") ? -1 : NEXT(name)(szPath, nFlags, mode);                            \
    }
OPEN(open)
OPEN(open64)

} // extern "C"

TEST_P(SystemCallFault, LeavesAStateThatTheCallerKnows)
{
    bool blUidLost = false;
    Injector injector;
    injector.arm = [&](int64_t nFirst, int64_t nLast) { g_injection = {GetParam(), nFirst, nLast}; };
    injector.disarm = [&] {
        g_injection.szFunction = "";
        blUidLost = g_injection.blUidLost;
    };
    injector.calls = [] { return g_injection.nCalls; };
    injector.uidAfter = [&] { return blUidLost ? 0 : UID_CALLER; };
    failEachOfAll("system calls", GetParam(), injector);
}

INSTANTIATE_TEST_SUITE_P(Each, SystemCallFault,
                         ::testing::Values("geteuid", "seteuid", "access", "chmod", "open"),
                         [](const auto& instance) { return instance.param; });
