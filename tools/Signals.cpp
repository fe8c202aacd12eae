#include "Signals.h"

namespace {

const int ENDING_SIGNALS[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGXFSZ};

} // namespace

namespace tool {

void handleEndingSignals(void (*handle)(int), void (*before)(int))
{
    for (const int nSignal : ENDING_SIGNALS) {
        struct sigaction action = {};
        sigaction(nSignal, nullptr, &action);
        if (before == action.sa_handler) {
            action.sa_handler = handle;
            action.sa_flags = static_cast<int>(SA_RESETHAND); // and calls that wait are not begun anew
            sigaction(nSignal, &action, nullptr);
        }
    }
}

SignalPause::SignalPause()
{
    sigset_t all;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, &m_before);
}

SignalPause::~SignalPause()
{
    pthread_sigmask(SIG_SETMASK, &m_before, nullptr);
}

} // namespace tool
