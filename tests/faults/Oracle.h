// Judges an operation that ran while something failed.

#ifndef TESTS_ORACLE_H
#define TESTS_ORACLE_H

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>

#include "Operations.h"
#include "TokenStore.h"

const uid_t UID_CALLER = 1234; // the effective uid at which operations are judged

class Oracle {
public:
    // Runs the operation once undisturbed, to know what it gives.
    Oracle(const TokenStore& store, const Operation& operation);

    // Puts the store back, runs the operation between arm and disarm, and returns what is wrong with
    // how it ended, "" when nothing is:
    // - the store is sound and as before the operation, after its purge, or after all of it, never
    //   anything else; as after all of it when the operation reported success. (A purge that fails is no
    //   failure of the operation: all of it may be done but for that.)
    // - the effective uid, umask, working directory, signal mask, descriptors and SQLite's memory are as they
    //   were; but after an opening that SQLite refused the effective uid stays 0
    // - a failure has its log line, or is the exception of an allocation that failed
    // A test that takes the effective uid away itself says in uidAfter what is to be left of it.
    std::string judge(
        const std::function<void()>& arm, const std::function<void()>& disarm,
        const std::function<uid_t()>& uidAfter = [] { return UID_CALLER; }) const;

    // Whether the store may be left so by a crash or a failure.
    bool allows(const std::string& strState) const;

private:
    struct Ending {
        int nResult;
        bool blNoMemory;
    };
    Ending run() const;
    bool isDone(const std::string& strState) const;

    const TokenStore& m_store;
    const Operation& m_operation;
    std::string m_strBefore;
    std::string m_strPurged;
    std::string m_strAfter;
    std::string m_strAfterWithoutPurge;
    int m_nResult;
};

// What lets calls fail: those from nFirst to nLast of a run.
struct Injector {
    std::function<void(int64_t nFirst, int64_t nLast)> arm;
    std::function<void()> disarm;
    std::function<int64_t()> calls; // of the last run
    std::function<uid_t()> uidAfter = [] { return UID_CALLER; };
    // Runs and judges; for more than that.
    std::function<void(const std::function<void()>& judge)> run = [](const auto& judge) { judge(); };
};

// Judges an operation undisturbed, then with each of the calls failing that it made, that one alone and all
// from that one on, and undisturbed again. Returns how many calls there were.
int64_t failEach(const TokenStore& store, const Operation& operation, const Injector& injector);

// Does so with all operations, and prints how many runs there were.
void failEachOfAll(const std::string& strKind, const std::string& strName, const Injector& injector);

#endif
