// The state of the process that a call of the library must not change; and what the call logged.

#ifndef TESTS_PROCESS_STATE_H
#define TESTS_PROCESS_STATE_H

#include <string>

// Umask, working directory, blocked signals, and the open descriptors with their files, in words.
std::string processState();

// What the library passed to syslog(), which this program replaces. It allocates no memory.
struct Log {
    static void clear();
    static const char* text();
    static std::string firstLine(); // without location, errno and statement
};

#endif
