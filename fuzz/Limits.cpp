// Limits for SQL in a database or in a filter, which must not disturb the fuzzer. Each new connection gets
// them.

#include <sqlite3.h>
#include <strings.h>
#include <unistd.h>

#include <cstring>

#include "Interpose.h"

namespace {

const int STEPS_MAX = 20000; // instructions of a statement
const int LENGTH_MAX = 1 << 20;

// With random values, two readings would differ.
int isAllowed(void*, int nAction, const char* szName, const char* szFunction, const char*, const char*)
{
    const bool blChance =
        SQLITE_FUNCTION == nAction && 0 == strncasecmp(szFunction, "random", strlen("random"));
    const bool blPragma =
        SQLITE_PRAGMA == nAction && 0 != strcmp(szName, "auto_vacuum") && 0 != strcmp(szName, "encoding");
    return blChance || blPragma || SQLITE_ATTACH == nAction ? SQLITE_DENY : SQLITE_OK;
}

int stop(void*)
{
    return 1;
}

int limit(sqlite3* pDb, char**, const struct sqlite3_api_routines*)
{
    sqlite3_limit(pDb, SQLITE_LIMIT_LENGTH, LENGTH_MAX);
    sqlite3_progress_handler(pDb, STEPS_MAX, stop, nullptr);
    return sqlite3_set_authorizer(pDb, isAllowed, nullptr);
}

const int g_nLimited = sqlite3_auto_extension(reinterpret_cast<void (*)()>(limit));

} // namespace

// A trigger can feign a lock.
extern "C" INTERPOSED int usleep(useconds_t)
{
    return 0;
}
