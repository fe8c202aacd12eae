// Limits for SQL in a database or in a filter, which must not disturb the fuzzer.

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

} // namespace

extern "C" {

INTERPOSED int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    const int nResult = NEXT(sqlite3_open)(szPath, ppDb);
    sqlite3_limit(*ppDb, SQLITE_LIMIT_LENGTH, LENGTH_MAX);
    sqlite3_progress_handler(*ppDb, STEPS_MAX, stop, nullptr);
    sqlite3_set_authorizer(*ppDb, isAllowed, nullptr);
    return nResult;
}

// A trigger can feign a lock.
INTERPOSED int usleep(useconds_t)
{
    return 0;
}

} // extern "C"
