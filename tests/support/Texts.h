// The texts that tests expect: log lines, statements and JSON.

#ifndef TESTS_TEXTS_H
#define TESTS_TEXTS_H

#include <json/json.h>

#include <cerrno>
#include <string>
#include <vector>

#include "Seam.h"

typedef std::vector<std::string> Texts;

Texts operator+(Texts left, const Texts& right);

// The texts with a separator between.
std::string joined(const Texts& texts, const char* szSeparator);

// JSON text as a value (the text is well-formed), and a value as compact text.
Json::Value json(const std::string& strText);
std::string text(const Json::Value& jValue);

// The files that log lines come from.
const char* const UTIL = "util.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const SERVICE = "AccessTokenApi.cpp";
const char* const WRAPPER = "AccessTokenWrapper.cpp";

// The field list at one of its lines.
std::string fieldList(int nLine);

// Statements. Values stand in them as they are quoted.
inline const std::string PURGE = "DELETE FROM token where deadline < strftime('%s', 'now');";
inline const std::string SCHEMA =
    "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
    "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
    "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT);";
inline const std::string SELECT =
    "SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token ";

std::string selectSql(const std::string& strTid);
std::string deleteSql(const std::string& strField, const std::string& strValue);

// The lines of the log, as the seam holds them. strFile is a source file, whose line numbers read '#', or the
// field list at a line. An ordinary line;
std::string ordinary(const std::string& strFile, const std::string& strMessage);
// a failure line with a message of its own, written while errno is nErrno;
std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno = 0);
// the failure line of a condition;
std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno = 0);
// those of several conditions, which report one failure on its way up;
Texts allFailed(const std::string& strFile, const Texts& conditions, int nErrno = 0);
// what the store logs of a statement that fails at its first try;
Texts failureOf(const std::string& strSql, const std::string& strError, int nErrno = 0);
// and lines in the system log, which shows errno ahead of the message as well.
Texts inSystemLog(Texts lines, int nErrno);

// What the store logs when it may not become root, and so cannot open the database for a statement.
const std::string NOT_ROOT = failed(STORE, "0 > seteuid(0)", EPERM);
const Texts NOT_OPENED = {NOT_ROOT, failed(STORE, "0 > initDb()", EPERM)};

// The lines logged since the last call.
Texts takeLines();

// Expects these lines, texts or one list of them; and that a call returns -1 and logs them.
#define EXPECT_LINES(...) EXPECT_EQ((Texts{__VA_ARGS__}), takeLines())
#define EXPECT_FAILURE(call, ...)                                                                            \
    do {                                                                                                     \
        EXPECT_EQ(-1, call);                                                                                 \
        EXPECT_LINES(__VA_ARGS__);                                                                           \
    } while (0)

#endif
