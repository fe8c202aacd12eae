// The state of the process that a call of the library must not change; and what the call logged.

#ifndef TESTS_PROCESS_STATE_H
#define TESTS_PROCESS_STATE_H

#include <signal.h>
#include <sys/types.h>

#include <string>

struct ProcessState {
    uid_t uidEffective;
    mode_t umask;
    std::string strDirectory;
    std::string strBlockedSignals;
    std::string strDescriptors;

    static ProcessState now();

    // How another state differs from this one, "" when it does not.
    std::string differenceTo(const ProcessState& other) const;
};

// What the library passed to syslog(), which this program replaces. It allocates no memory.
struct Log {
    static void clear();
    static const char* text();
    static std::string firstLine(); // without location, errno and statement
};

#endif
