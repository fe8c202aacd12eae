#include <dirent.h>
#include <fcntl.h>
#include <sqlite3.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "CallLock.h"
#include "Interpose.h"
#include "Library.h"

namespace {

bool g_blConfined = false;
sqlite3* g_pOffered = nullptr;
int g_nExtraFile = -1;
int g_nTokensFile = -1;

// A stream in memory.
struct Capture {
    char* szText = nullptr;
    size_t cbText = 0;
    FILE* pStream = open_memstream(&szText, &cbText);

    std::string take()
    {
        fflush(pStream);
        const std::string strTaken(szText, cbText);
        rewind(pStream);
        return strTaken;
    }
};

Capture g_result;
Capture g_complaints;
FILE* g_pStdout = nullptr;
FILE* g_pStderr = nullptr;

int fileOf(const std::string& strText)
{
    const int nFile = memfd_create("fuzz", MFD_CLOEXEC);
    FUZZ_REQUIRE(nFile >= 0 && write(nFile, strText.data(), strText.size()) == ssize_t(strText.size()));
    return nFile;
}

int refused(int nErrno)
{
    errno = nErrno;
    return -1;
}

// The status of the database, or of a directory above it.
int statusOf(const char* szPath, struct stat* pStatus = nullptr)
{
    struct stat ignored;
    pStatus = pStatus ? pStatus : &ignored;
    const std::string strDatabase = VEMO_ATOKEN_DB_PATH;
    const bool blDatabase = strDatabase == szPath;
    if (!blDatabase && 0 != strDatabase.compare(0, strlen(szPath) + 1, std::string(szPath) + "/")) {
        return refused(ENOENT);
    }
    *pStatus = {};
    pStatus->st_mode = 0700 | (blDatabase ? S_IFREG : S_IFDIR);
    pStatus->st_nlink = 1;
    return 0;
}

// The descriptor of a file that can be read; -1 for any other name.
int inputFile(const char* szName)
{
    return 0 == strcmp(szName, fuzz::EXTRA_FILE)    ? g_nExtraFile
           : 0 == strcmp(szName, fuzz::TOKENS_FILE) ? g_nTokensFile
                                                    : refused(ENOENT);
}

} // namespace

namespace fuzz {

Confinement::Confinement()
{
    g_blConfined = true;
    g_pStdout = stdout;
    g_pStderr = stderr;
    stdout = g_result.pStream;
    stderr = g_complaints.pStream;
}

Confinement::~Confinement()
{
    stdout = g_pStdout;
    stderr = g_pStderr;
    g_blConfined = false;
}

sqlite3* openStore()
{
    sqlite3* pDb = nullptr;
    const int nFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_URI;
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_open_v2("file:/tokens?vfs=memdb", &pDb, nFlags, nullptr));
    return pDb;
}

void offer(sqlite3* pDb)
{
    g_pOffered = pDb;
}

void setFileTexts(const std::string& strExtra, const std::string& strTokens)
{
    g_nExtraFile = fileOf(strExtra);
    g_nTokensFile = fileOf(strTokens);
}

std::string takeResult()
{
    return g_result.take();
}

std::string takeComplaints()
{
    return g_complaints.take();
}

} // namespace fuzz

extern "C" {

INTERPOSED int sqlite3_open(const char*, sqlite3** ppDb)
{
    *ppDb = g_pOffered ? g_pOffered : fuzz::openStore();
    g_pOffered = nullptr;
    return SQLITE_OK;
}

// Replaces a function by one that gives this answer to the code under test.
#define CONFINED(result, name, parameters, arguments, answer)                                                \
    INTERPOSED result name parameters                                                                        \
    {                                                                                                        \
        return g_blConfined ? answer : NEXT(name) arguments;                                                 \
    }

CONFINED(uid_t, geteuid, () noexcept, (), 0)
CONFINED(int, seteuid, (uid_t uid) noexcept, (uid), 0)
CONFINED(int, access, (const char* szPath, int nMode) noexcept, (szPath, nMode), statusOf(szPath))
CONFINED(int, stat, (const char* szPath, struct stat* pStatus) noexcept, (szPath, pStatus),
         statusOf(szPath, pStatus))
CONFINED(int, lstat, (const char* szPath, struct stat* pStatus) noexcept, (szPath, pStatus),
         statusOf(szPath, pStatus))
CONFINED(int, chmod, (const char* szPath, mode_t mode) noexcept, (szPath, mode), 0)
CONFINED(int, mkdirat, (int nDirectory, const char* szName, mode_t mode) noexcept, (nDirectory, szName, mode),
         refused(EEXIST))
CONFINED(int, linkat, (int nFrom, const char* szFrom, int nTo, const char* szTo, int nFlags) noexcept,
         (nFrom, szFrom, nTo, szTo, nFlags), 0)
CONFINED(int, unlinkat, (int nDirectory, const char* szName, int nFlags) noexcept,
         (nDirectory, szName, nFlags), 0)
CONFINED(DIR*, opendir, (const char* szPath), (szPath), nullptr)
CONFINED(FILE*, fopen64, (const char* szPath, const char* szMode), (szPath, szMode),
         (refused(ENOENT), nullptr))
CONFINED(int, isatty, (int nFile) noexcept, (nFile), 0)
CONFINED(int, usleep, (useconds_t nMicroseconds), (nMicroseconds), 0)

INTERPOSED int fstat(int nFile, struct stat* pStatus) noexcept
{
    const int nResult = NEXT(fstat)(nFile, pStatus);
    if (g_blConfined) { // a file without a name is everybody's
        pStatus->st_uid = 0;
        pStatus->st_mode = S_IFREG | S_IRUSR | S_IWUSR;
        pStatus->st_nlink = 1;
    }
    return nResult;
}

INTERPOSED int fstatat(int nDirectory, const char* szName, struct stat* pStatus, int nFlags) noexcept
{
    if (!g_blConfined) {
        return NEXT(fstatat)(nDirectory, szName, pStatus, nFlags);
    }
    const int nFile = inputFile(szName);
    return 0 > nFile ? -1 : fstat(nFile, pStatus);
}

INTERPOSED int openat(int nDirectory, const char* szName, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & (O_CREAT | O_TMPFILE)) ? va_arg(args, mode_t) : 0;
    va_end(args);
    if (!g_blConfined) {
        return NEXT(openat)(nDirectory, szName, nFlags, mode);
    }
    if (nFlags & O_DIRECTORY) { // and a file without a name
        return fileOf("");
    }
    const int nFile = inputFile(szName);
    return 0 > nFile ? nFile
                     : NEXT(open)(("/proc/self/fd/" + std::to_string(nFile)).c_str(), O_RDONLY | O_CLOEXEC);
}

INTERPOSED int open(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;
    va_end(args);
    if (g_blConfined && ((nFlags & O_DIRECTORY) || 0 == strcmp(szPath, CallLock::FILE_OF_ALL))) {
        return fileOf(""); // that can be synced and locked, too
    }
    const bool blHarmless = 0 == strcmp(szPath, "/dev/null") || 0 == strcmp(szPath, "/dev/urandom");
    return g_blConfined && !blHarmless ? refused(ENOENT) : NEXT(open)(szPath, nFlags, mode);
}

INTERPOSED int printf(const char* szFormat, ...)
{
    char szLine[256];
    va_list args;
    va_start(args, szFormat);
    const int nWritten =
        g_blConfined ? vsnprintf(szLine, sizeof(szLine), szFormat, args) : vprintf(szFormat, args);
    va_end(args);
    return nWritten;
}

} // extern "C"
