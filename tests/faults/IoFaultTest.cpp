// Each call that SQLite makes on the store's files fails: that call alone, or that call and all later ones.

#include <gtest/gtest.h>

#include <cstring>

#include "FaultyVfs.h"
#include "Oracle.h"

namespace {

enum class Fault { Error, FullDisk, TornWrite, Locked };

// The error code for this kind of fault; SQLITE_OK if the fault cannot happen in this call.
int answerOf(Fault fault, const FileCall& call)
{
    const std::string strName = call.szName;
    const bool blWrite = "xWrite" == strName;
    switch (fault) {
    case Fault::Error:
        return "xOpen" == strName ? SQLITE_CANTOPEN : blWrite ? SQLITE_IOERR_WRITE : SQLITE_IOERR;
    case Fault::FullDisk: return blWrite ? SQLITE_FULL : SQLITE_OK;
    case Fault::TornWrite: return blWrite ? SQLITE_IOERR_WRITE : SQLITE_OK;
    case Fault::Locked: return "xLock" == strName ? SQLITE_BUSY : SQLITE_OK;
    }
    return SQLITE_OK;
}

class IoFault : public ::testing::TestWithParam<std::pair<std::string, Fault>> {};

} // namespace

TEST_P(IoFault, LeavesAStateThatTheCallerKnows)
{
    const Fault fault = GetParam().second;
    Injection injection;
    const FaultyVfs vfs([&](const FileCall& call, const std::function<int()>& real) {
        const int nAnswer = answerOf(fault, call);
        if (SQLITE_OK == nAnswer || !injection.fails()) {
            return real();
        }
        if (Fault::TornWrite == fault) {
            call.write(call.cb / 2);
        }
        if (0 == strcmp("xClose", call.szName)) {
            real(); // whatever close answers, the descriptor is gone
        }
        return nAnswer;
    });
    failEachOfAll("I/O faults", GetParam().first, injection);
}

INSTANTIATE_TEST_SUITE_P(Each, IoFault,
                         ::testing::Values(std::pair("Error", Fault::Error),
                                           std::pair("FullDisk", Fault::FullDisk),
                                           std::pair("TornWrite", Fault::TornWrite),
                                           std::pair("Locked", Fault::Locked)),
                         [](const auto& instance) { return instance.param.first; });
