// The seam between the library and the system. The test programs define the C functions that the library
// calls (Seam.cpp), so the shared object that ships calls these. They record each call and each log line,
// fail where a test demands it, and otherwise call the real function.
//
// Calls by SQLite and by the test itself go straight to the real function. The clock is shared with SQLite.
// getrandom, getpwuid_r and the allocation of arrays go to the seam whoever calls them, for tests into which
// the callers are linked.

#ifndef TESTS_SEAM_H
#define TESTS_SEAM_H

#include <pwd.h>
#include <sqlite3.h>
#include <sys/types.h>

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

typedef int (*SqlCallback)(void*, int, char**, char**);

struct Seam {
    // The calls in order: "geteuid", "seteuid 0", "access PATH", "open PATH", "chmod PATH 0700",
    // "sqlite3_open PATH", "sqlite3_exec SQL", "sqlite3_close", "usleep 10000",
    // "time", "sqlite3_mprintf FORMAT", "getrandom", "getpwuid_r UID", "operator new", "operator new[]".
    // usleep never really sleeps.
    std::vector<std::string> calls;

    // The calls whose first word is one of the names; and the SQL that was run.
    std::vector<std::string> callsOf(const std::vector<std::string>& names) const;
    std::vector<std::string> statements() const;

    // What the library logged, with the line numbers of source files as '#', since they may change:
    // "util.cpp:# ...". Lines in the system log read as they would on standard output, if their form is
    // right; and whether the last line went to the system log.
    std::vector<std::string> lines;
    bool blInSystemLog = false;

    // Functions that fail: the numbers (from 1) of the calls that fail, and the errno they set. They are
    // geteuid (answers (uid_t)-1), seteuid, access, open, chmod, sqlite3_mprintf (no memory), getrandom,
    // getpwuid_r (returns the errno), "operator new" and "operator new[]" (the non-throwing ones).
    struct Failure {
        int nFirst;
        int nLast;
        int nErrno;
    };
    std::map<std::string, Failure> failures;
    void fail(const std::string& strName, int nErrno, int nFirst = 1, int nLast = 1);

    // What is called instead of whole functions, when set. It may call the real ones.
    std::function<int(const char*, sqlite3**)> sqliteOpen;
    std::function<int(sqlite3*, const char*, SqlCallback, void*, char**)> sqliteExec;
    std::function<int(sqlite3*)> sqliteClose;
    std::function<int(uid_t, struct passwd*, char*, size_t, struct passwd**)> getUser;
    std::function<ssize_t(void*, size_t, unsigned int)> random; // getrandom

    // The real sqlite3_exec, but errno stays as it was, in the callback too. sqlite3_open and sqlite3_close
    // do the same. (SQLite itself may leave any errno, which differs between systems.)
    static int exec(sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument, char** pszError);

    // The time that the library and SQLite see, when set; seconds since the epoch.
    std::optional<time_t> clock;

    std::map<std::string, int> counts; // calls so far, by name
};

Seam& seam();

// When set, called before each allocation by operator new. It may throw, and may change errno.
extern void (*g_pAllocation)();

#endif
