#include "Statements.h"

#include <gtest/gtest.h>

#include <utility>

#include "internal/ErrnoKeeper.h"

using VEMO_ACCESS_TOKEN::ErrnoKeeper;

void answerStatements(const std::string& strStart, const std::vector<Answer>& answers)
{
    seam().sqliteExec = [strStart, answers, nTry = size_t(0)](sqlite3* pDb, const char* szSql,
                                                              SqlCallback callback, void* pArgument,
                                                              char** pszError) mutable {
        const bool blMeant = 0 == std::string(szSql).compare(0, strStart.size(), strStart);
        const Answer answer = blMeant && nTry < answers.size() ? answers[nTry++] : RUN;
        if (SQLITE_OK == answer.nResult) {
            const int nResult = Seam::exec(pDb, szSql, callback, pArgument, pszError);
            if (answer.szError) {
                *pszError = sqlite3_mprintf("%s", answer.szError);
            }
            return nResult;
        }
        *pszError = answer.szError ? sqlite3_mprintf("%s", answer.szError) : nullptr;
        errno = answer.nErrno;
        return answer.nResult;
    };
}

void failStatements(const std::string& strStart, const Answer& failure, int nTimes)
{
    answerStatements(strStart, std::vector<Answer>(static_cast<size_t>(nTimes), failure));
}

void beforeStatements(const std::function<void(const std::string& strSql)>& call)
{
    seam().sqliteExec = [call](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                               char** pszError) {
        call(szSql);
        return Seam::exec(pDb, szSql, callback, pArgument, pszError);
    };
}

Lock::Lock(const std::string& strPath, int nWaits, const std::string& strChange) : m_nWaits(nWaits)
{
    const ErrnoKeeper keeper;
    const std::string strSql = "BEGIN EXCLUSIVE; " + strChange;
    EXPECT_EQ(SQLITE_OK, sqlite3_open(strPath.c_str(), &m_pDb));
    EXPECT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, strSql.c_str(), nullptr, nullptr, nullptr));
    seam().sleep = [this] {
        if (0 == --m_nWaits) {
            end();
        }
    };
}

Lock::~Lock()
{
    seam().sleep = nullptr;
    end();
}

void Lock::end()
{
    const ErrnoKeeper keeper;
    if (m_pDb) {
        EXPECT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, "COMMIT", nullptr, nullptr, nullptr));
        EXPECT_EQ(SQLITE_OK, sqlite3_close(std::exchange(m_pDb, nullptr)));
    }
}
