// Statements that fail, and databases that are locked.

#ifndef TESTS_STATEMENTS_H
#define TESTS_STATEMENTS_H

#include <gtest/gtest.h>

#include <cerrno>
#include <string>
#include <utility>
#include <vector>

#include "Seam.h"
#include "internal/ErrnoKeeper.h"

// What one try of a statement gets for an answer; it is not run. SQLITE_OK runs it.
struct SqlAnswer {
    int nResult;
    const char* szError; // null: no text
    int nErrno = EIO;    // as the statement would leave it
};

const SqlAnswer RUN = {SQLITE_OK, nullptr};
const SqlAnswer DISK_ERROR = {SQLITE_IOERR, "disk I/O error"};
const SqlAnswer LOCKED = {SQLITE_BUSY, "database is locked"};

// Answers, in turn, the tries of the library's statements that start with strStart. Other statements are run,
// and these too when no answer is left.
inline void answerStatements(const std::string& strStart, const std::vector<SqlAnswer>& answers)
{
    seam().sqliteExec = [strStart, answers, nTry = size_t(0)](sqlite3* pDb, const char* szSql,
                                                              SqlCallback callback, void* pArgument,
                                                              char** pszError) mutable {
        const bool blMeant = 0 == std::string(szSql).compare(0, strStart.size(), strStart);
        const SqlAnswer answer = blMeant && nTry < answers.size() ? answers[nTry++] : RUN;
        int nResult = answer.nResult;
        if (SQLITE_OK == nResult) {
            nResult = Seam::exec(pDb, szSql, callback, pArgument, pszError);
        } else {
            errno = answer.nErrno;
        }
        if (answer.szError) {
            *pszError = sqlite3_mprintf("%s", answer.szError);
        }
        return nResult;
    };
}

// Answers nTimes of them with a failure.
inline void failStatements(const std::string& strStart, const SqlAnswer& failure, int nTimes = 1)
{
    answerStatements(strStart, std::vector<SqlAnswer>(static_cast<size_t>(nTimes), failure));
}

// Calls something ahead of each of the library's statements, which is then run.
inline void beforeStatements(const std::function<void(const std::string& strSql)>& call)
{
    seam().sqliteExec = [call](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                               char** pszError) {
        call(szSql);
        return Seam::exec(pDb, szSql, callback, pArgument, pszError);
    };
}

// Another connection, which locks the database until the library has waited nWaits times. Then strChange
// takes effect.
class Lock {
public:
    Lock(const std::string& strPath, int nWaits, const std::string& strChange = "") : m_nWaits(nWaits)
    {
        const VEMO_ACCESS_TOKEN::ErrnoKeeper keeper;
        const std::string strSql = "BEGIN EXCLUSIVE; " + strChange;
        EXPECT_EQ(SQLITE_OK, sqlite3_open(strPath.c_str(), &m_pDb));
        EXPECT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, strSql.c_str(), nullptr, nullptr, nullptr));
        seam().sleep = [this] {
            if (0 == --m_nWaits) {
                EXPECT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, "COMMIT", nullptr, nullptr, nullptr));
            }
        };
    }
    ~Lock()
    {
        const VEMO_ACCESS_TOKEN::ErrnoKeeper keeper;
        seam().sleep = nullptr;
        EXPECT_EQ(SQLITE_OK, sqlite3_close(m_pDb));
    }
    Lock(const Lock&) = delete;
    Lock& operator=(const Lock&) = delete;

private:
    sqlite3* m_pDb = nullptr;
    int m_nWaits;
};

#endif
