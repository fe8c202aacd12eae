// For tests of what the tool says when the system fails: with "file" or "directory" in VEMO_TEST_SYNC, none
// of these can be synced, with a path that one; with an errno in VEMO_TEST_LOOKUP, each look-up of a user
// ends with it and finds nobody, with ERANGE as long as its buffer has less than 4 KiB; with one in
// VEMO_TEST_PROC, /proc cannot be listed; with a name in VEMO_TEST_VFS, SQLite works on files in the way of
// that name. And of what nobody sees: texts that are wiped from memory go into the file that VEMO_TEST_WIPED
// names. For each log line, the file that VEMO_TEST_SYSLOG names gets its priority, and "held" or "free":
// what the lock is then.

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <pwd.h>
#include <sqlite3.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "CallLock.h"

#define SCRIPTED extern "C" __attribute__((visibility("default")))

namespace {

template <typename... Arguments>
int next(const char* szFunction, Arguments... arguments)
{
    return reinterpret_cast<int (*)(Arguments...)>(dlsym(RTLD_NEXT, szFunction))(arguments...);
}

int sync(const char* szFunction, int nFile)
{
    const char* szKind = getenv("VEMO_TEST_SYNC");
    struct stat status = {};
    struct stat named = {};
    if (szKind && 0 == fstat(nFile, &status) &&
        (0 == strcmp(szKind, S_ISDIR(status.st_mode) ? "directory" : "file") ||
         (0 == stat(szKind, &named) && named.st_ino == status.st_ino))) {
        errno = EIO;
        return -1;
    }
    return next(szFunction, nFile);
}

template <typename Key>
int lookUp(const char* szFunction, Key key, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
           struct passwd** ppEntry)
{
    const char* szError = getenv("VEMO_TEST_LOOKUP");
    if (szError && (ERANGE != atoi(szError) || cbBuffer < 4096)) {
        *ppEntry = nullptr;
        return atoi(szError);
    }
    return next(szFunction, key, pEntry, szBuffer, cbBuffer, ppEntry);
}

void writeLine(int nPriority, const char* szFormat, va_list args)
{
    FILE* const pFile = getenv("VEMO_TEST_SYSLOG") ? fopen(getenv("VEMO_TEST_SYSLOG"), "a") : nullptr;
    if (!pFile) {
        vsyslog(nPriority, szFormat, args);
        return;
    }
    const int nLock = open(CallLock::FILE_OF_ALL, O_RDWR | O_CLOEXEC);
    fprintf(pFile, "%d %s\n", nPriority, 0 == flock(nLock, LOCK_EX | LOCK_NB) ? "free" : "held");
    close(nLock);
    fclose(pFile);
}

void wipe(void* pMemory, size_t cbMemory)
{
    const char* szFile = getenv("VEMO_TEST_WIPED");
    const int nFile =
        szFile ? open(szFile, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, S_IRUSR | S_IWUSR) : -1;
    if (0 <= nFile) {
        dprintf(nFile, "%zu %s\n", cbMemory, static_cast<const char*>(pMemory));
        close(nFile);
    }
    memset(pMemory, 0, cbMemory);
}

__attribute__((constructor)) void chooseVfs()
{
    const char* szVfs = getenv("VEMO_TEST_VFS");
    if (szVfs) {
        sqlite3_vfs_register(sqlite3_vfs_find(szVfs), 1);
    }
}

} // namespace

// The library writes its lines by the one, the tool by the other where it is hardened.
SCRIPTED void syslog(int nPriority, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    writeLine(nPriority, szFormat, args);
    va_end(args);
}

SCRIPTED void __syslog_chk(int nPriority, int, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    writeLine(nPriority, szFormat, args);
    va_end(args);
}

SCRIPTED void explicit_bzero(void* pMemory, size_t cbMemory)
{
    wipe(pMemory, cbMemory);
}

// How a hardened build calls it.
SCRIPTED void __explicit_bzero_chk(void* pMemory, size_t cbMemory, size_t)
{
    wipe(pMemory, cbMemory);
}

SCRIPTED int fsync(int nFile)
{
    return sync("fsync", nFile);
}

SCRIPTED int fdatasync(int nFile)
{
    return sync("fdatasync", nFile);
}

SCRIPTED DIR* opendir(const char* szPath)
{
    static const auto pNext = reinterpret_cast<decltype(&::opendir)>(dlsym(RTLD_NEXT, "opendir"));
    const char* szError = getenv("VEMO_TEST_PROC");
    if (szError && 0 == strcmp(szPath, "/proc/")) {
        errno = atoi(szError);
        return nullptr;
    }
    return pNext(szPath);
}

SCRIPTED int getpwnam_r(const char* szName, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                        struct passwd** ppEntry)
{
    return lookUp("getpwnam_r", szName, pEntry, szBuffer, cbBuffer, ppEntry);
}

SCRIPTED int getpwuid_r(uid_t uid, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                        struct passwd** ppEntry)
{
    return lookUp("getpwuid_r", uid, pEntry, szBuffer, cbBuffer, ppEntry);
}
