// Judges an operation that ran while something failed.

#ifndef TESTS_ORACLE_H
#define TESTS_ORACLE_H

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "Operations.h"
#include "TokenStore.h"

const uid_t UID_CALLER = 1234; // the effective uid at which operations are judged

class Oracle {
public:
    // Runs the operation once without a fault, to learn its result.
    Oracle(const TokenStore& store, const Operation& operation);

    // Restores the store, runs the operation between arm() and disarm(), and returns what is wrong
    // afterwards, or "". What must hold:
    // - The store is sound, and is as before the operation, after its purge, or after all of it. After a
    //   success it is as after all of it. (The purge alone may be missing: an operation goes on without it.)
    // - Effective uid, umask, working directory, signal mask, descriptors and SQLite's memory are unchanged.
    //   The exception: if SQLite refuses to open the database, the effective uid stays 0.
    // - A failure is logged, or is the exception of an allocation that failed.
    // uidAfter() gives the effective uid to expect, for tests that make setting it fail.
    std::string judge(
        const std::function<void()>& arm, const std::function<void()>& disarm,
        const std::function<uid_t()>& uidAfter = [] { return UID_CALLER; }) const;

    // Whether a crash or a failure may leave the store in this state.
    bool allows(const std::string& strState) const;

private:
    std::optional<int> run() const; // nothing if there was no memory
    bool isDone(const std::string& strState) const;

    const TokenStore& m_store;
    const Operation& m_operation;
    std::string m_strBefore;
    std::string m_strPurged;
    std::string m_strAfter;
    std::string m_strAfterWithoutPurge;
    int m_nResult;
};

// Which calls of a run fail. A test asks whether the next one does.
struct Injection {
    int64_t nFirst = 0; // of those that fail
    int64_t nLast = -1;
    bool blRunning = false;
    int64_t nCalls = 0; // of the last run
    std::function<uid_t()> uidAfter = [] { return UID_CALLER; };
    // Calls judge(), which makes one run. A test can do more around it.
    std::function<void(const std::function<void()>& judge)> run = [](const auto& judge) { judge(); };

    bool fails() { return blRunning && nFirst <= ++nCalls && nCalls <= nLast; }
};

// Judges an operation without a fault; then, for each call that it made, with that call failing, and with
// that call and all later ones failing; and without a fault again. Returns the number of calls.
int64_t failEach(const TokenStore& store, const Operation& operation, Injection& injection);

// The same for all operations. At least one of them must make such a call.
void failEachOfAll(Injection& injection);

#endif
