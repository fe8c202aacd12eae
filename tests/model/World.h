// Replaces parts of the system for the library and SQLite: a clock that only the test moves, a few users and
// no log.

#ifndef TESTS_WORLD_H
#define TESTS_WORLD_H

#include <sys/types.h>

#include <ctime>

// Seconds since the epoch; tests set it.
time_t& worldClock();

const time_t YEAR_10000 = 253402300800; // SQLite's dates end before it

// The user's name; null when there is no such user, or the look-up fails.
const char* userName(uid_t uid);

const uid_t UID_ROOT = 0;
const uid_t UID_ANNA = 1000;
const uid_t UID_UNREADABLE = 13; // its look-up fails

#endif
