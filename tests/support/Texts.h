// The texts that tests expect: log lines, statements and JSON.

#ifndef TESTS_TEXTS_H
#define TESTS_TEXTS_H

#include <gtest/gtest.h>
#include <json/json.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "Seam.h"

typedef std::vector<std::string> Texts;

inline Texts operator+(Texts left, const Texts& right)
{
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

// The texts, joined by a separator.
inline std::string joined(const Texts& texts, const char* szSeparator)
{
    std::string strJoined;
    for (const std::string& strText : texts) {
        strJoined.append(&strText == &texts.front() ? "" : szSeparator).append(strText);
    }
    return strJoined;
}

// JSON text as a value (the text must be well-formed), and a value as compact text.
inline Json::Value json(const std::string& strText)
{
    const std::unique_ptr<Json::CharReader> pReader(Json::CharReaderBuilder().newCharReader());
    Json::Value jValue;
    std::string strErrors;
    EXPECT_TRUE(pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, &strErrors))
        << strErrors << strText;
    return jValue;
}

inline std::string text(const Json::Value& jValue)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, jValue);
}

// The files that log lines come from; the field list has a line number.
const char* const UTIL = "util.cpp:#";
const char* const STORE = "AccessTokenSqlite.cpp:#";
const char* const SERVICE = "AccessTokenApi.cpp:#";
const char* const WRAPPER = "AccessTokenWrapper.cpp:#";

inline std::string fieldList(int nLine)
{
    return "include/internal/vemo-access-token-data-member:" + std::to_string(nLine);
}

// Statements. Values in them are quoted.
inline const std::string PURGE = "DELETE FROM token where deadline < strftime('%s', 'now');";
inline const std::string SCHEMA =
    "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
    "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
    "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT);";
inline const std::string SELECT =
    "SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token ";

inline std::string selectSql(const std::string& strTid)
{
    return SELECT + " WHERE  (tid='" + strTid + "' );";
}

inline std::string deleteSql(const std::string& strField, const std::string& strValue)
{
    return "DELETE FROM token WHERE  (" + strField + " in ('" + strValue + "' ) );";
}

// The lines of the log, as the seam holds them. An ordinary line;
inline std::string ordinary(const std::string& strFile, const std::string& strMessage)
{
    return strFile + " " + strMessage + "\n";
}

// a failure line with its own message, written while errno is nErrno;
inline std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno = 0)
{
    return ordinary(strFile, "(" + strFile + ")(" + strerror(nErrno) + ")" + strMessage + "\n");
}

// the failure line of a condition;
inline std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno = 0)
{
    return fail(strFile, "Failed [" + strCondition + "], err=" + strerror(nErrno), nErrno);
}

// those of several conditions, which pass one failure on to their callers;
inline Texts allFailed(const std::string& strFile, const Texts& conditions, int nErrno = 0)
{
    Texts lines;
    for (const std::string& strCondition : conditions) {
        lines.push_back(failed(strFile, strCondition, nErrno));
    }
    return lines;
}

// and what the store logs when a statement fails at its first try.
inline Texts failureOf(const std::string& strSql, const std::string& strError, int nErrno = 0)
{
    return {ordinary(STORE, "i=0,run sql failed, error=" + strError + ", sql=" + strSql),
            fail(STORE, "run sql failed, sql=" + strSql, nErrno)};
}

// What the store logs when it cannot become root.
const std::string NOT_ROOT = failed(STORE, "0 > seteuid(0)", EPERM);

// The lines logged since the last call.
inline Texts takeLines()
{
    return std::exchange(seam().lines, {});
}

// Expects these lines, given as texts or as one list; and that a call returns -1 and logs them.
#define EXPECT_LINES(...) EXPECT_EQ((Texts{__VA_ARGS__}), takeLines())
#define EXPECT_FAILURE(call, ...)                                                                            \
    do {                                                                                                     \
        EXPECT_EQ(-1, call);                                                                                 \
        EXPECT_LINES(__VA_ARGS__);                                                                           \
    } while (0)

#endif
