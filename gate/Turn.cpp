#include "Turn.h"

#include <sys/eventfd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <thread>
#include <utility>

#include "Clock.h"

namespace {

// The gate leaves the lock to others for a fiftieth of the time, in pauses that are long enough for a
// sleeping program to wake up. If it has met no other program for a second, it leaves only one part in 200,
// because clients wait during each pause.
const int64_t PAUSE = gate::MILLISECOND / 2;
const int64_t PAUSE_EACH = 25 * gate::MILLISECOND;
const int64_t PAUSE_EACH_ALONE = 100 * gate::MILLISECOND;
const int64_t ALONE_AFTER = gate::SECOND;

} // namespace

namespace gate {

Turn::Turn() : m_nEvent(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)), m_nPauseAt(now() + PAUSE_EACH)
{
    if (0 > m_nEvent) {
        throw std::system_error(errno, std::generic_category(), "eventfd");
    }
    std::thread([this] { run(); }).detach(); // it may still wait for the lock when the process ends
}

bool Turn::take()
{
    const std::lock_guard guard(m_mutex);
    eventfd_t nCount = 0;
    eventfd_read(m_nEvent, &nCount);
    if (m_blWanted) {
        return false;
    }
    if (m_nError) {
        throw std::system_error(std::exchange(m_nError, 0), std::generic_category(), CallLock::FILE_OF_ALL);
    }
    if (m_lock) {
        return true;
    }
    if (now() < m_nPauseUntil) {
        return false;
    }
    try {
        m_lock.emplace(CallLock::FILE_OF_ALL, std::chrono::milliseconds(0));
        return true;
    } catch (const std::system_error& error) {
        if (ETIMEDOUT != error.code().value()) {
            throw;
        }
    }
    m_nMet = now();
    m_nPauseAt = std::min(m_nPauseAt, m_nMet + PAUSE_EACH);
    m_blWanted = true;
    m_wanted.notify_one();
    return false;
}

void Turn::give()
{
    const std::lock_guard guard(m_mutex);
    if (m_blWanted || !m_lock) {
        return;
    }
    m_lock.reset();
    const int64_t nNow = now();
    if (nNow >= m_nPauseAt) {
        m_nPauseUntil = nNow + PAUSE;
        const bool blAlone = nNow - m_nMet > ALONE_AFTER;
        m_nPauseAt = m_nPauseUntil + (blAlone ? PAUSE_EACH_ALONE : PAUSE_EACH);
    }
}

void Turn::run()
{
    for (std::unique_lock guard(m_mutex);;) {
        m_wanted.wait(guard, [this] { return m_blWanted; });
        guard.unlock(); // while m_blWanted is set, only this thread uses m_lock
        int nError = 0;
        try {
            m_lock.emplace();
        } catch (const std::system_error& error) {
            nError = error.code().value();
        }
        guard.lock();
        m_nError = nError;
        m_blWanted = false;
        eventfd_write(m_nEvent, 1);
    }
}

} // namespace gate
