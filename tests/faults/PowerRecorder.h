// Records what calls of the library ask of the disk.

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

// A call that fails is an error. The program that uses this syncs nothing: fsync and fdatasync are recorded
// only, and so are known to have been called, on the directory as well.
Recording record(const TokenStore& store, const Files& files, const std::vector<std::function<int()>>& calls);

#endif
