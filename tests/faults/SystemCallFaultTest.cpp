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

Injection g_injection;
const char* g_szFunction = "";
bool g_blUidUnknown = false; // at the last time of asking
bool g_blUidRaised = false;  // to 0
bool g_blUidLost = false;    // raised while unknown, or the last try to put it back failed

bool fails(const char* szName)
{
    const bool blFails = 0 == strcmp(szName, g_szFunction) && g_injection.fails();
    errno = blFails ? EACCES : errno;
    return blFails;
}

class SystemCallFault : public ::testing::TestWithParam<const char*> {};

} // namespace

extern "C" {

uid_t geteuid() noexcept
{
    g_blUidUnknown = fails("geteuid");
    return g_blUidUnknown ? static_cast<uid_t>(-1) : NEXT(geteuid)();
}

int seteuid(uid_t uid) noexcept
{
    const bool blFails = fails("seteuid");
    if (0 == uid) {
        g_blUidRaised = !blFails;
    }
    g_blUidLost = g_blUidRaised && (0 == uid ? g_blUidUnknown : blFails);
    return blFails ? -1 : NEXT(seteuid)(uid);
}

int access(const char* szPath, int nMode) noexcept
{
    return fails("access") ? -1 : NEXT(access)(szPath, nMode);
}

int chmod(const char* szPath, mode_t mode) noexcept
{
    return fails("chmod") ? -1 : NEXT(chmod)(szPath, mode);
}

#define OPEN(name)                                                                                           \
    int name(const char* szPath, int nFlags, ...)                                                            \
    {                                                                                                        \
        va_list args;                                                                                        \
        va_start(args, nFlags);                                                                              \
        const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;                                   \
        va_end(args);                                                                                        \
        return fails("open") ? -1 : NEXT(name)(szPath, nFlags, mode);                                        \
    }
OPEN(open)
OPEN(open64)

} // extern "C"

TEST_P(SystemCallFault, LeavesAStateThatTheCallerKnows)
{
    g_szFunction = GetParam();
    g_injection.uidAfter = [] { return g_blUidLost ? 0 : UID_CALLER; };
    failEachOfAll("system calls", g_szFunction, g_injection);
}

INSTANTIATE_TEST_SUITE_P(Each, SystemCallFault,
                         ::testing::Values("geteuid", "seteuid", "access", "chmod", "open"),
                         [](const auto& instance) { return instance.param; });
