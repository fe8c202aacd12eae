// Stand-in for the core platform library: what the token library uses of it.

#ifndef PLIBC_H
#define PLIBC_H

// Creates an empty file if there is none: close-on-exec, readable and writable by its owner at most,
// whatever the umask. A file that exists is left alone. A symbolic link that leads nowhere is not
// followed: that is a failure.
// Returns 0, or -1 with errno set.
int PLIBCFileTouch(const char* szPath);

#endif
