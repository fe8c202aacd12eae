// Stand-in for the platform's user database: what the token library uses of it.

#ifndef VEMOUSER_H
#define VEMOUSER_H

#include <sys/types.h>

struct VEMOUser {
    char* szName;
};

// Looks up the user of a uid. *ppUser must be null; it receives a new record, to be released with
// VEMOUserFree, or stays null when there is no such user.
// Returns 0 in both cases, or -1 with errno set when the user database could not be read.
// Threads: may run in several threads at once.
int VEMOUserGetByUID(uid_t uid, VEMOUser** ppUser);

// Releases a record; null is fine.
void VEMOUserFree(VEMOUser* pUser);

#endif
