#include "Layout.h"

#include <algorithm>
#include <ctime>
#include <vector>

#include "Arguments.h"
#include "Console.h"
#include "Json.h"
#include "Store.h"
#include "Table.h"
#include "Values.h"

namespace {

using tool::Layout;
typedef tool::Table::Kind Kind;

Layout::Form parseForm(const std::string& strText)
{
    if (strText == "table") {
        return Layout::Form::Table;
    }
    if (strText == "json") {
        return Layout::Form::Json;
    }
    if (strText == "jsonl") {
        return Layout::Form::JsonLines;
    }
    throw tool::BadValue(tool::quoted(strText) + " is no form: table, json or jsonl");
}

std::string timeIn(const Json::Value& jTime, const Layout& layout)
{
    return layout.blEpoch ? jTime.asString() : tool::timeText(jTime.asInt64(), layout.blUtc);
}

std::string usesText(const Json::Value& jCount)
{
    return jCount.asInt64() < 0 ? "unlimited" : jCount.asString();
}

std::string userText(const Json::Value& jUid)
{
    return tool::userNameIfKnown(jUid.asInt64()).value_or(jUid.asString());
}

// "Example.File:get,list Example.User"; an entry that cannot be read as such, as JSON.
std::string allowText(const Json::Value& jAllow)
{
    if (!jAllow.isObject()) {
        return tool::compactJson(jAllow);
    }
    std::string strText;
    for (const std::string& strApi : jAllow.getMemberNames()) {
        const Json::Value& jEntry = jAllow[strApi];
        strText += (strText.empty() ? "" : " ") + strApi;
        const bool blMethods = jEntry.isObject() && jEntry["method"].isArray();
        for (Json::ArrayIndex i = 0; blMethods && i < jEntry["method"].size(); ++i) {
            const Json::Value& jMethod = jEntry["method"][i];
            strText +=
                (i ? "," : ":") + (jMethod.isString() ? jMethod.asString() : tool::compactJson(jMethod));
        }
        strText += blMethods ? "" : ":" + tool::compactJson(jEntry);
    }
    return strText;
}

bool isExpired(const Json::Value& jToken, time_t nNow)
{
    return jToken["deadline"].asInt64() < nNow;
}

void printTable(const Json::Value& jTokens, const Layout& layout)
{
    tool::Table table({{"TID", Kind::Short},
                       {"USER", Kind::Short},
                       {"FUNCTION", Kind::Long},
                       {"USES", Kind::Right},
                       {"DEADLINE", Kind::Short},
                       {"EXPIRES", Kind::Short},
                       {"SESSION", Kind::Long},
                       {"ALLOWS", Kind::Long}},
                      !layout.blNoHeader);
    const time_t nNow = time(nullptr);
    for (const Json::Value& jToken : jTokens) {
        table.add({jToken["tid"].asString(), userText(jToken["uid"]), jToken["function"].asString(),
                   usesText(jToken["count"]), timeIn(jToken["deadline"], layout),
                   tool::relativeText(jToken["deadline"].asInt64(), nNow), jToken["bind_sid"].asString(),
                   allowText(jToken["webapi_allow"])},
                  isExpired(jToken, nNow));
    }
    table.print();
}

// For scripts: as it is stored.
void printField(const Json::Value& jToken, const std::string& strField)
{
    const Json::Value& jValue = jToken[strField];
    const std::string strValue = jValue.isString() ? jValue.asString() : tool::compactJson(jValue);
    tool::printLine(strValue);
}

void printSheet(const Json::Value& jToken, const Layout& layout)
{
    const time_t nNow = time(nullptr);
    const bool blExpired = isExpired(jToken, nNow);
    tool::Table table({{"FIELD", Kind::Short}, {"VALUE", Kind::Long}}, !layout.blNoHeader);
    for (const std::string& strField : tool::fieldNames()) {
        const Json::Value& jValue = jToken[strField];
        if (strField == "uid") {
            const auto strName = tool::userNameIfKnown(jValue.asInt64());
            table.add({strField, jValue.asString() + (strName ? " (" + *strName + ")" : "")});
        } else if (strField == "deadline") {
            table.add(
                {strField, timeIn(jValue, layout) + " (" + tool::relativeText(jValue.asInt64(), nNow) + ")"},
                blExpired);
        } else if (strField == "create_time") {
            table.add({strField, timeIn(jValue, layout)});
        } else if (strField == "count") {
            table.add({strField, usesText(jValue)});
        } else {
            table.add({strField, jValue.isString() ? jValue.asString() : tool::compactJson(jValue)});
        }
    }
    table.print();
}

} // namespace

namespace tool {

std::string parseField(const std::string& strText)
{
    const std::vector<std::string> strNames = fieldNames();
    if (strNames.end() == std::find(strNames.begin(), strNames.end(), strText)) {
        throw BadValue(quoted(strText) + " is no field of a token");
    }
    return strText;
}

void addForm(Command& command, Layout& layout)
{
    addParsed(command, "-o,--output", "FORM", layout.form, parseForm, "table (the default), json or jsonl");
}

void addFormOptions(Command& command, Layout& layout)
{
    addForm(command, layout);
    command.flag("--no-header", layout.blNoHeader, "no line of titles above a table");
}

void addTokenOptions(Command& command, Layout& layout)
{
    addFormOptions(command, layout);
    addParsed(command, "--field", "NAME", layout.strField, parseField, "this field only, as it is stored");
    command.flag("--utc", layout.blUtc, "times in UTC instead of local time");
    command.flag("--epoch", layout.blEpoch, "times in seconds since the epoch");
    command.exclude("--epoch", "--utc");
}

void printTokens(Json::Value& jTokens, const Layout& layout)
{
    if (!layout.blShowIds) {
        for (Json::Value& jToken : jTokens) {
            jToken["tid"] = masked(jToken["tid"].asString());
        }
    }
    if (!layout.strField.empty() || Layout::Form::JsonLines == layout.form) {
        for (const Json::Value& jToken : jTokens) {
            if (layout.strField.empty()) {
                print(compactJson(jToken) + "\n");
            } else {
                printField(jToken, layout.strField);
            }
        }
    } else if (Layout::Form::Json == layout.form) {
        print(styledJson(jTokens) + "\n");
    } else {
        printTable(jTokens, layout);
    }
}

void printToken(const Json::Value& jToken, const Layout& layout)
{
    if (!layout.strField.empty()) {
        printField(jToken, layout.strField);
    } else if (Layout::Form::Table == layout.form) {
        printSheet(jToken, layout);
    } else {
        print((Layout::Form::Json == layout.form ? styledJson(jToken) : compactJson(jToken)) + "\n");
    }
}

} // namespace tool
