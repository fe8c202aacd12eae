// The last line of an export, by which an import knows that it has all of it:
//   {"end":{"sha256":"...","tokens":3}}
// with the SHA-256 of all bytes in front of the line and the number of tokens there. No token looks like it.

#ifndef TOOLS_EXPORT_END_H
#define TOOLS_EXPORT_END_H

#include <json/value.h>
#include <sha2.h>

#include <cstdint>
#include <string>

namespace tool {

class ExportEnd {
public:
    ExportEnd();

    // Takes the next bytes in front of the end.
    void add(const std::string& strBytes);

    // The end behind these bytes.
    Json::Value json(uint64_t nTokens) const;

    static bool is(const Json::Value& jLine);

    // What is wrong with an end behind these bytes, as the rest of a sentence that begins with it; or "".
    std::string flawOf(const Json::Value& jEnd, uint64_t nTokens) const;

private:
    SHA2_CTX m_digest;
};

} // namespace tool

#endif
