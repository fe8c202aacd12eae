// Stand-in for the core platform library: what the token library uses of it.

#ifndef PLIBC_H
#define PLIBC_H

// Creates an empty file if there is none. At most its owner can read and write it, whatever the umask. An
// existing file is not changed. A symbolic link to a missing file is a failure.
// Returns 0, or -1 with errno set.
int PLIBCFileTouch(const char* szPath);

#endif
