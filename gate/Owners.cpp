#include "Owners.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <system_error>
#include <thread>

#include "Clock.h"
#include "Messages.h"
#include "vemouser.h"

namespace {

const int64_t FRESH = 10 * gate::SECOND; // an older name is looked up again
const int64_t KEPT = 60 * gate::SECOND;  // and stays in use until this age while the look-up takes long
const int64_t FAILING_KEPT = gate::SECOND;
const size_t OWNERS_MAX = 4096; // beyond, all are forgotten at once

} // namespace

namespace gate {

Owners::Owners(std::function<Owner(uid_t)> fLookUp)
    : m_fLookUp(std::move(fLookUp)), m_nEvent(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
{
    if (0 > m_nEvent) {
        throw std::system_error(errno, std::generic_category(), "eventfd");
    }
    // Detached, because it may be stuck in a user database when the process ends.
    std::thread([this] { run(); }).detach();
}

Owners::Owner Owners::find(uid_t uid)
{
    const std::lock_guard guard(m_mutex);
    const int64_t nNow = now();
    const auto it = m_owners.find(uid);
    const bool blKnown = it != m_owners.end() && nNow < it->second.nUntil;
    if (blKnown && (it->second.blAsked || nNow < it->second.nFreshUntil)) {
        return it->second;
    }
    if (m_owners.size() >= OWNERS_MAX) {
        m_owners.clear();
    }
    Owner& owner = m_owners[uid];
    if (!blKnown && !owner.blAsked) {
        owner = Owner();
    }
    if (!owner.blAsked) {
        owner.blAsked = true;
        m_queue.push_back(uid);
        m_asked.notify_one();
    }
    return blKnown ? owner : Owner();
}

void Owners::clear()
{
    eventfd_t nCount = 0;
    eventfd_read(m_nEvent, &nCount);
}

void Owners::run()
{
    for (std::unique_lock lock(m_mutex);;) {
        m_asked.wait(lock, [this] { return !m_queue.empty(); });
        const uid_t uid = m_queue.front();
        m_queue.pop_front();
        lock.unlock();
        Owner owner = m_fLookUp(uid);
        owner.nUntil = now() + (State::Failing == owner.state ? FAILING_KEPT : KEPT);
        owner.nFreshUntil = now() + FRESH;
        lock.lock();
        m_owners[uid] = owner;
        eventfd_write(m_nEvent, 1);
    }
}

Owners::Owner lookUpOwner(uid_t uid)
{
    VEMOUser* pUser = nullptr;
    const int nResult = VEMOUserGetByUID(uid, &pUser);
    const std::unique_ptr<VEMOUser, decltype(&VEMOUserFree)> pOwner(pUser, VEMOUserFree);
    Owners::Owner owner;
    if (0 > nResult || !pUser) {
        owner.state = 0 > nResult && ENOENT != errno ? Owners::State::Failing : Owners::State::Nobody;
        return owner;
    }
    owner.strName = pUser->szName;
    owner.state = owner.strName.empty() || owner.strName.size() > USER_MAX ? Owners::State::Nobody
                                                                           : Owners::State::Known;
    return owner;
}

} // namespace gate
