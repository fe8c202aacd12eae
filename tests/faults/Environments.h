// Environments that a call of the library may meet.

#ifndef TESTS_ENVIRONMENTS_H
#define TESTS_ENVIRONMENTS_H

#include <sys/types.h>

#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "TokenStore.h"

// Enters an environment, and returns how to leave it.
typedef std::function<std::function<void()>(const TokenStore&)> Environment;

// What an environment throws that cannot be had here.
struct Unavailable : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// The library must not change the umask.
Environment umaskOf(mode_t mode);

// What stands in the place of the private directory, or of the database; it must still be there afterwards. A
// link leads to the real one.
enum class Thing { Nothing, EmptyFile, Directory, Link, DanglingLink, Fifo };
Environment directoryIs(Thing thing);
Environment databaseIs(Thing thing);

// The modes of the directory and of the database, which belong to the user of the process: to the one that it
// has, or to another than root.
enum class User { Same, Other };
Environment modes(User user, mode_t modeDirectory, mode_t modeFile);

// Some of the descriptors 0 to 2 are closed. SQLite opens /dev/null in their places.
Environment closedDescriptors(const std::vector<int>& descriptors);

// Only so many descriptors are free.
Environment freeDescriptors(size_t nFree);

// Files cannot grow beyond a size. The signal that tells so is ignored, or kills the process.
enum class Signal { Ignored, Kills };
Environment fileSizeLimit(size_t cbMax, Signal signal = Signal::Ignored);

// Another process holds a lock on the database and is stopped. Continued, it ends as it should.
Environment stoppedHolder(const char* szSql);

// A small file system below the directory of the store, which only this process sees.
Environment smallFileSystem();

// It is full but for some bytes, or may only be read.
Environment fullFileSystem(size_t cbFree);
Environment readOnlyFileSystem();

#endif
