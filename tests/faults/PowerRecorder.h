// Records what calls of the library request of the disk.

#ifndef TESTS_POWER_RECORDER_H
#define TESTS_POWER_RECORDER_H

#include <functional>
#include <vector>

#include "PowerDisk.h"
#include "TokenStore.h"

struct Recording {
    Files files; // found by the first call
    std::vector<DiskCall> calls;
};

// Throws when a call fails. In this program fsync and fdatasync only record that they were called, for the
// directory too.
Recording record(const TokenStore& store, const Files& files, const std::vector<std::function<int()>>& calls);

#endif
