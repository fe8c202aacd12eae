// The gate's turns at the lock of all programs (CallLock.h).

#ifndef GATE_TURN_H
#define GATE_TURN_H

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

#include "CallLock.h"

namespace gate {

// Takes the lock at once if it is free. If not, a thread waits for it in the kernel's queue, so that the gate
// gets its turn however busy others are. The gate also leaves the lock alone for short pauses, so that others
// get their turns however busy the gate is.
class Turn {
public:
    Turn();

    // Tries to take the lock, and returns whether it is held now. If not, try again when the descriptor is
    // readable, or after 1 ms. Throws std::system_error if the lock cannot be taken at all.
    bool take();

    // Frees the lock if it is held. If the thread still waits for it, the lock comes later, and the
    // descriptor becomes readable: call give() again then, if no call needs the lock.
    void give();

    int descriptor() const { return m_nEvent; }

private:
    void run();

    const int m_nEvent;
    std::mutex m_mutex;
    std::condition_variable m_wanted;
    std::optional<CallLock> m_lock;
    bool m_blWanted = false; // the thread waits for the lock
    int m_nError = 0;        // why the thread could not take the lock
    int64_t m_nPauseAt;      // when the next pause is due
    int64_t m_nPauseUntil = 0;
    int64_t m_nMet = 0; // when another program last had the lock
};

} // namespace gate

#endif
