#include "Json.h"

#include <json/reader.h>
#include <json/writer.h>

#include <memory>
#include <sstream>

#include "Failure.h"

namespace {

std::string write(const Json::Value& jValue, const char* szIndentation)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = szIndentation;
    builder["precision"] = 17;
    // What the store can hold comes out as it is: doubles that JSON has no name for, and bytes that
    // are not valid UTF-8.
    builder["useSpecialFloats"] = true;
    builder["emitUTF8"] = true;
    return Json::writeString(builder, jValue);
}

// The first error of the reader's report, each of which stands behind a "*" and on several lines.
std::string firstError(const std::string& strReport)
{
    std::istringstream words(strReport);
    std::string strError;
    for (std::string strWord; words >> strWord && (strWord != "*" || strError.empty());) {
        strError += strWord == "*" ? "" : (strError.empty() ? "" : " ") + strWord;
    }
    return strError;
}

} // namespace

namespace tool {

Json::Value parseObject(const std::string& strText)
{
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["allowSpecialFloats"] = true; // as compactJson writes them
    const std::unique_ptr<Json::CharReader> pReader(builder.newCharReader());
    Json::Value jValue;
    std::string strReport;
    try {
        if (!pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, &strReport)) {
            throw BadValue("is no JSON: " + firstError(strReport));
        }
    } catch (const Json::Exception&) {
        throw BadValue("is nested too deeply for JSON");
    }
    if (!jValue.isObject()) {
        throw BadValue("is no JSON object");
    }
    return jValue;
}

std::string compactJson(const Json::Value& jValue)
{
    return write(jValue, "");
}

std::string styledJson(const Json::Value& jValue)
{
    return write(jValue, "  ");
}

} // namespace tool
