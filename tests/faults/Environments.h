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

// Thrown when this machine or user cannot provide an environment.
struct Unavailable : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// A umask, which the library must leave as it is.
Environment umaskOf(mode_t mode);

// Something else stands where the private directory or the database should be, and must still stand there
// afterwards. A link points to the real one.
enum class Thing { Nothing, EmptyFile, Directory, Link, DanglingLink, Fifo };
Environment directoryIs(Thing thing);
Environment databaseIs(Thing thing);

// The modes of the directory and the database. Both belong to the process's user, which stays the same or
// becomes another than root.
enum class User { Same, Other };
Environment modes(User user, mode_t modeDirectory, mode_t modeFile);

// Some of the descriptors 0 to 2 are closed. SQLite opens /dev/null in their places.
Environment closedDescriptors(const std::vector<int>& descriptors);

// Only nFree descriptors are free.
Environment freeDescriptors(size_t nFree);

// Files cannot grow beyond cbMax. The signal for that is ignored, or kills the process.
enum class Signal { Ignored, Kills };
Environment fileSizeLimit(size_t cbMax, Signal signal = Signal::Ignored);

// Another process holds a lock on the database and is stopped (SIGSTOP). It ends well once it is continued.
Environment stoppedHolder(const char* szSql);

// A small file system is mounted on the directory of the store. Only this process sees it.
Environment smallFileSystem();

// The file system has only cbFree bytes left, or is read-only.
Environment fullFileSystem(size_t cbFree);
Environment readOnlyFileSystem();

#endif
