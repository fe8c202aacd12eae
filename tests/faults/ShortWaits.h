// Replaces usleep(): a wait for a lock takes no time. Waits are counted, and end as if by a signal.
// Included in one file of a program.

#ifndef TESTS_SHORT_WAITS_H
#define TESTS_SHORT_WAITS_H

#include <unistd.h>

#include <cerrno>

namespace {

int g_nWaits = 0;

}

extern "C" int usleep(useconds_t)
{
    ++g_nWaits;
    errno = EINTR;
    return -1;
}

#endif
