#include "Contender.h"

#include <json/reader.h>

#include <sstream>

namespace {

Json::Value numberOf(const std::string& strText)
{
    return static_cast<Json::Int64>(std::stoll(strText));
}

Json::Value objectOf(const std::string& strText)
{
    Json::Value jObject;
    std::istringstream(strText) >> jObject;
    return jObject;
}

} // namespace

const Texts& fieldNames()
{
    static const Texts NAMES = {"tid",         "bind_sid", "uid",          "deadline", "count",
                                "create_time", "function", "webapi_allow", "extra"};
    return NAMES;
}

Texts textsOf(const BareToken& token)
{
    return {token.strTid,
            token.strBindSid,
            std::to_string(token.nUid),
            std::to_string(token.nDeadline),
            std::to_string(token.nCount),
            std::to_string(token.nCreateTime),
            token.strFunction,
            token.strWebapiAllow,
            token.strExtra};
}

Json::Value recordOf(const Texts& rgstrText)
{
    Json::Value jRecord;
    jRecord["tid"] = rgstrText[0];
    jRecord["bind_sid"] = rgstrText[1];
    jRecord["uid"] = numberOf(rgstrText[2]);
    jRecord["deadline"] = numberOf(rgstrText[3]);
    jRecord["count"] = numberOf(rgstrText[4]);
    jRecord["create_time"] = numberOf(rgstrText[5]);
    jRecord["function"] = rgstrText[6];
    jRecord["webapi_allow"] = objectOf(rgstrText[7]);
    jRecord["extra"] = objectOf(rgstrText[8]);
    return jRecord;
}
