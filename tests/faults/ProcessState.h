// What a call of the library must leave as it was, and what it logged.

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

// The lines that the library handed to syslog, which this program takes the place of. Takes no memory
// from the heap.
struct Log {
    static void clear();
    static const char* text();
    static std::string firstLine(); // without location, errno and statement
};

#endif
