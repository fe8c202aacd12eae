// Lets a program that uses the token library run without root and without the real database. Preload this
// shared object, or link it before the library, and set VEMO_REDIRECT_DIR to a directory of your own. This
// directory then replaces the private directory of the database, and a file beside it, with ".lock" added to
// its name, replaces the lock file of all programs. The effective uid is only a number kept here, 0 at first.
// Files of the real user seem to belong to root. Without the variable, nothing changes.

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
#include "CallLock.h"

#define REDIRECT_EXPORT __attribute__((visibility("default")))

namespace {

std::atomic<uid_t> g_uidEffective{0};

const char* directory()
{
    return getenv("VEMO_REDIRECT_DIR");
}

// Whether a path is another one or lies below it.
bool isWithin(const char* szPath, const char* szOther, size_t cchOther)
{
    return 0 == strncmp(szPath, szOther, cchOther) && (szPath[cchOther] == '\0' || szPath[cchOther] == '/');
}

size_t privateLength()
{
    const char* szDatabase = VEMO_ATOKEN_DB_PATH;
    return static_cast<size_t>(strrchr(szDatabase, '/') - szDatabase);
}

// A path, redirected if it is the private directory, lies in it, or is the lock file. Uses no heap memory, as
// the functions that it serves use none.
class Redirected {
public:
    explicit Redirected(const char* szPath) : m_szPath(szPath)
    {
        if (!directory()) {
            return;
        }
        if (isWithin(szPath, VEMO_ATOKEN_DB_PATH, privateLength())) {
            snprintf(m_szOwn, sizeof(m_szOwn), "%s%s", directory(), &szPath[privateLength()]);
            m_szPath = m_szOwn;
        } else if (0 == strcmp(szPath, CallLock::FILE_OF_ALL)) {
            snprintf(m_szOwn, sizeof(m_szOwn), "%s.lock", directory());
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

// The last directory above the private one that a walk has opened. It may be missing on this machine, so "/"
// is open in its place.
int g_nAbove = -1;
char g_szAbove[sizeof(VEMO_ATOKEN_DB_PATH)];

// Passes on a descriptor that was just opened. If it has the number of that directory, the directory has been
// closed.
int notAbove(int nFile)
{
    if (nFile == g_nAbove) {
        g_nAbove = -1;
    }
    return nFile;
}

// The path of a name in an open directory; the name alone where no redirection depends on it.
class Joined {
public:
    Joined(int nDirectory, const char* szName) : m_szPath(szName)
    {
        if (!directory() || AT_FDCWD == nDirectory || szName[0] == '/' || 0 == strcmp(szName, ".")) {
            return;
        }
        char szLink[32];
        char szDirectory[PATH_MAX];
        snprintf(szLink, sizeof(szLink), "/proc/self/fd/%d", nDirectory);
        const ssize_t cchDirectory = readlink(szLink, szDirectory, sizeof(szDirectory) - 1);
        szDirectory[cchDirectory < 0 ? 0 : cchDirectory] = '\0';
        const bool blBelowAbove = nDirectory == g_nAbove;
        const char* szAbove = blBelowAbove ? g_szAbove : szDirectory;
        snprintf(m_szJoined, sizeof(m_szJoined), "%s/%s", strcmp(szAbove, "/") ? szAbove : "", szName);
        if (isPrivate() || isAbove() || blBelowAbove) {
            m_szPath = m_szJoined;
        }
    }
    Joined(const Joined&) = delete;
    Joined& operator=(const Joined&) = delete;
    const char* path() const { return m_szPath; }
    bool isAbove() const
    {
        return m_szJoined[0] && isWithin(VEMO_ATOKEN_DB_PATH, m_szJoined, strlen(m_szJoined)) && !isPrivate();
    }

private:
    bool isPrivate() const { return isWithin(m_szJoined, VEMO_ATOKEN_DB_PATH, privateLength()); }

    const char* m_szPath;
    char m_szJoined[2 * PATH_MAX] = "";
};

// Shows the real user as root in a file's status.
int redirectedStatus(int nResult, struct stat* pStatus)
{
    if (0 == nResult && directory() && pStatus->st_uid == getuid()) {
        pStatus->st_uid = 0;
    }
    return nResult;
}

} // namespace

// The function of that name that this object hides; looked up once.
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
    return notAbove(NEXT(open)(Redirected(szPath).path(), nFlags, mode));
}

REDIRECT_EXPORT int openat(int nDirectory, const char* szName, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & (O_CREAT | O_TMPFILE)) ? va_arg(args, mode_t) : 0;
    va_end(args);
    const Joined joined(nDirectory, szName);
    if (!joined.isAbove()) {
        return notAbove(NEXT(openat)(nDirectory, Redirected(joined.path()).path(), nFlags, mode));
    }
    g_nAbove = NEXT(open)("/", nFlags);
    snprintf(g_szAbove, sizeof(g_szAbove), "%s", joined.path());
    return g_nAbove;
}

REDIRECT_EXPORT int mkdirat(int nDirectory, const char* szName, mode_t mode) noexcept
{
    return NEXT(mkdirat)(nDirectory, Redirected(Joined(nDirectory, szName).path()).path(), mode);
}

REDIRECT_EXPORT int fstatat(int nDirectory, const char* szName, struct stat* pStatus, int nFlags) noexcept
{
    const Joined joined(nDirectory, szName);
    return redirectedStatus(NEXT(fstatat)(nDirectory, Redirected(joined.path()).path(), pStatus, nFlags),
                            pStatus);
}

REDIRECT_EXPORT int fstat(int nFile, struct stat* pStatus) noexcept
{
    return redirectedStatus(NEXT(fstat)(nFile, pStatus), pStatus);
}

REDIRECT_EXPORT int fchown(int nFile, uid_t uid, gid_t gid) noexcept
{
    return NEXT(fchown)(nFile, directory() && 0 == uid ? getuid() : uid, gid);
}

REDIRECT_EXPORT int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    return NEXT(sqlite3_open)(Redirected(szPath).path(), ppDb);
}

} // extern "C"
