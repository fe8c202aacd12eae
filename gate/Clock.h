// The monotonic clock, which is the same in both processes of the gate.

#ifndef GATE_CLOCK_H
#define GATE_CLOCK_H

#include <cstdint>
#include <ctime>

namespace gate {

const int64_t MILLISECOND = 1000000; // in ns
const int64_t SECOND = 1000 * MILLISECOND;

inline int64_t now()
{
    struct timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * SECOND + time.tv_nsec;
}

} // namespace gate

#endif
