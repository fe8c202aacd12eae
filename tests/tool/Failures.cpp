// What the system does to the tool in a test. These variables make it fail:
//   VEMO_TEST_SYNC    "file", "directory" or a path: none of these can be synced
//   VEMO_TEST_LOOKUP  an errno: each look-up of a user ends with it; ERANGE for buffers below 4 KiB only
//   VEMO_TEST_VFS     the name of SQLite's way to work on files
//   VEMO_TEST_ROOM    free blocks of a file system, their size, its files, and how many of these are free
//   VEMO_TEST_CALLS   lines "CALL|ERRNO": all these calls fail; or "CALL|COMMAND": before the first call, the
//                     command acts as another program. CALL is the name of a function below that asks
//                     fails(), followed by the name of its file, if it has one.
//   VEMO_TEST_HASTE   waiting for a locked database takes no time
// And these name files that record what is not visible otherwise:
//   VEMO_TEST_WAITS   a line each time the library waits for a locked database; usually a fifo, so that the
//                     holder of the lock can release it just then
//   VEMO_TEST_WIPED   texts that are wiped from memory
//   VEMO_TEST_SYSLOG  for each log line its priority, and whether the lock is "held" or "free" then; of lines
//                     that tell of changes also the text, which does not get into the log of the machine
// A descriptor that other programs would inherit ends the tool.

#include <dirent.h>
#include <fcntl.h>
#include <pwd.h>
#include <sqlite3.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>

#include "CallLock.h"
#include "Interpose.h"

namespace {

bool fails(const std::string& strCall)
{
    const char* szCalls = getenv("VEMO_TEST_CALLS");
    std::istringstream lines(szCalls ? szCalls : "");
    const int nBefore = errno;
    for (std::string strLine; std::getline(lines, strLine);) {
        if (0 == strLine.compare(0, strCall.size() + 1, strCall + "|")) {
            const std::string strRest = strLine.substr(strCall.size() + 1);
            errno = atoi(strRest.c_str());
            if (0 != errno || 0 > unsetenv("VEMO_TEST_CALLS") || 0 != system(strRest.c_str())) {
                return true;
            }
            errno = nBefore;
        }
    }
    return false;
}

void requireOwn(const char* szFile, int nFlags)
{
    // libbsd opens the first, and closes it soon; clang's counters stand in the others.
    const bool blOthers = 0 == strcmp(szFile, "/dev/tty") || strstr(szFile, ".profraw");
    if (!(nFlags & O_CLOEXEC) && !blOthers) {
        abort();
    }
}

// No call waits for the disk: that would be most of the tests' time.
int sync(int nFile)
{
    if (fails("fsync")) {
        return -1;
    }
    const char* szKind = getenv("VEMO_TEST_SYNC");
    struct stat status = {};
    struct stat named = {};
    if (szKind && 0 == fstat(nFile, &status) &&
        (0 == strcmp(szKind, S_ISDIR(status.st_mode) ? "directory" : "file") ||
         (0 == stat(szKind, &named) && named.st_ino == status.st_ino))) {
        errno = EIO;
        return -1;
    }
    return 0;
}

template <typename Function, typename Key>
int lookUp(Function* pNext, Key key, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
           struct passwd** ppEntry)
{
    const char* szError = getenv("VEMO_TEST_LOOKUP");
    if (szError && (ERANGE != atoi(szError) || cbBuffer < 4096)) {
        *ppEntry = nullptr;
        return atoi(szError);
    }
    return pNext(key, pEntry, szBuffer, cbBuffer, ppEntry);
}

void writeLine(int nPriority, const char* szFormat, va_list args)
{
    FILE* const pFile = getenv("VEMO_TEST_SYSLOG") ? fopen(getenv("VEMO_TEST_SYSLOG"), "a") : nullptr;
    const bool blAudit = LOG_AUTHPRIV == (nPriority & LOG_FACMASK);
    if (!pFile) {
        if (!blAudit) {
            vsyslog(nPriority, szFormat, args);
        }
        return;
    }
    const int nLock = open(CallLock::FILE_OF_ALL, O_RDWR | O_CLOEXEC);
    fprintf(pFile, "%d %s", nPriority, 0 == flock(nLock, LOCK_EX | LOCK_NB) ? "free" : "held");
    if (blAudit) {
        fputc(' ', pFile);
        vfprintf(pFile, szFormat, args);
    }
    fputc('\n', pFile);
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
extern "C" INTERPOSED void syslog(int nPriority, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    writeLine(nPriority, szFormat, args);
    va_end(args);
}

extern "C" INTERPOSED void __syslog_chk(int nPriority, int, const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    writeLine(nPriority, szFormat, args);
    va_end(args);
}

extern "C" INTERPOSED void explicit_bzero(void* pMemory, size_t cbMemory)
{
    wipe(pMemory, cbMemory);
}

// How a hardened build calls it.
extern "C" INTERPOSED void __explicit_bzero_chk(void* pMemory, size_t cbMemory, size_t)
{
    wipe(pMemory, cbMemory);
}

extern "C" INTERPOSED int fsync(int nFile)
{
    return sync(nFile);
}

extern "C" INTERPOSED int fdatasync(int nFile)
{
    return sync(nFile);
}

extern "C" INTERPOSED int open(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & (O_CREAT | O_TMPFILE)) ? va_arg(args, mode_t) : 0;
    va_end(args);
    requireOwn(szPath, nFlags);
    return fails("open " + std::string(szPath)) ? -1 : NEXT(open)(szPath, nFlags, mode);
}

extern "C" INTERPOSED int openat(int nDirectory, const char* szName, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & (O_CREAT | O_TMPFILE)) ? va_arg(args, mode_t) : 0;
    va_end(args);
    requireOwn(szName, nFlags);
    const std::string strName = O_TMPFILE == (nFlags & O_TMPFILE) ? "O_TMPFILE" : szName;
    return fails("openat " + strName) ? -1 : NEXT(openat)(nDirectory, szName, nFlags, mode);
}

extern "C" INTERPOSED int mkdirat(int nDirectory, const char* szName, mode_t mode)
{
    return fails("mkdirat " + std::string(szName)) ? -1 : NEXT(mkdirat)(nDirectory, szName, mode);
}

extern "C" INTERPOSED int fstat(int nFile, struct stat* pStatus)
{
    return fails("fstat") ? -1 : NEXT(fstat)(nFile, pStatus);
}

extern "C" INTERPOSED int fstatat(int nDirectory, const char* szName, struct stat* pStatus, int nFlags)
{
    return fails("fstatat " + std::string(szName)) ? -1 : NEXT(fstatat)(nDirectory, szName, pStatus, nFlags);
}

extern "C" INTERPOSED int fstatvfs(int nFile, struct statvfs* pStatus)
{
    const int nResult = fails("fstatvfs") ? -1 : NEXT(fstatvfs)(nFile, pStatus);
    const char* szRoom = getenv("VEMO_TEST_ROOM");
    if (szRoom) {
        sscanf(szRoom, "%lu %lu %lu %lu", &pStatus->f_bfree, &pStatus->f_frsize, &pStatus->f_files,
               &pStatus->f_ffree);
    }
    return nResult;
}

extern "C" INTERPOSED int fchown(int nFile, uid_t uid, gid_t gid)
{
    return fails("fchown") ? -1 : NEXT(fchown)(nFile, uid, gid);
}

extern "C" INTERPOSED int fchmod(int nFile, mode_t mode)
{
    return fails("fchmod") ? -1 : NEXT(fchmod)(nFile, mode);
}

extern "C" INTERPOSED int renameat(int nDirectory, const char* szName, int nNewDirectory,
                                   const char* szNewName)
{
    return fails("renameat " + std::string(szName))
               ? -1
               : NEXT(renameat)(nDirectory, szName, nNewDirectory, szNewName);
}

extern "C" INTERPOSED int flock(int nFile, int nOperation)
{
    return fails("flock") ? -1 : NEXT(flock)(nFile, nOperation);
}

extern "C" INTERPOSED FILE* fdopen(int nFile, const char* szMode)
{
    return fails("fdopen") ? nullptr : NEXT(fdopen)(nFile, szMode);
}

extern "C" INTERPOSED DIR* opendir(const char* szPath)
{
    return fails("opendir " + std::string(szPath)) ? nullptr : NEXT(opendir)(szPath);
}

extern "C" INTERPOSED int getpwnam_r(const char* szName, struct passwd* pEntry, char* szBuffer,
                                     size_t cbBuffer, struct passwd** ppEntry)
{
    return lookUp(NEXT(getpwnam_r), szName, pEntry, szBuffer, cbBuffer, ppEntry);
}

extern "C" INTERPOSED int getpwuid_r(uid_t uid, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                                     struct passwd** ppEntry)
{
    return lookUp(NEXT(getpwuid_r), uid, pEntry, szBuffer, cbBuffer, ppEntry);
}

extern "C" INTERPOSED int usleep(useconds_t nMicroseconds)
{
    const char* szFile = getenv("VEMO_TEST_WAITS");
    const int nFile = szFile ? NEXT(open)(szFile, O_WRONLY | O_NONBLOCK | O_CLOEXEC) : -1;
    if (0 <= nFile) {
        [[maybe_unused]] const ssize_t nWritten = write(nFile, "\n", 1);
        close(nFile);
    }
    return getenv("VEMO_TEST_HASTE") ? 0 : NEXT(usleep)(nMicroseconds);
}
