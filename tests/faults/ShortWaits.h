// Replaces usleep(): nobody waits for a lock here. Waits are counted, and end as if a signal came.

#ifndef TESTS_SHORT_WAITS_H
#define TESTS_SHORT_WAITS_H

// The number of waits since the last call.
int takeWaits();

#endif
