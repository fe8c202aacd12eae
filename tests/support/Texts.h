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

// JSON text as a value (the text is well-formed), and a value as compact text.
Json::Value json(const std::string& strText);
std::string text(const Json::Value& jValue);

// A token id of 127 characters that starts with strStart.
std::string tid(const std::string& strStart = "");

// The files that log lines come from.
const char* const UTIL = "util.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const SERVICE = "AccessTokenApi.cpp";
const char* const WRAPPER = "AccessTokenWrapper.cpp";
const char* const FIELD_LIST = "include/internal/vemo-access-token-data-member";

// The field list at one of its lines.
std::string fieldList(int nLine);

// Statements.
const char* const COLUMNS = "tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra";
inline const std::string SELECT = std::string("SELECT ") + COLUMNS + " FROM token ";
inline const std::string PURGE = "DELETE FROM token where deadline < strftime('%s', 'now');";
inline const std::string SCHEMA =
    "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
    "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
    "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT);";

std::string selectSql(const std::string& strTid); // both with the value as it is quoted
std::string deleteSql(const std::string& strField, const std::string& strValue);

// The texts of log lines on standard output, location prefix included, as LogLine holds them. strFile
// is a source file, for which the line reads '#', or the field list at a line.
std::string ordinary(const std::string& strFile, const std::string& strMessage);
// A failure line with a message of its own, written while errno is nErrno,
std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno = 0);
// and the failure line of a condition.
std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno = 0);
// The same for several conditions, which report one failure on its way up.
Texts allFailed(const std::string& strFile, const Texts& conditions, int nErrno);

// Such lines as they reach the system log, which shows errno ahead of the message as well.
Texts inSystemLog(Texts lines, int nErrno);

// What the store logs on standard output of a statement that fails at its first try.
Texts failureOf(const std::string& strSql, const std::string& strError, int nErrno = 0);

// What it logs there when it may not become root, and so cannot open the database for a statement.
const std::string NOT_ROOT = failed(STORE, "0 > seteuid(0)", EPERM);
const Texts NOT_OPENED = {NOT_ROOT, failed(STORE, "0 > initDb()", EPERM)};

// The texts logged since the last call, and the same with their destinations checked.
Texts takeLines();
Texts takeLines(Destination destination);

#endif
