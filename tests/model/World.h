// The system around the library as this test has it: a clock that stands still until the test moves it, a few
// users, a disk that nobody waits for and a log that nobody reads. The library and SQLite see it too.

#ifndef TESTS_WORLD_H
#define TESTS_WORLD_H

#include <sys/types.h>

#include <ctime>

// In seconds since the epoch, and to be set.
time_t& worldClock();

const time_t YEAR_10000 = 253402300800; // SQLite has no dates from then on

// The user's name; null when there is no such user, or the look-up fails.
const char* userName(uid_t uid);

const uid_t UID_ROOT = 0;
const uid_t UID_ANNA = 1000;
const uid_t UID_UNREADABLE = 13; // its look-up fails

#endif
