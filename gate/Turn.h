// The gate's turns at the lock that programs take for a call.

#ifndef GATE_TURN_H
#define GATE_TURN_H

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

#include "CallLock.h"

namespace gate {

// Takes the lock at once where it is free. Where it is not, a thread waits in the line of those who want it,
// so that the gate gets its turn however busy the others are. And it leaves the lock alone for a moment now
// and then, so that the others get theirs however busy the gate is.
class Turn {
public:
    Turn();

    // Whether the lock is held now. If not, try again when the descriptor is readable, or after 1 ms. Throws
    // std::system_error when it cannot be had at all.
    bool take();

    // Frees the lock, if it is held. While the thread still waits for it, it comes later, and the descriptor
    // tells: whoever has no use for it any more gives it again then.
    void give();

    int descriptor() const { return m_nEvent; }

private:
    void run();

    const int m_nEvent;
    std::mutex m_mutex;
    std::condition_variable m_wanted;
    std::optional<CallLock> m_lock;
    bool m_blWanted = false; // the thread waits for the lock
    int m_nError = 0;        // why it could not have it
    int64_t m_nPauseAt;      // when to leave the lock alone
    int64_t m_nPauseUntil = 0;
    int64_t m_nMet = 0; // when another had the lock
};

} // namespace gate

#endif
