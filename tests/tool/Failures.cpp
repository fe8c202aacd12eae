// For tests of what the tool says: with "file" or "directory" in VEMO_TEST_SYNC, none of these can be synced.

#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#define SCRIPTED extern "C" __attribute__((visibility("default")))

namespace {

int sync(const char* szFunction, int nFile)
{
    const char* szKind = getenv("VEMO_TEST_SYNC");
    struct stat status = {};
    if (szKind && 0 == fstat(nFile, &status) &&
        0 == strcmp(szKind, S_ISDIR(status.st_mode) ? "directory" : "file")) {
        errno = EIO;
        return -1;
    }
    return reinterpret_cast<decltype(&::fsync)>(dlsym(RTLD_NEXT, szFunction))(nFile);
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
