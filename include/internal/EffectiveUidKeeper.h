// Restores the effective uid at the end of a scope.

#ifndef VEMO_ACCESS_TOKEN_EFFECTIVE_UID_KEEPER_H
#define VEMO_ACCESS_TOKEN_EFFECTIVE_UID_KEEPER_H

#include <sys/types.h>
#include <unistd.h>

#include "internal/ErrnoKeeper.h"

namespace VEMO_ACCESS_TOKEN {

class EffectiveUidKeeper {
public:
    EffectiveUidKeeper() : m_uid(geteuid()) {}
    ~EffectiveUidKeeper()
    {
        if (UID_NONE != m_uid) {
            const ErrnoKeeper errnoKeeper;
            // Nothing can be done about a failure.
            [[maybe_unused]] const int nIgnored = seteuid(m_uid);
        }
    }
    EffectiveUidKeeper(const EffectiveUidKeeper&) = delete;
    EffectiveUidKeeper& operator=(const EffectiveUidKeeper&) = delete;
    void forget() { m_uid = UID_NONE; }

private:
    static constexpr uid_t UID_NONE = static_cast<uid_t>(-1);
    uid_t m_uid;
};

} // namespace VEMO_ACCESS_TOKEN

#endif
