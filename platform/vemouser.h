// Stand-in for the platform's user database: what the token library uses of it.

#ifndef VEMOUSER_H
#define VEMOUSER_H

#include <sys/types.h>

struct VEMOUser {
    char* szName;
};

// Looks up the user of a uid. *ppUser receives a new record, to be released with VEMOUserFree.
// Returns 0; or -1 with errno set, and leaves *ppUser unchanged. errno is the error of getpwuid_r, ENOENT
// when there is no such user, or ENOMEM. May run in several threads at once.
int VEMOUserGetByUID(uid_t uid, VEMOUser** ppUser);

// Releases a record, or nothing for null.
void VEMOUserFree(VEMOUser* pUser);

#endif
