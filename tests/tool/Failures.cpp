// For tests of what the tool says when the system fails: with "file" or "directory" in VEMO_TEST_SYNC, none
// of these can be synced; with an errno in VEMO_TEST_LOOKUP, each look-up of a user ends with it and finds
// nobody.

#include <dlfcn.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

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
    if (szKind && 0 == fstat(nFile, &status) &&
        0 == strcmp(szKind, S_ISDIR(status.st_mode) ? "directory" : "file")) {
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
    if (szError) {
        *ppEntry = nullptr;
        return atoi(szError);
    }
    return next(szFunction, key, pEntry, szBuffer, cbBuffer, ppEntry);
}

} // namespace

SCRIPTED int fsync(int nFile)
{
    return sync("fsync", nFile);
}

SCRIPTED int fdatasync(int nFile)
{
    return sync("fdatasync", nFile);
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
