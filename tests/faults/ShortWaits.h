// Waits for a lock that are over at once, as if cut short by a signal, and counted.

#ifndef TESTS_SHORT_WAITS_H
#define TESTS_SHORT_WAITS_H

// How many there were since the last call.
int takeWaits();

#endif
