// Lets a program that uses the token library run without root and without the real database: preload
// this shared object (or link it ahead of the library) and name a directory of your own in
// VEMO_REDIRECT_DIR. It takes the place of the private directory that holds the database. The
// effective uid that the process sees and sets is a number kept here, 0 at first, and what belongs to
// the real user there belongs to root for the process. Without the variable, everything goes through
// unchanged.

#include <dlfcn.h>
#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "AccessTokenDefine.h"

#define REDIRECT_EXPORT __attribute__((visibility("default")))

namespace {

std::atomic<uid_t> g_uidEffective{0};

const char* directory()
{
    return getenv("VEMO_REDIRECT_DIR");
}

// A path, led elsewhere if it is the private directory or lies in it. Takes nothing from the heap, like the
// calls that it serves.
class Redirected {
public:
    explicit Redirected(const char* szPath) : m_szPath(szPath)
    {
        const char* szDatabase = VEMO_ATOKEN_DB_PATH;
        const size_t cchPrivate = static_cast<size_t>(strrchr(szDatabase, '/') - szDatabase);
        const bool blPrivate = 0 == strncmp(szPath, szDatabase, cchPrivate) &&
                               (szPath[cchPrivate] == '\0' || szPath[cchPrivate] == '/');
        if (blPrivate && directory()) {
            snprintf(m_szOwn, sizeof(m_szOwn), "%s%s", directory(), &szPath[cchPrivate]);
            m_szPath = m_szOwn;
        }
    }
    Redirected(const Redirected&) = delete;
    Redirected& operator=(const Redirected&) = delete;
    const char* path() const { return m_szPath; }

private:
    const char* m_szPath;
    char m_szOwn[PATH_MAX];
};

// What a path's status says when the real user is taken for root.
int redirectedStatus(int nResult, struct stat* pStatus)
{
    if (0 == nResult && directory() && pStatus->st_uid == getuid()) {
        pStatus->st_uid = 0;
    }
    return nResult;
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
    return directory() ? g_uidEffective.load() : NEXT(geteuid)();
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
    return NEXT(access)(Redirected(szPath).path(), nMode);
}

REDIRECT_EXPORT int chmod(const char* szPath, mode_t mode) noexcept
{
    return NEXT(chmod)(Redirected(szPath).path(), mode);
}

REDIRECT_EXPORT int chown(const char* szPath, uid_t uid, gid_t gid) noexcept
{
    return NEXT(chown)(Redirected(szPath).path(), directory() && 0 == uid ? getuid() : uid, gid);
}

REDIRECT_EXPORT int mkdir(const char* szPath, mode_t mode) noexcept
{
    return NEXT(mkdir)(Redirected(szPath).path(), mode);
}

REDIRECT_EXPORT int stat(const char* szPath, struct stat* pStatus) noexcept
{
    return redirectedStatus(NEXT(stat)(Redirected(szPath).path(), pStatus), pStatus);
}

REDIRECT_EXPORT int lstat(const char* szPath, struct stat* pStatus) noexcept
{
    return redirectedStatus(NEXT(lstat)(Redirected(szPath).path(), pStatus), pStatus);
}

REDIRECT_EXPORT int open(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;
    va_end(args);
    return NEXT(open)(Redirected(szPath).path(), nFlags, mode);
}

REDIRECT_EXPORT int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    return NEXT(sqlite3_open)(Redirected(szPath).path(), ppDb);
}

} // extern "C"
