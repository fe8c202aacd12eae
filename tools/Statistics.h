// Counts what the store holds.

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
    std::optional<Json::Int64> nUid; // nothing for NULL
    uint64_t nTokens;
};

struct Statistics {
    uint64_t nTokens;
    uint64_t nExpired;
    uint64_t nUnlimited;
    uint64_t nExpiringInDay; // from now; expired tokens do not count
    uint64_t nExpiringInWeek;
    uint64_t nOpeningNothing;
    uint64_t nOldUnlimited; // of unlimited uses, and older than a year
    std::vector<Group> functions;
    std::vector<UserGroup> users;
    uint64_t nFileBytes;
    uint64_t nFreePages;
    uint64_t nPageBytes;
};

// Counts the tokens in steps. Throws Failure.
Statistics collectStatistics();

// How many tokens have an owner who is not a user of this machine. Does not count owners whose look-up fails.
uint64_t countWithoutOwner(const Statistics& statistics);

} // namespace tool

#endif
