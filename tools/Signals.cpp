#include "Signals.h"

namespace {

const int ENDING_SIGNALS[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM, SIGXFSZ};

volatile sig_atomic_t g_nWaiting = 0; // the last signal that an EndingPause has held up

void keepWaiting(int nSignal)
{
    g_nWaiting = nSignal;
}

} // namespace

namespace tool {

void handleEndingSignals(void (*handle)(int), void (*before)(int))
{
    for (const int nSignal : ENDING_SIGNALS) {
        struct sigaction action = {};
        sigaction(nSignal, nullptr, &action);
        if (before == action.sa_handler) {
            action.sa_handler = handle;
            action.sa_flags = static_cast<int>(SA_RESETHAND); // it interrupts system calls that wait
            sigaction(nSignal, &action, nullptr);
        }
    }
}

EndingPause::EndingPause()
{
    handleEndingSignals(keepWaiting);
}

EndingPause::~EndingPause()
{
    handleEndingSignals(SIG_DFL, keepWaiting);
    if (g_nWaiting) {
        raise(g_nWaiting);
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
