// Statements that fail, and databases that are locked.

#ifndef TESTS_STATEMENTS_H
#define TESTS_STATEMENTS_H

#include <cerrno>
#include <string>
#include <vector>

#include "Seam.h"

// The answer to one try of a statement, which is then not run. SQLITE_OK runs it.
struct Answer {
    int nResult;
    const char* szError; // null: no text
    int nErrno = EIO;    // as the statement would leave it
};

const Answer RUN = {SQLITE_OK, nullptr};
const Answer DISK_ERROR = {SQLITE_IOERR, "disk I/O error"};
const Answer LOCKED = {SQLITE_BUSY, "database is locked"};

// Answers, in turn, the tries of the library's statements that start with strStart. Other statements are run,
// and these too when no answer is left.
void answerStatements(const std::string& strStart, const std::vector<Answer>& answers);

// Answers nTimes of them with a failure.
void failStatements(const std::string& strStart, const Answer& failure, int nTimes = 1);

// Calls something ahead of each of the library's statements, which is then run.
void beforeStatements(const std::function<void(const std::string& strSql)>& call);

// Another connection, which locks the database until the library has waited nWaits times, or (0) until this
// object is destroyed. Then strChange takes effect.
class Lock {
public:
    explicit Lock(const std::string& strPath, int nWaits = 0, const std::string& strChange = "");
    ~Lock();
    Lock(const Lock&) = delete;
    Lock& operator=(const Lock&) = delete;

private:
    void end();

    sqlite3* m_pDb = nullptr;
    int m_nWaits;
};

#endif
