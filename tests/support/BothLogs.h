// Tests of the store that are run with either destination of the log, and the stand-ins they share.

#ifndef TESTS_BOTH_LOGS_H
#define TESTS_BOTH_LOGS_H

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <functional>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

typedef int (*Callback)(void*, int, char**, char**);

const char* const FILE_NAME = "AccessTokenSqlite.cpp";
const std::string UPDATE = "UPDATE token SET extra = '%n%s';"; // of as many rows as there are
const std::string UNKNOWN = "Unknow Error!!";
const uid_t UID_CALLER = 1000;

const std::string SCHEMA =
    "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
    "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
    "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT);";

typedef std::vector<std::string> Texts;
const Texts NOTHING;

// A line with the errno at which it is written.
struct Line {
    std::string strOnStdout;
    int nErrno;
};

inline Line ordinaryLine(const std::string& strMessage, int nErrno = 0)
{
    return {ordinary(FILE_NAME, strMessage), nErrno};
}

inline Line failLine(const std::string& strMessage, int nErrno = 0)
{
    return {fail(FILE_NAME, strMessage, nErrno), nErrno};
}

inline Line failedLine(const std::string& strCondition, int nErrno = 0)
{
    return {failed(FILE_NAME, strCondition, nErrno), nErrno};
}

inline Texts onStdout(const std::vector<Line>& lines)
{
    Texts texts;
    for (const Line& line : lines) {
        texts.push_back(line.strOnStdout);
    }
    return texts;
}

// What a statement that fails at its first try writes to standard output. All of it is written at
// the errno that the caller then finds.
inline Texts failureOf(const std::string& strSql, const std::string& strError, int nErrno)
{
    return onStdout({ordinaryLine("i=0,run sql failed, error=" + strError + ", sql=" + strSql, nErrno),
                     failLine("run sql failed, sql=" + strSql, nErrno)});
}

// The system log shows errno ahead of the message.
inline Texts inSystemLog(const std::vector<Line>& lines)
{
    Texts texts;
    for (const Line& line : lines) {
        std::string strText = line.strOnStdout;
        if (0 != line.nErrno) {
            strText.insert(strText.find(' ') + 1, std::string("(") + strerror(line.nErrno) + ")");
        }
        texts.push_back(strText);
    }
    return texts;
}

// A case and where its lines are to go. Cases are aggregates with a szName, by which they go.
template <typename Case>
struct LogCase {
    Case theCase;
    Destination destination;
};

template <typename Case>
std::ostream& operator<<(std::ostream& stream, const LogCase<Case>& logCase)
{
    return stream << logCase.theCase.szName
                  << (Destination::Stdout == logCase.destination ? "OnStdout" : "InSystemLog");
}

template <typename Case>
auto inBothLogs(const std::vector<Case>& cases)
{
    std::vector<LogCase<Case>> logCases;
    for (const Case& theCase : cases) {
        logCases.push_back({theCase, Destination::Stdout});
        logCases.push_back({theCase, Destination::Syslog});
    }
    return ::testing::ValuesIn(logCases);
}

// Tests of each case once with the lines on standard output and once in the system log, over an
// empty directory. (Logging to standard output, once on, stays on; so StoreTest is no base.)
template <typename Case>
class InBothLogs : public ::testing::TestWithParam<LogCase<Case>> {
protected:
    void SetUp() override
    {
        std::string strTemplate = (std::filesystem::temp_directory_path() / "vemo-test-XXXXXX").string();
        ASSERT_NE(nullptr, mkdtemp(strTemplate.data())) << strerror(errno);
        m_strDirectory = strTemplate;
        setenv("VEMO_REDIRECT_DIR", m_strDirectory.c_str(), 1);
        if (Destination::Stdout == destination()) {
            VEMO_ACCESS_TOKEN::logToStdout(true);
        }
        seam() = Seam();
        errno = 0;
    }

    void TearDown() override
    {
        if (!m_strDirectory.empty()) {
            std::filesystem::remove_all(m_strDirectory);
        }
    }

    const Case& theCase() const { return this->GetParam().theCase; }
    Destination destination() const { return this->GetParam().destination; }
    std::string path() const { return m_strDirectory + "/vemo-access-token.db"; }

    void expectLines(const std::vector<Line>& lines) const
    {
        EXPECT_EQ(Destination::Stdout == destination() ? onStdout(lines) : inSystemLog(lines),
                  takeLines(destination()));
    }

private:
    std::string m_strDirectory;
};

// What a stand-in for sqlite3_exec answers to one try. SQLITE_OK runs the statement.
struct Answer {
    int nResult;
    const char* szError;
};

// Answers the tries of a statement in turn, and all further ones as the last; errno is then EIO
// after a failure and 0 after a success.
inline void answer(const std::vector<Answer>& answers)
{
    seam().sqliteExec = [answers, nTry = size_t(0)](sqlite3* pDb, const char* szSql, Callback callback,
                                                    void* pArgument, char** pszError) mutable {
        const Answer& now = answers[std::min(nTry++, answers.size() - 1)];
        if (SQLITE_OK == now.nResult) {
            EXPECT_EQ(SQLITE_OK, sqlite3_exec(pDb, szSql, callback, pArgument, nullptr));
        }
        *pszError = now.szError ? sqlite3_mprintf("%s", now.szError) : nullptr;
        errno = SQLITE_OK == now.nResult ? 0 : EIO;
        return now.nResult;
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

struct Switches {
    const char* szName;
    bool blDebug;
    bool blLog; // of cleanExpireToken
};

const Switches QUIET = {"Quiet", false, false};
const Switches LOUD = {"Loud", false, true};
const Switches DEBUG = {"Debug", true, false};
const Switches LOUD_DEBUG = {"LoudDebug", true, true};

class WithSwitches : public InBothLogs<Switches> {
protected:
    void SetUp() override
    {
        InBothLogs::SetUp();
        openWithTwoRows(m_db);
        if (theCase().blDebug) {
            VEMO_ACCESS_TOKEN::debugInfo(true);
        }
    }

    // Expects a line, always or in debug mode only.
    void say(const Line& line) { m_lines.push_back(line); }
    void sayInDebug(const Line& line)
    {
        if (theCase().blDebug) {
            say(line);
        }
    }

    AccessTokenDbApi m_db;
    std::vector<Line> m_lines;
};

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

#endif
