// Converts what people write on a command line to the store's values, and back. The parsers throw BadValue.

#ifndef TOOLS_VALUES_H
#define TOOLS_VALUES_H

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tool {

// A decimal number from nMin to nMax.
int64_t parseNumber(const std::string& strText, int64_t nMin, int64_t nMax);

// A uid; or the uid of a user of this machine, by name. The second throws Failure if the user database fails.
unsigned int parseUid(const std::string& strText);
unsigned int parseUser(const std::string& strName);

// The name of a user. If this machine does not know the user, the first returns nothing and the second throws
// Failure. Both throw Failure if the user database fails. The third is for lists: it returns nothing in both
// cases, and remembers names.
std::optional<std::string> findUserName(Json::Int64 nUid);
std::string userName(Json::Int64 nUid);
std::optional<std::string> userNameIfKnown(Json::Int64 nUid);

// The seconds of a duration such as "90m", "1d12h" or "45" (seconds): from one second to a thousand years.
int64_t parseDuration(const std::string& strText);

// Seconds since the epoch, from "@1767225600", "2026-12-31", "2026-12-31 23:59" or "2026-12-31T23:59:59". The
// last three are in local time, or in UTC with a "Z" at the end.
int64_t parseTime(const std::string& strText);

// "1 token", "2 tokens".
std::string countText(uint64_t nCount, const std::string& strWhat);

// A time as text, with seconds, in local time or UTC.
std::string timeText(Json::Int64 nTime, bool blUtc);

// A deadline relative to now: "in 2 h", "expired 5 min ago".
std::string relativeText(Json::Int64 nDeadline, int64_t nNow);

// One "API" or "API:METHOD,METHOD...".
struct Allowance {
    std::string strApi;
    std::vector<std::string> strMethods;
};
Allowance parseAllowance(const std::string& strText);

// The value of a token's webapi_allow.
Json::Value allowanceJson(const std::vector<Allowance>& allowances);

// A JSON object, or for "@FILE" the JSON object in the file.
Json::Value parseExtra(const std::string& strText);

} // namespace tool

#endif
