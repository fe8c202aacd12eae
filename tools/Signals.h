// Handles the signals that end a process by default.

#ifndef TOOLS_SIGNALS_H
#define TOOLS_SIGNALS_H

#include <signal.h>

namespace tool {

// Handles these signals with handle(), each once: the second signal of a kind has its default effect. Leaves
// all signals alone whose handler is not the argument "before"; so ignored signals stay ignored.
void handleEndingSignals(void (*handle)(int), void (*before)(int) = SIG_DFL);

// While this object lives, these signals wait. Its destructor then ends the process by the last of them. A
// second signal of the same kind ends the process at once.
class EndingPause {
public:
    EndingPause();
    ~EndingPause();
    EndingPause(const EndingPause&) = delete;
    EndingPause& operator=(const EndingPause&) = delete;
};

// Blocks all signals of the thread while it lives.
class SignalPause {
public:
    SignalPause();
    ~SignalPause();
    SignalPause(const SignalPause&) = delete;
    SignalPause& operator=(const SignalPause&) = delete;

private:
    sigset_t m_before;
};

} // namespace tool

#endif
