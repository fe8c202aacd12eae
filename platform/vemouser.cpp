#include "vemouser.h"

#include <pwd.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <new>

namespace {

int fail(int nError)
{
    errno = nError;
    return -1;
}

} // namespace

int VEMOUserGetByUID(uid_t uid, VEMOUser** ppUser)
{
    struct passwd entry;
    struct passwd* pEntry = nullptr;
    std::unique_ptr<char[]> rgBuffer;
    int nError = ERANGE;

    for (size_t cbBuffer = 1024; ERANGE == nError; cbBuffer *= 2) {
        rgBuffer.reset(new (std::nothrow) char[cbBuffer]);
        if (!rgBuffer) {
            return fail(ENOMEM);
        }
        nError = getpwuid_r(uid, &entry, rgBuffer.get(), cbBuffer, &pEntry);
    }
    if (!pEntry) {
        return fail(0 == nError ? ENOENT : nError);
    }

    // One piece of memory holds the record and, after it, the name.
    const size_t cbName = strlen(pEntry->pw_name) + 1;
    char* pMemory = new (std::nothrow) char[sizeof(VEMOUser) + cbName];
    if (!pMemory) {
        return fail(ENOMEM);
    }
    VEMOUser* pUser = new (pMemory) VEMOUser();
    pUser->szName = static_cast<char*>(memcpy(pUser + 1, pEntry->pw_name, cbName));
    *ppUser = pUser;
    return 0;
}

void VEMOUserFree(VEMOUser* pUser)
{
    delete[] reinterpret_cast<char*>(pUser);
}
