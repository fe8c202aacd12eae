#include "Aftermath.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include "AccessTokenDefine.h"
#include "Console.h"
#include "Failure.h"
#include "Processes.h"
#include "Values.h"

namespace {

typedef std::chrono::steady_clock Clock;

// A call writes a token back by one statement, which waits for a lock 500 times 10 ms at most. One more
// second is for the rest of the call.
const std::chrono::seconds CALL_MAX(6);
const std::chrono::milliseconds LOOK_AGAIN_AFTER(10);
const std::chrono::microseconds LOOK_FOR_CLOSED_AFTER(100);
const int RESTORED_MAX = 20; // after that, some call has always read what another has just written back

// No call has undone the change, but the database has.
class UndoneByDatabase : public tool::Failure {
    using Failure::Failure;
};

// Removes the closed descriptors. One that was closed and opened again between two looks counts as open.
void forgetClosed(std::vector<std::string>& strOpen)
{
    const auto isClosed = [](const std::string& strDescriptor) { return !tool::isOfDatabase(strDescriptor); };
    strOpen.erase(std::remove_if(strOpen.begin(), strOpen.end(), isClosed), strOpen.end());
}

// Waits until all descriptors are closed, at most as long as wait says.
void waitForClosed(std::vector<std::string>& strOpen, Clock::duration wait)
{
    for (const auto end = Clock::now() + wait; !strOpen.empty() && Clock::now() < end;) {
        std::this_thread::sleep_for(LOOK_FOR_CLOSED_AFTER);
        forgetClosed(strOpen);
    }
}

// Watches until each process that has the database open has closed it, or has had the time of the longest
// call. Returns true at once if the change was undone.
bool isUndoneMeanwhile(const tool::Change& change, std::vector<std::string>& strOpen)
{
    strOpen = tool::databaseDescriptors();
    const auto end = Clock::now() + CALL_MAX;
    for (;;) {
        const bool blLast = strOpen.empty() || Clock::now() >= end;
        const auto start = Clock::now();
        if (change.isUndone()) {
            return true;
        }
        if (blLast) {
            return false;
        }
        // A look at many tokens keeps others from committing. So the pause is as long as the look was.
        waitForClosed(strOpen, std::max<Clock::duration>(LOOK_AGAIN_AFTER, Clock::now() - start));
    }
}

uint64_t restore(const tool::Change& change)
{
    tool::Store store(tool::Store::Access::Write);
    const uint64_t nUndone = change.makeAgain(store);
    store.commit();
    return nUndone;
}

// Restores the change until it is complete, and then keeps all others from writing. A call that is under way
// then gives up, and a call that begins reads the tokens as they are now.
uint64_t restoreAndHold(const tool::Change& change, std::vector<std::string>& strOpen)
{
    uint64_t nUndone = 0;
    for (;;) {
        tool::Store store(tool::Store::Access::Write);
        const uint64_t nAgain = change.makeAgain(store);
        if (0 == nAgain) {
            strOpen = tool::databaseDescriptors();
            waitForClosed(strOpen, CALL_MAX);
            return nUndone;
        }
        if (0 != change.makeAgain(store)) { // although nobody else has written since
            throw UndoneByDatabase(tool::EXIT_STATUS_STORE,
                                   VEMO_ATOKEN_DB_PATH " itself undoes each change: a trigger does that",
                                   "\"vemo-access-token doctor\" tells what helps");
        }
        store.commit();
        nUndone += nAgain;
    }
}

// Returns the descriptors of those who had the database open all the time.
std::vector<std::string> outlast(const tool::Change& change, uint64_t& nUndone)
{
    std::vector<std::string> strOpen;
    for (int i = 0; i < RESTORED_MAX; ++i) {
        if (!isUndoneMeanwhile(change, strOpen)) {
            return strOpen;
        }
        nUndone += restore(change);
    }
    nUndone += restoreAndHold(change, strOpen);
    return strOpen;
}

} // namespace

namespace tool {

void outlastCalls(const Change& change, const std::string& strUndone, const std::string& strDone)
{
    uint64_t nUndone = 0;
    std::vector<std::string> strOpen;
    try {
        strOpen = outlast(change, nUndone);
    } catch (const UndoneByDatabase&) {
        throw;
    } catch (const Failure& failure) {
        throw Failure(failure.status(), failure.fact(),
                      "the change was made, but calls that were under way can have undone it");
    }
    if (nUndone) {
        complain(strUndone + " " + countText(nUndone, "time") +
                 ", by calls that do not take the lock, and was " + strDone + " again");
    }
    if (!canSeeProcesses()) {
        complain("/proc does not tell who has the database open: what was read before can still be written "
                 "back");
    }
    if (!strOpen.empty()) {
        complain(ownersText(strOpen) +
                 " had the database open all the time: what it read before can still be "
                 "written back; look again when it has ended");
    }
}

} // namespace tool
