// Runs each operation, so that callgrind counts its instructions. instructions.sh runs this program and reads
// the counts. With --environment it prints what the counts depend on instead.
//
// At the end of each turn (Turns.h) callgrind writes down the instructions since the turn began, under the
// name of who executed them. The last part of an operation is the library's own, under the operation's name.

#include <gnu/libc-version.h>
#include <json/version.h>
#include <pwd.h>
#include <sqlite3.h>
#include <sys/random.h>
#include <unistd.h>
#include <valgrind/callgrind.h>

#include <cstdio>
#include <cstring>

#include "Interpose.h"
#include "MeasuredCalls.h"
#include "Store.h"
#include "Turns.h"

namespace {

enum { SQLITE = LIBRARY + 1, STANDIN };
const char* const NAMES[] = {"own", "sqlite", "stand-in"}; // the last is not part of any count

bool g_blCounting = false;

} // namespace

int turnOf(const char*)
{
    return SQLITE;
}

void endTurn(int nTurn)
{
    if (g_blCounting) {
        CALLGRIND_DUMP_STATS_AT(NAMES[nTurn]);
    }
}

extern "C" {

// The redirection (examples/redirect.cpp) answers the next three.

INTERPOSED uid_t geteuid() noexcept
{
    const Turn turn(STANDIN);
    return NEXT(geteuid)();
}

INTERPOSED int seteuid(uid_t uid) noexcept
{
    const Turn turn(STANDIN);
    return NEXT(seteuid)(uid);
}

INTERPOSED int access(const char* szPath, int nMode) noexcept
{
    const Turn turn(STANDIN);
    return NEXT(access)(szPath, nMode);
}

// Always the same bytes, so that generated ids always have the same length.
INTERPOSED ssize_t getrandom(void* pBuffer, size_t cbBuffer, unsigned int /* flags */)
{
    const Turn turn(STANDIN);
    unsigned char* pByte = static_cast<unsigned char*>(pBuffer);
    for (size_t i = 0; i < cbBuffer; ++i) {
        pByte[i] = static_cast<unsigned char>(7 * i);
    }
    return static_cast<ssize_t>(cbBuffer);
}

// Always the same name, whatever users the machine has.
INTERPOSED int getpwuid_r(uid_t /* any */, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                          struct passwd** ppResult)
{
    const Turn turn(STANDIN);
    snprintf(szBuffer, cbBuffer, "example");
    pEntry->pw_name = szBuffer;
    *ppResult = pEntry;
    return 0;
}

} // extern "C"

namespace {

const int TOKENS = 10;

int count(const Operation& operation, Call& call)
{
    CALLGRIND_ZERO_STATS;
    g_blCounting = true;
    const int nResult = operation.run(call);
    g_blCounting = false;
    CALLGRIND_DUMP_STATS_AT(operation.szName);
    return nResult;
}

// Runs an operation twice: the count leaves out what only a first call does.
bool measure(const Operation& operation)
{
    for (const bool blCounted : {false, true}) {
        const Store store(Place::Memory, TOKENS);
        Call call;
        operation.prepare(call);
        const int nResult = blCounted ? count(operation, call) : operation.run(call);
        if (operation.nExpected != nResult) {
            fprintf(stderr, "%s returned %d\n", operation.szName, nResult);
            return false;
        }
    }
    return true;
}

void tellEnvironment()
{
#ifdef __clang__
    const char szCompiler[] = "clang++ " __clang_version__;
#else
    const char szCompiler[] = "g++ " __VERSION__;
#endif
#ifdef __CET__
    const char szHardened[] = ", hardened";
#else
    const char szHardened[] = "";
#endif
    printf("compiler: %s\nbuild: %s%s\n", szCompiler, VEMO_ATOKEN_FLAGS, szHardened);
    printf("SQLite: %s\njsoncpp: %s\n", sqlite3_libversion(), JSONCPP_VERSION_STRING);
    printf("C library: glibc %s\n", gnu_get_libc_version());
}

} // namespace

int main(int argc, char** argv)
{
    if (2 == argc && 0 == strcmp("--environment", argv[1])) {
        tellEnvironment();
        return 0;
    }
    for (const Operation& operation : operations()) {
        if (operation.run && !measure(operation)) {
            return 1;
        }
    }
    return 0;
}
