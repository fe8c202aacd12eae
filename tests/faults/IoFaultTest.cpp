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

// Of the calls in which the fault can happen, nFirst to nLast fail.
struct Injection {
    Fault fault = Fault::Error;
    int64_t nFirst = 0;
    int64_t nLast = -1;
    int64_t nCalls = 0;

    int operator()(const FileCall& call, const std::function<int()>& real)
    {
        const int nAnswer = answerOf(fault, call);
        if (SQLITE_OK == nAnswer) {
            return real();
        }
        ++nCalls;
        if (nCalls < nFirst || nLast < nCalls) {
            return real();
        }
        if (Fault::TornWrite == fault) {
            call.write(call.cb / 2);
        }
        if (0 == strcmp("xClose", call.szName)) {
            real(); // whatever close answers, the descriptor is gone
        }
        return nAnswer;
    }
};

class IoFault : public ::testing::TestWithParam<std::pair<std::string, Fault>> {};

} // namespace

TEST_P(IoFault, LeavesAStateThatTheCallerKnows)
{
    const auto& [strName, fault] = GetParam();
    Injection injection;
    const FaultyVfs vfs(
        [&](const FileCall& call, const std::function<int()>& real) { return injection(call, real); });
    Injector injector;
    injector.arm = [&, kind = fault](int64_t nFirst, int64_t nLast) { injection = {kind, nFirst, nLast, 0}; };
    injector.disarm = [&] { injection.nLast = 0; };
    injector.calls = [&] { return injection.nCalls; };
    failEachOfAll("I/O faults", strName, injector);
}

INSTANTIATE_TEST_SUITE_P(Each, IoFault,
                         ::testing::Values(std::pair("Error", Fault::Error),
                                           std::pair("FullDisk", Fault::FullDisk),
                                           std::pair("TornWrite", Fault::TornWrite),
                                           std::pair("Locked", Fault::Locked)),
                         [](const auto& instance) { return instance.param.first; });
