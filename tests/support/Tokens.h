// The token of most tests, and its fields.

#ifndef TESTS_TOKENS_H
#define TESTS_TOKENS_H

#include <ctime>

#include "Texts.h"

const time_t NOW = 1700000000; // what the library's clock shows

// A field, and values to test it with.
struct Field {
    const char* szName;
    int nLine; // in the field list
    const char* szType;
    Json::Value jDefault; // at the time NOW
    const char* szOther;  // another value than the token's, in JSON
    const char* szWrong;  // a value of a wrong type
};

// In the field list's order.
inline const std::vector<Field>& fields()
{
    static const Json::Value jNow = static_cast<Json::Int64>(NOW);
    static const Json::Value jEmpty(Json::objectValue);
    static const std::vector<Field> rgField = {
        {"tid", 2, "string", "INVALID_TOKEN_ID", R"("new")", "5"},
        {"bind_sid", 4, "string", "", R"("S'2")", "null"},
        {"uid", 6, "long long", 4294967295U, "0", R"("0")"},
        {"deadline", 8, "long long", -1, "3600", "1.5"},
        {"count", 10, "long long", 1, "-1", R"("5")"},
        {"create_time", 14, "long long", jNow, "-5", "[]"},
        {"function", 16, "string", "VEMO_ACCESS_TOKEN", R"("")", "{}"},
        {"webapi_allow", 18, "Json::objectValue", jEmpty, R"({"B":{}})", "[]"},
        {"extra", 22, "Json::objectValue", jEmpty, R"({"z":null})", R"("{}")"},
    };
    return rgField;
}

// The record of a token: that of most tests, with the members of strChanges (JSON) in place of its own.
inline Json::Value token(const std::string& strChanges = "{}")
{
    Json::Value jToken = json(
        R"({"tid":"t","bind_sid":"S1","uid":1000,"deadline":9999999999,"count":3,"create_time":1690000000,
            "function":"VPN","webapi_allow":{"Api":{"method":["get","post"]},"Odd":{"method":[{}]}},
            "extra":{"note":"it's mine"}})");
    const Json::Value jChanges = json(strChanges);
    for (const std::string& strName : jChanges.getMemberNames()) {
        jToken[strName] = jChanges[strName];
    }
    return jToken;
}

// The record that a creation for the user 1000 and the purpose VPN makes without options.
inline Json::Value created(const std::string& strTid)
{
    Json::Value jToken =
        json(R"({"bind_sid":"","uid":1000,"deadline":1700086400,"count":1,"create_time":1700000000,
                 "function":"VPN","webapi_allow":{},"extra":{}})");
    jToken["tid"] = strTid;
    return jToken;
}

// token() with another count.
inline Json::Value counted(Json::Int64 nCount)
{
    return token("{\"count\":" + std::to_string(nCount) + "}");
}

// The values of a record's fields as texts. Where SQL quotes, szQuote is around them, and quotes are doubled.
inline Texts values(const Json::Value& jToken, const std::string& strQuote)
{
    Texts texts;
    for (const Field& field : fields()) {
        const Json::Value& jValue = jToken[field.szName];
        std::string strText = jValue.isObject() ? text(jValue) : jValue.asString();
        if (std::string("long long") != field.szType && !strQuote.empty()) {
            for (size_t n = 0; std::string::npos != (n = strText.find(strQuote, n)); n += 2) {
                strText.insert(n, strQuote);
            }
            strText = strQuote + strText + strQuote;
        }
        texts.push_back(strText);
    }
    return texts;
}

// A record as a row of the table, and the statement that saves it: strVerb is INSERT or REPLACE.
inline std::string row(const Json::Value& jToken)
{
    return joined(values(jToken, ""), "|");
}

inline std::string saveSql(const std::string& strVerb, const Json::Value& jToken)
{
    return strVerb +
           " INTO token (tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra) VALUES (" +
           joined(values(jToken, "'"), ",") + ")";
}

// A token id that starts with strStart and has 127 characters, the fewest that a caller may choose.
inline std::string tid(const std::string& strStart = "")
{
    return strStart + std::string(127 - strStart.size(), 'x');
}

#endif
