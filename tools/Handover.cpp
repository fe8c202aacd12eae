#include "Handover.h"

#include <csignal>

#include "AccessTokenUtil.h"
#include "Change.h"
#include "Console.h"
#include "Failure.h"
#include "Signals.h"

namespace {

volatile sig_atomic_t g_nSignal = 0; // the signal that came since handOver() began, or 0

void noteSignal(int nSignal)
{
    g_nSignal = nSignal;
}

// Undoes the change. Returns what to say about that.
std::string takeBack(const tool::Undo& undo)
{
    const std::string strChange = tool::hasChanged() ? "was made" : "may have been made";
    try {
        tool::Store store(tool::Store::Access::Write);
        const std::string strDone = undo(store);
        store.commit();
        return strDone;
    } catch (const tool::Failure& failure) {
        return "the change " + strChange + ", and cannot be taken back: " + failure.fact();
    }
}

// Commits, and prints the id of a token that exists now.
void complete(std::unique_ptr<tool::Store> pStore, const std::string& strResult)
{
    pStore->commit();
    pStore.reset();
    if (g_nSignal) {
        throw tool::Failure(tool::EXIT_STATUS_STORE, "interrupted");
    }
    signal(SIGPIPE, SIG_IGN); // without a reader, write() fails instead
    tool::print(strResult);
    tool::flushResult(); // a signal ends the wait for a slow reader
}

} // namespace

namespace tool {

std::string newTid()
{
    std::string strTid;
    if (0 > VEMO_ACCESS_TOKEN::tokenGenerate(strTid)) {
        throw Failure(EXIT_STATUS_STORE, "the kernel gives no random numbers");
    }
    return strTid;
}

void handOver(std::unique_ptr<Store> pStore, const std::string& strResult, const Undo& undo)
{
    handleEndingSignals(noteSignal);
    try {
        complete(std::move(pStore), strResult);
    } catch (const LockedFailure&) {
        throw; // then the token was not created
    } catch (const Failure& failure) {
        const std::string strDone = takeBack(undo);
        if (!g_nSignal) {
            throw Failure(failure.status(), failure.fact(), strDone);
        }
        complain(strDone.empty() ? "interrupted" : "interrupted; " + strDone);
    }
    handleEndingSignals(SIG_DFL, noteSignal);
    if (g_nSignal) {
        raise(g_nSignal);
    }
}

} // namespace tool
