// Lets a program that uses the token library run without root and without the real database: preload
// this shared object (or link it ahead of the library) and name a directory of your own in
// VEMO_REDIRECT_DIR. The database is then that directory's vemo-access-token.db, and the effective
// uid that the process sees and sets is a number kept here, 0 at first. Without the variable,
// everything goes through unchanged.

#include <dlfcn.h>
#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <string>

#include "AccessTokenDefine.h"

#define REDIRECT_EXPORT __attribute__((visibility("default")))

namespace {

uid_t g_uidEffective = 0;

const char* directory()
{
    return getenv("VEMO_REDIRECT_DIR");
}

std::string redirected(const char* szPath)
{
    if (0 == strcmp(VEMO_ATOKEN_DB_PATH, szPath) && directory()) {
        return std::string(directory()) + "/vemo-access-token.db";
    }
    return szPath;
}

} // namespace

// The function of that name that would run if this object were not here; looked up once.
#define NEXT(name)                                                                                           \
    ([] {                                                                                                    \
        static const auto pNext = reinterpret_cast<decltype(&::name)>(dlsym(RTLD_NEXT, #name));              \
        return pNext;                                                                                        \
    }())

extern "C" {

REDIRECT_EXPORT uid_t geteuid() noexcept
{
    return directory() ? g_uidEffective : NEXT(geteuid)();
}

REDIRECT_EXPORT int seteuid(uid_t uid) noexcept
{
    if (!directory()) {
        return NEXT(seteuid)(uid);
    }
    g_uidEffective = uid;
    return 0;
}

REDIRECT_EXPORT int access(const char* szPath, int nMode) noexcept
{
    return NEXT(access)(redirected(szPath).c_str(), nMode);
}

REDIRECT_EXPORT int chmod(const char* szPath, mode_t mode) noexcept
{
    return NEXT(chmod)(redirected(szPath).c_str(), mode);
}

REDIRECT_EXPORT int stat(const char* szPath, struct stat* pStatus) noexcept
{
    return NEXT(stat)(redirected(szPath).c_str(), pStatus);
}

REDIRECT_EXPORT int open(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;
    va_end(args);
    return NEXT(open)(redirected(szPath).c_str(), nFlags, mode);
}

REDIRECT_EXPORT int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    return NEXT(sqlite3_open)(redirected(szPath).c_str(), ppDb);
}

} // extern "C"
