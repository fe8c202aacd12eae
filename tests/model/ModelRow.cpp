#include "ModelRow.h"

#include <cmath>
#include <cstdio>
#include <cstring>
#include <memory>

namespace {

std::string quoted(const std::string& strText)
{
    static const std::string strNamed = "\"\\\b\f\n\r\t";
    std::string strQuoted = "\"";
    for (const char c : strText) {
        const size_t nNamed = strNamed.find(c);
        if (std::string::npos != nNamed) {
            strQuoted.append({'\\', "\"\\bfnrt"[nNamed]});
        } else if (0 <= c && c < ' ') {
            char szEscape[8];
            snprintf(szEscape, sizeof(szEscape), "\\u%04x", static_cast<unsigned int>(c));
            strQuoted += szEscape;
        } else {
            strQuoted += c;
        }
    }
    return strQuoted + "\"";
}

std::string realText(double dValue)
{
    if (!std::isfinite(dValue)) {
        return std::isnan(dValue) ? "NaN" : 0 < dValue ? "Infinity" : "-Infinity";
    }
    char szText[32];
    snprintf(szText, sizeof(szText), "%.17g", dValue);
    return strpbrk(szText, ".e") ? szText : std::string(szText) + ".0";
}

std::string arrayText(const Json::Value& jArray)
{
    std::string strText = "[";
    for (const Json::Value& jElement : jArray) {
        strText += (1 == strText.size() ? "" : ",") + jsonText(jElement);
    }
    return strText + "]";
}

std::string objectText(const Json::Value& jObject)
{
    std::string strText = "{";
    for (auto it = jObject.begin(); it != jObject.end(); ++it) {
        strText += (1 == strText.size() ? "" : ",") + quoted(it.name()) + ":" + jsonText(*it);
    }
    return strText + "}";
}

Json::Value parsed(const std::string& strText)
{
    static const std::unique_ptr<Json::CharReader> pReader = [] {
        Json::CharReaderBuilder builder;
        builder["allowSpecialFloats"] = true;
        return std::unique_ptr<Json::CharReader>(builder.newCharReader());
    }();
    Json::Value jValue;
    pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    return jValue;
}

} // namespace

const std::vector<Field> FIELDS = {
    {"tid", Kind::Text, "INVALID_TOKEN_ID"},
    {"bind_sid", Kind::Text, ""},
    {"uid", Kind::Number, 4294967295U},
    {"deadline", Kind::Number, -1},
    {"count", Kind::Number, 1},
    {"create_time", Kind::Number, Json::Value()},
    {"function", Kind::Text, "VEMO_ACCESS_TOKEN"},
    {"webapi_allow", Kind::Json, Json::objectValue},
    {"extra", Kind::Json, Json::objectValue},
};

size_t fieldNumber(const std::string& strName)
{
    size_t i = 0;
    while (i < FIELDS.size() && strName != FIELDS[i].szName) {
        ++i;
    }
    return i;
}

Row rowOf(const Json::Value& jRecord)
{
    Row row;
    for (const Field& field : FIELDS) {
        const Json::Value& jValue = jRecord[field.szName];
        Json::Value& jMember = row.jRecord[field.szName];
        switch (field.kind) {
        case Kind::Text:
            row.columns.emplace_back(jValue.asCString());
            jMember = row.columns.back();
            break;
        case Kind::Json:
            row.columns.push_back(jsonText(jValue));
            jMember = parsed(row.columns.back());
            break;
        case Kind::Number:
            jMember = jValue.asInt64();
            row.columns.push_back(jMember.asString());
            break;
        }
    }
    return row;
}

std::string untilNul(const std::string& strText)
{
    return strText.c_str();
}

std::string jsonText(const Json::Value& jValue)
{
    switch (jValue.type()) {
    case Json::nullValue: return "null";
    case Json::stringValue: return quoted(jValue.asString());
    case Json::realValue: return realText(jValue.asDouble());
    case Json::arrayValue: return arrayText(jValue);
    case Json::objectValue: return objectText(jValue);
    default: return jValue.asString(); // integers and booleans
    }
}
