// The calls around the opening of the database, and a database that is open.

#ifndef TESTS_OPENING_H
#define TESTS_OPENING_H

#include <functional>

#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

const uid_t UID_CALLER = 1000;
const std::string UPDATE = "UPDATE token SET extra = '%n%s';"; // of as many rows as there are
const std::string UNKNOWN = "Unknow Error!!";

const char* const UID = "geteuid";
const char* const RAISE = "seteuid 0";
const char* const ACCESS = "access " VEMO_ATOKEN_DB_PATH;
const char* const TOUCH = "open " VEMO_ATOKEN_DB_PATH;
const char* const CHMOD = "chmod " VEMO_ATOKEN_DB_PATH " 0700";
const char* const OPEN = "sqlite3_open " VEMO_ATOKEN_DB_PATH;
const std::string CREATE = "sqlite3_exec " + SCHEMA;
const char* const CHANGES = "sqlite3_changes";
const char* const BACK = "seteuid 1000";

// SQLite refuses a directory, and leaves a handle that can only be closed.
inline int refuseOpening(const char*, sqlite3** ppDb)
{
    const int nResult = sqlite3_open("/", ppDb);
    EXPECT_NE(nullptr, *ppDb);
    errno = EACCES;
    return nResult;
}

typedef std::function<void(const std::string& strPath)> Preparation;

inline Preparation openingWithoutHandle(int nResult, int nErrno)
{
    return [=](const std::string&) {
        seam().sqliteOpen = [=](const char*, sqlite3** ppDb) {
            *ppDb = nullptr;
            errno = nErrno;
            return nResult;
        };
    };
}

// Opens the database, writes two rows and forgets how.
inline void openWithTwoRows(AccessTokenDbApi& db)
{
    ASSERT_EQ(0, db.initDb());
    ASSERT_EQ(2, db.runSqlEx("INSERT INTO token (tid, deadline, function) VALUES ('a', -1, ''), "
                             "('b', NULL, '');",
                             nullptr, nullptr));
    seam() = Seam();
    errno = 0;
}

inline int countRow(void* pnRows, int, char**, char**)
{
    ++*static_cast<int*>(pnRows);
    return 0;
}

#endif
