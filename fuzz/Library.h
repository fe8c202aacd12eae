// Shared by the fuzz targets.

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

// Takes the first line off a text.
std::string takeLine(std::string_view& strRest);

// The library's own reading and writing of JSON.
Json::Value json(std::string_view strText);
std::string text(const Json::Value& jValue);

// An id of 127 characters with this beginning.
std::string tid(const std::string& strStart);

// The store, without tokens. It exists until the process ends.
AccessTokenDbApi& store();

// All tokens of a store.
Json::Value tokens(AccessTokenDbApi& db);

// Whether the call throws the exception that the library's headers allow. It must not throw another.
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
