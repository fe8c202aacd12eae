// Each call of an operation fails: that call alone, or that call and all later ones. First the system calls
// that open the store, the library's own and SQLite's; then the calls that SQLite makes on the store's files.
// (In ShortWaits.h, waits for a lock fail.)

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <map>

#include "FaultyVfs.h"
#include "Interpose.h"
#include "Oracle.h"

namespace {

Injection g_injection;
const char* g_szFunction = "";
bool g_blUidUnknown = false; // at the last question
bool g_blUidRaised = false;  // to 0
bool g_blUidLost = false;    // raised while unknown, or the last try to put it back failed

bool fails(const char* szName)
{
    const bool blFails = 0 == strcmp(szName, g_szFunction) && g_injection.fails();
    errno = blFails ? EACCES : errno;
    return blFails;
}

class SystemCallFault : public ::testing::TestWithParam<const char*> {};

// The errors of SQLite's calls on files, by the name of the call. If the other calls cannot fail in that way,
// nOthers is SQLITE_OK.
struct FileFault {
    std::map<std::string, int> answers;
    int nOthers;
};

const std::map<std::string, FileFault> FILE_FAULTS = {
    {"Error", {{{"xOpen", SQLITE_CANTOPEN}, {"xWrite", SQLITE_IOERR_WRITE}}, SQLITE_IOERR}},
    {"FullDisk", {{{"xWrite", SQLITE_FULL}}, SQLITE_OK}},
    {"TornWrite", {{{"xWrite", SQLITE_IOERR_WRITE}}, SQLITE_OK}},
    {"Locked", {{{"xLock", SQLITE_BUSY}}, SQLITE_OK}},
};

class IoFault : public ::testing::TestWithParam<const char*> {};

} // namespace

extern "C" {

uid_t geteuid() noexcept
{
    g_blUidUnknown = fails("geteuid");
    return g_blUidUnknown ? static_cast<uid_t>(-1) : NEXT(geteuid)();
}

int seteuid(uid_t uid) noexcept
{
    const bool blFails = fails("seteuid");
    if (0 == uid) {
        g_blUidRaised = !blFails;
    }
    g_blUidLost = g_blUidRaised && (0 == uid ? g_blUidUnknown : blFails);
    return blFails ? -1 : NEXT(seteuid)(uid);
}

int access(const char* szPath, int nMode) noexcept
{
    return fails("access") ? -1 : NEXT(access)(szPath, nMode);
}

int chmod(const char* szPath, mode_t mode) noexcept
{
    return fails("chmod") ? -1 : NEXT(chmod)(szPath, mode);
}

#define OPEN(name)                                                                                           \
    int name(const char* szPath, int nFlags, ...)                                                            \
    {                                                                                                        \
        va_list args;                                                                                        \
        va_start(args, nFlags);                                                                              \
        const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;                                   \
        va_end(args);                                                                                        \
        return fails("open") ? -1 : NEXT(name)(szPath, nFlags, mode);                                        \
    }
OPEN(open)
OPEN(open64)

} // extern "C"

TEST_P(SystemCallFault, LeavesAStateThatTheCallerKnows)
{
    g_szFunction = GetParam();
    g_injection.uidAfter = [] { return g_blUidLost ? 0 : UID_CALLER; };
    failEachOfAll(g_injection);
}

INSTANTIATE_TEST_SUITE_P(Each, SystemCallFault,
                         ::testing::Values("geteuid", "seteuid", "access", "chmod", "open"),
                         [](const auto& instance) { return instance.param; });

TEST_P(IoFault, LeavesAStateThatTheCallerKnows)
{
    const std::string strFault = GetParam();
    const FileFault& fault = FILE_FAULTS.at(strFault);
    Injection injection;
    const FaultyVfs vfs([&](const FileCall& call, const std::function<int()>& real) {
        const auto pAnswer = fault.answers.find(call.szName);
        const int nAnswer = fault.answers.end() == pAnswer ? fault.nOthers : pAnswer->second;
        if (SQLITE_OK == nAnswer || !injection.fails()) {
            return real();
        }
        if ("TornWrite" == strFault) {
            call.write(call.cb / 2);
        }
        if (0 == strcmp("xClose", call.szName)) {
            real(); // whatever close returns, the descriptor is closed
        }
        return nAnswer;
    });
    failEachOfAll(injection);
}

INSTANTIATE_TEST_SUITE_P(Each, IoFault, ::testing::Values("Error", "FullDisk", "TornWrite", "Locked"),
                         [](const auto& instance) { return instance.param; });
