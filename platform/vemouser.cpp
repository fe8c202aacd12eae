#include "vemouser.h"

#include <pwd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>

namespace {

struct UserDeleter {
    void operator()(VEMOUser* pUser) const { VEMOUserFree(pUser); }
};

// Some user databases answer so for "no such uid", instead of success without an entry. The other
// answers that the manual allows for it (EBADF, EPERM) are more often real failures.
bool isNotFound(int nError)
{
    return ENOENT == nError || ESRCH == nError;
}

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
    if (0 != nError && !isNotFound(nError)) {
        return fail(nError);
    }
    if (!pEntry) {
        return 0;
    }

    std::unique_ptr<VEMOUser, UserDeleter> pUser(new (std::nothrow) VEMOUser());
    if (!pUser || !(pUser->szName = strdup(pEntry->pw_name))) {
        return fail(ENOMEM);
    }
    *ppUser = pUser.release();
    return 0;
}

void VEMOUserFree(VEMOUser* pUser)
{
    if (pUser) {
        free(pUser->szName);
        delete pUser;
    }
}
