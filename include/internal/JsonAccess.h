// Reads JSON values in place: isMember, operator[] and asString would look up twice, or copy.

#ifndef VEMO_ACCESS_TOKEN_JSON_ACCESS_H
#define VEMO_ACCESS_TOKEN_JSON_ACCESS_H

#include <json/value.h>

#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// Returns the member of an object, or null when it has none of that name. The object owns it.
inline const Json::Value* findMember(const Json::Value& jObject, std::string_view strName)
{
    return jObject.find(strName.data(), strName.data() + strName.size());
}

// Returns the member's name at an iterator of an object. The object owns it; a NUL follows it.
inline std::string_view nameOf(const Json::ValueIteratorBase& it)
{
    const char* szEnd = nullptr;
    const char* szBegin = it.memberName(&szEnd);
    return {szBegin, static_cast<size_t>(szEnd - szBegin)};
}

// Looks for a member at the iterator it or after it, and moves it past the member. This is faster than
// findMember when names are looked up in the order of an object's members, which is that of their names.
inline const Json::Value* findNext(Json::Value::const_iterator& it, const Json::Value::const_iterator& end,
                                   std::string_view strName)
{
    int nOrder = 1;
    while (it != end && 0 < (nOrder = strName.compare(nameOf(it)))) {
        ++it;
    }
    return 0 == nOrder ? &*it++ : nullptr;
}

// Returns the text of a string, or an empty text for any other value. The value owns it.
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
