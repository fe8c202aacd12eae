// The signals that end a process unless it handles them.

#ifndef TOOLS_SIGNALS_H
#define TOOLS_SIGNALS_H

#include <signal.h>

namespace tool {

// Has those handled that so far do what they do by default, or what else is named, each once: its second
// coming does what it does by default. Those that are ignored stay so.
void handleEndingSignals(void (*handle)(int), void (*before)(int) = SIG_DFL);

// While it lives, the first of these signals waits: it ends the process when this object goes. The second
// ends it at once.
class EndingPause {
public:
    EndingPause();
    ~EndingPause();
    EndingPause(const EndingPause&) = delete;
    EndingPause& operator=(const EndingPause&) = delete;
};

// Holds all signals up while it lives.
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
