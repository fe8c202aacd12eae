#include "World.h"

#include <pwd.h>
#include <sys/time.h>

#include <cerrno>
#include <cstring>

#include "Interpose.h"

time_t& worldClock()
{
    static time_t now = 1700000000;
    return now;
}

const char* userName(uid_t uid)
{
    return UID_ROOT == uid ? "root" : UID_ANNA == uid ? "anna" : nullptr;
}

extern "C" {

INTERPOSED time_t time(time_t* pTime) noexcept
{
    if (pTime) {
        *pTime = worldClock();
    }
    return worldClock();
}

// The clock of SQLite.
INTERPOSED int gettimeofday(struct timeval* pTime, void*) noexcept
{
    pTime->tv_sec = worldClock();
    pTime->tv_usec = 0;
    return 0;
}

INTERPOSED int getpwuid_r(uid_t uid, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                          struct passwd** ppEntry)
{
    const char* szName = userName(uid);
    *ppEntry = nullptr;
    if (UID_UNREADABLE == uid) {
        return EIO;
    }
    if (szName) {
        pEntry->pw_name = strncpy(szBuffer, szName, cbBuffer);
        *ppEntry = pEntry;
    }
    return 0;
}

INTERPOSED int fsync(int)
{
    return 0;
}

INTERPOSED int fdatasync(int)
{
    return 0;
}

INTERPOSED void syslog(int, const char*, ...) {}

} // extern "C"
