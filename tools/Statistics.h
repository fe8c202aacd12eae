// What the store holds, in numbers.

#ifndef TOOLS_STATISTICS_H
#define TOOLS_STATISTICS_H

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tool {

struct Group {
    std::string strName;
    uint64_t nTokens;
};

struct UserGroup {
    std::optional<Json::Int64> nUid; // nothing for a NULL
    uint64_t nTokens;
};

struct Statistics {
    uint64_t nTokens;
    uint64_t nExpired;
    uint64_t nUnlimited;
    uint64_t nExpiringInDay; // from now
    uint64_t nExpiringInWeek;
    uint64_t nOpeningNothing;
    uint64_t nOldUnlimited; // older than a year, with any number of uses
    std::vector<Group> functions;
    std::vector<UserGroup> users;
    uint64_t nFileBytes;
    uint64_t nFreePages;
    uint64_t nPageBytes;
};

// Counts the tokens, in steps. Throws Failure.
Statistics collectStatistics();

// How many tokens have an owner who is not a user of this machine. Owners whom the user database fails to
// look up are none of them.
uint64_t countWithoutOwner(const Statistics& statistics);

} // namespace tool

#endif
