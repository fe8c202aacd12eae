#include "Aftermath.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include "Console.h"
#include "Failure.h"
#include "Processes.h"
#include "Values.h"

namespace {

// A statement waits for a lock 500 times 10 ms at most; a second is for what stands around that.
const std::chrono::seconds CALL_MAX(6);
const std::chrono::milliseconds LOOK_AGAIN_AFTER(10);
const std::chrono::microseconds LOOK_FOR_CLOSED_AFTER(100);

// One that was closed and opened again between two looks seems to be the old one.
void forgetClosed(std::vector<std::string>& strOpen)
{
    const auto isClosed = [](const std::string& strDescriptor) { return !tool::isOfDatabase(strDescriptor); };
    strOpen.erase(std::remove_if(strOpen.begin(), strOpen.end(), isClosed), strOpen.end());
}

// Returns who has had the database open all the time.
std::vector<std::string> outlast(const std::function<uint64_t()>& restore, uint64_t& nUndone)
{
    typedef std::chrono::steady_clock Clock;
    std::vector<std::string> strOpen = tool::databaseDescriptors();
    auto end = Clock::now() + CALL_MAX;
    for (;;) {
        const bool blLast = strOpen.empty() || Clock::now() >= end;
        const auto start = Clock::now();
        const uint64_t nAgain = restore();
        if (nAgain) {
            nUndone += nAgain;
            strOpen = tool::databaseDescriptors();
            end = Clock::now() + CALL_MAX;
        } else if (blLast) {
            break;
        } else {
            // It takes turns with the other programs, whom a look at many tokens keeps from committing.
            const auto pause = std::max<Clock::duration>(LOOK_AGAIN_AFTER, Clock::now() - start);
            for (const auto next = Clock::now() + pause; !strOpen.empty() && Clock::now() < next;) {
                forgetClosed(strOpen);
                std::this_thread::sleep_for(LOOK_FOR_CLOSED_AFTER);
            }
        }
        forgetClosed(strOpen);
    }
    return strOpen;
}

} // namespace

namespace tool {

void outlastCalls(const std::function<uint64_t()>& restore, const std::string& strUndone,
                  const std::string& strDone)
{
    uint64_t nUndone = 0;
    std::vector<std::string> strOpen;
    try {
        strOpen = outlast(restore, nUndone);
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
