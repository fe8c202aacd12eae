#include "World.h"

#include <pwd.h>
#include <sys/time.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <initializer_list>

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

INTERPOSED int getpwnam_r(const char* szName, struct passwd* pEntry, char*, size_t, struct passwd** ppEntry)
{
    *ppEntry = nullptr;
    for (const uid_t uid : {UID_ROOT, UID_ANNA}) {
        if (0 == strcmp(userName(uid), szName)) {
            pEntry->pw_name = const_cast<char*>(szName);
            pEntry->pw_uid = uid;
            *ppEntry = pEntry;
        }
    }
    return 0;
}

// Formats the line and discards it.
INTERPOSED void syslog(int, const char* szFormat, ...)
{
    char szLine[256];
    va_list args;
    va_start(args, szFormat);
    vsnprintf(szLine, sizeof(szLine), szFormat, args);
    va_end(args);
}

} // extern "C"
