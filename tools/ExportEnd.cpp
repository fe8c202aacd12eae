#include "ExportEnd.h"

#include "Values.h"

namespace {

const char* const END = "end";
const char* const SHA256 = "sha256";
const char* const TOKENS = "tokens";

} // namespace

namespace tool {

ExportEnd::ExportEnd()
{
    SHA256Init(&m_digest);
}

void ExportEnd::add(const std::string& strBytes)
{
    SHA256Update(&m_digest, reinterpret_cast<const uint8_t*>(strBytes.data()), strBytes.size());
}

Json::Value ExportEnd::json(uint64_t nTokens) const
{
    SHA2_CTX digest = m_digest; // SHA256End() destroys its argument
    char szDigest[SHA256_DIGEST_STRING_LENGTH];
    Json::Value jEnd;
    jEnd[END][SHA256] = SHA256End(&digest, szDigest);
    jEnd[END][TOKENS] = Json::UInt64{nTokens};
    return jEnd;
}

bool ExportEnd::is(const Json::Value& jLine)
{
    return 1 == jLine.size() && jLine[END].isObject() && 2 == jLine[END].size() &&
           jLine[END][SHA256].isString() && jLine[END][TOKENS].isUInt64();
}

std::string ExportEnd::flawOf(const Json::Value& jEnd, uint64_t nTokens) const
{
    const uint64_t nExported = jEnd[END][TOKENS].asUInt64();
    if (nExported != nTokens) {
        return "is the end of " + countText(nExported, "token") + ", not of " + std::to_string(nTokens);
    }
    const bool blSame = jEnd[END][SHA256] == json(nTokens)[END][SHA256];
    return blSame ? "" : "is the end of other lines: their checksum differs";
}

} // namespace tool
