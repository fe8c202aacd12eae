// The system calls of a process, told to another one before the kernel carries them out.

#ifndef TESTS_TOOL_SYSTEM_CALLS_H
#define TESTS_TOOL_SYSTEM_CALLS_H

#include <linux/seccomp.h>

#include <functional>

// The answer to a call: a number of errno, or one of these.
const int CARRY_OUT = 0;
const int PRETEND = -1; // it succeeds, and nothing happens

typedef std::function<int(const struct seccomp_data&)> Answer;

// From now on another process answers the calls of this one that are about files. Sends what that one needs
// through a socket. Returns whether the kernel does that; takes no memory.
bool letOtherAnswer(int nSocket);

// In that other process: answers until the first one has ended. Returns whether that one let it.
bool answerCalls(int nSocket, const Answer& answer);

bool drawsRandomNumbers(const struct seccomp_data& call);
bool isSync(const struct seccomp_data& call);
bool isWriteToStandardError(const struct seccomp_data& call);
bool takesRoomOnDisk(const struct seccomp_data& call);

#endif
