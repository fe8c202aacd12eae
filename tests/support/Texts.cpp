#include "Texts.h"

#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <utility>

namespace {

// A source file stands for all its lines; the field list comes with its line.
std::string location(const std::string& strFile)
{
    return std::string::npos == strFile.find(':') ? strFile + ":#" : strFile;
}

} // namespace

Texts operator+(Texts left, const Texts& right)
{
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

std::string joined(const Texts& texts, const char* szSeparator)
{
    std::string strJoined;
    for (const std::string& strText : texts) {
        strJoined.append(&strText == &texts.front() ? "" : szSeparator).append(strText);
    }
    return strJoined;
}

Json::Value json(const std::string& strText)
{
    const std::unique_ptr<Json::CharReader> pReader(Json::CharReaderBuilder().newCharReader());
    Json::Value jValue;
    std::string strErrors;
    EXPECT_TRUE(pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, &strErrors))
        << strErrors << strText;
    return jValue;
}

std::string text(const Json::Value& jValue)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, jValue);
}

std::string fieldList(int nLine)
{
    return "include/internal/vemo-access-token-data-member:" + std::to_string(nLine);
}

std::string selectSql(const std::string& strTid)
{
    return SELECT + " WHERE  (tid='" + strTid + "' );";
}

std::string deleteSql(const std::string& strField, const std::string& strValue)
{
    return "DELETE FROM token WHERE  (" + strField + " in ('" + strValue + "' ) );";
}

std::string ordinary(const std::string& strFile, const std::string& strMessage)
{
    return location(strFile) + " " + strMessage + "\n";
}

std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno)
{
    return ordinary(strFile, "(" + location(strFile) + ")(" + strerror(nErrno) + ")" + strMessage + "\n");
}

std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno)
{
    return fail(strFile, "Failed [" + strCondition + "], err=" + strerror(nErrno), nErrno);
}

Texts allFailed(const std::string& strFile, const Texts& conditions, int nErrno)
{
    Texts lines;
    for (const std::string& strCondition : conditions) {
        lines.push_back(failed(strFile, strCondition, nErrno));
    }
    return lines;
}

Texts failureOf(const std::string& strSql, const std::string& strError, int nErrno)
{
    return {ordinary(STORE, "i=0,run sql failed, error=" + strError + ", sql=" + strSql),
            fail(STORE, "run sql failed, sql=" + strSql, nErrno)};
}

Texts inSystemLog(Texts lines, int nErrno)
{
    const std::string strErrno = 0 == nErrno ? "" : std::string("(") + strerror(nErrno) + ")";
    for (std::string& strLine : lines) {
        strLine = "<3>" + strLine.insert(strLine.find(' ') + 1, strErrno);
    }
    return lines;
}

Texts takeLines()
{
    return std::exchange(seam().lines, {});
}
