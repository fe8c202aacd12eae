#include "Tokens.h"

const std::vector<Field>& fields()
{
    static const Json::Value jNow = static_cast<Json::Int64>(NOW);
    static const Json::Value jEmpty(Json::objectValue);
    static const std::vector<Field> rgField = {
        {"tid", 2, "string", "tid TEXT primary key NOT NULL", "INVALID_TOKEN_ID", R"("new")", "5"},
        {"bind_sid", 4, "string", "bind_sid TEXT", "", R"("S'2")", "null"},
        {"uid", 6, "long long", "uid INTEGER", 4294967295U, "0", R"("0")"},
        {"deadline", 8, "long long", "deadline INTEGER default -1", -1, "3600", "1.5"},
        {"count", 10, "long long", "count INTEGER default 1", 1, "-1", R"("5")"},
        {"create_time", 14, "long long", "create_time INTEGER default CURRENT_TIMESTAMP", jNow, "-5", "[]"},
        {"function", 16, "string", "function TEXT NOT NULL", "VEMO_ACCESS_TOKEN", R"("")", "{}"},
        {"webapi_allow", 18, "Json::objectValue", "webapi_allow TEXT", jEmpty, R"({"B":{}})", "[]"},
        {"extra", 22, "Json::objectValue", "extra TEXT", jEmpty, R"({"z":null})", R"("{}")"},
    };
    return rgField;
}

Json::Value token(const std::string& strChanges)
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

Json::Value without(const char* szMember, Json::Value jToken)
{
    jToken.removeMember(szMember);
    return jToken;
}

// The values of the fields as text; those that SQL quotes are passed through quote().
template <typename Quote>
static Texts values(const Json::Value& jToken, Quote quote)
{
    Texts texts;
    for (const Field& field : fields()) {
        const Json::Value& jValue = jToken[field.szName];
        const std::string strText = jValue.isObject() ? text(jValue) : jValue.asString();
        texts.push_back(std::string("long long") == field.szType ? strText : quote(strText));
    }
    return texts;
}

std::string row(const Json::Value& jToken)
{
    return joined(values(jToken, [](const std::string& strText) { return strText; }), "|");
}

std::string saveSql(const std::string& strVerb, const Json::Value& jToken)
{
    const auto quote = [](std::string strText) {
        for (size_t n = 0; std::string::npos != (n = strText.find('\'', n)); n += 2) {
            strText.insert(n, 1, '\'');
        }
        return "'" + strText + "'";
    };
    return strVerb +
           " INTO token (tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra) VALUES (" +
           joined(values(jToken, quote), ",") + ")";
}

std::string tid(const std::string& strStart)
{
    return strStart + std::string(127 - strStart.size(), 'x');
}
