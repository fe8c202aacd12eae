// The last line of an export. It shows an import that the export is complete:
//   {"end":{"sha256":"...","tokens":3}}
// It holds the SHA-256 of all bytes before it, and the number of tokens. No token looks like it.

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

    // Takes the next bytes of the export.
    void add(const std::string& strBytes);

    // The end line for the bytes so far.
    Json::Value json(uint64_t nTokens) const;

    static bool is(const Json::Value& jLine);

    // Compares an end line with the bytes so far. Returns what is wrong as the rest of a sentence about the
    // line, or "".
    std::string flawOf(const Json::Value& jEnd, uint64_t nTokens) const;

private:
    SHA2_CTX m_digest;
};

} // namespace tool

#endif
