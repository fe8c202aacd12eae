// JSON values read in place, without the copies and second look-ups of isMember, operator[] and
// asString.

#ifndef VEMO_ACCESS_TOKEN_JSON_ACCESS_H
#define VEMO_ACCESS_TOKEN_JSON_ACCESS_H

#include <json/value.h>

#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// The member, or null when the object has none of that name. It belongs to the object.
inline const Json::Value* findMember(const Json::Value& jObject, std::string_view strName)
{
    return jObject.find(strName.data(), strName.data() + strName.size());
}

// A string's text, which belongs to the value; empty for any other value.
inline std::string_view textOf(const Json::Value& jValue)
{
    const char* szBegin = nullptr;
    const char* szEnd = nullptr;
    if (!jValue.getString(&szBegin, &szEnd)) {
        return {};
    }
    return {szBegin, static_cast<size_t>(szEnd - szBegin)};
}

} // namespace VEMO_ACCESS_TOKEN

#endif
