// What people write on a command line, as the store's values and back. The readers throw BadValue.

#ifndef TOOLS_VALUES_H
#define TOOLS_VALUES_H

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tool {

// A number from nMin to nMax, in decimal.
int64_t parseNumber(const std::string& strText, int64_t nMin, int64_t nMax);

// A user's number, and that of a user of this machine. Throws Failure where the user database fails.
unsigned int parseUid(const std::string& strText);
unsigned int parseUser(const std::string& strName);

// The name of a user; nothing, or a Failure, where this machine does not know the user. Both throw Failure
// where the user database fails. The third is for lists, which do without the name in either case.
std::optional<std::string> findUserName(Json::Int64 nUid);
std::string userName(Json::Int64 nUid);
std::optional<std::string> userNameIfKnown(Json::Int64 nUid);

// Seconds in a text such as "90m", "1d12h" or "45" (seconds); from a second to a thousand years.
int64_t parseDuration(const std::string& strText);

// Seconds since the epoch: "@1767225600", "2026-12-31", "2026-12-31 23:59", "2026-12-31T23:59:59",
// the last three with a "Z" behind them in UTC, otherwise in local time.
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

// As a token's webapi_allow.
Json::Value allowanceJson(const std::vector<Allowance>& allowances);

// A JSON object, or that of a file for "@FILE".
Json::Value parseExtra(const std::string& strText);

} // namespace tool

#endif
