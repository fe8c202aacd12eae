// Keeps changes of tokens in force for as long as calls of other programs can undo them: see Aftermath.h.

#ifndef TOOLS_CHANGED_TOKENS_H
#define TOOLS_CHANGED_TOKENS_H

#include <json/value.h>

#include <optional>
#include <set>
#include <string>

#include "Aftermath.h"

namespace tool {

// To be called after tokens were deleted. The first takes the ids of the tokens, the second a change that
// knows them.
void outlastRevoked(const std::set<std::string>& strTids);
void outlastRevoked(const Change& change);

// To be called after fields of a token were written: jBefore is the token before that, jChange holds the new
// fields. Returns the token as it is in the end, or nothing if it is gone.
std::optional<Json::Value> outlastUpdated(const Json::Value& jBefore, const Json::Value& jChange);

} // namespace tool

#endif
