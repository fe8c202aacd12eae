// What the targets of the library share.

#ifndef FUZZ_LIBRARY_H
#define FUZZ_LIBRARY_H

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "Confinement.h"
#include "Require.h"

class AccessTokenDbApi;

namespace fuzz {

std::string_view viewOf(const uint8_t* pData, size_t cbData);

// Takes the first line off a text, as far as there is one.
std::string takeLine(std::string_view& strRest);

// The library's own reading and writing of JSON.
Json::Value json(std::string_view strText);
std::string text(const Json::Value& jValue);

// An id of 127 characters that begins so.
std::string tid(const std::string& strStart);

// The store, without tokens; it lasts as long as the process.
AccessTokenDbApi& store();

// All tokens of a store, whose reading must succeed.
Json::Value tokens(AccessTokenDbApi& db);

// Whether the call throws what the library's headers allow. Nothing else may leave it.
template <typename Call>
bool throwsLogicError(Call call)
{
    try {
        call();
        return false;
    } catch (const Json::LogicError&) {
        return true;
    }
}

} // namespace fuzz

#endif
