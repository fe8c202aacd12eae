// Changes of tokens that have been made, and made again for as long as calls of other programs can undo them.

#ifndef TOOLS_CHANGED_TOKENS_H
#define TOOLS_CHANGED_TOKENS_H

#include <json/value.h>

#include <optional>
#include <set>
#include <string>

#include "Aftermath.h"

namespace tool {

// Tokens were deleted: those of these ids, or others, which the change knows.
void outlastRevoked(const std::set<std::string>& strTids);
void outlastRevoked(const Change& change);

// Fields of a token were written. Returns the token as it is in the end; nothing when it is gone.
std::optional<Json::Value> outlastUpdated(const Json::Value& jBefore, const Json::Value& jChange);

} // namespace tool

#endif
