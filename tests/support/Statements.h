// Statements that fail.

#ifndef TESTS_STATEMENTS_H
#define TESTS_STATEMENTS_H

#include <cerrno>
#include <string>
#include <vector>

#include "Seam.h"

// The answer to one try of a statement, which is then not run. SQLITE_OK runs it.
struct SqlAnswer {
    int nResult;
    const char* szError; // null: no text
    int nErrno = EIO;    // as the statement would leave it
};

const SqlAnswer RUN = {SQLITE_OK, nullptr};
const SqlAnswer DISK_ERROR = {SQLITE_IOERR, "disk I/O error"};
const SqlAnswer LOCKED = {SQLITE_BUSY, "database is locked"};

// Answers, one after the other, the tries of the library's statements that start with strStart. Other
// statements are run, and these too when no answer is left.
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

// Answers nTimes of these tries with a failure.
inline void failStatements(const std::string& strStart, const SqlAnswer& failure, int nTimes = 1)
{
    answerStatements(strStart, std::vector<SqlAnswer>(static_cast<size_t>(nTimes), failure));
}

// Calls a function before each of the library's statements, which is then run.
inline void beforeStatements(const std::function<void(const std::string& strSql)>& call)
{
    seam().sqliteExec = [call](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                               char** pszError) {
        call(szSql);
        return Seam::exec(pDb, szSql, callback, pArgument, pszError);
    };
}

#endif
