#include "Statistics.h"

#include <algorithm>
#include <ctime>
#include <map>

#include "AccessTokenDefine.h"
#include "Arguments.h"
#include "Failure.h"
#include "Place.h"
#include "Schema.h"
#include "Steps.h"
#include "Values.h"

namespace {

const int64_t DAY = 86400; // seconds
const int64_t YEAR = 365 * DAY;

// These two return conditions in SQL.
std::string expiringWithin(int64_t nSeconds)
{
    tool::Selection expiring;
    expiring.nExpiring = nSeconds;
    return expiring.sql();
}

std::string oldAndUnlimited()
{
    tool::Selection old;
    old.blUnlimited = true;
    old.nCreatedBefore = time(nullptr) - YEAR;
    return old.sql();
}

Json::Int64 numberOf(const std::optional<std::string>& strText)
{
    return strtoll(strText.value_or("").c_str(), nullptr, 10);
}

// The groups, those with the most tokens first; equal ones by name or uid.
template <typename Group, typename Name>
std::vector<Group> groupsOf(const std::map<Name, uint64_t>& counts)
{
    std::vector<Group> groups;
    for (const auto& [name, nTokens] : counts) {
        groups.push_back({name, nTokens});
    }
    std::stable_sort(groups.begin(), groups.end(),
                     [](const Group& left, const Group& right) { return left.nTokens > right.nTokens; });
    return groups;
}

} // namespace

namespace tool {

Statistics collectStatistics()
{
    Statistics statistics = {};
    std::map<std::string, uint64_t> functions;
    std::map<std::optional<Json::Int64>, uint64_t> users;
    const std::string strExpressions =
        std::string("function, CAST(uid AS INTEGER), count(*), total(count < 0), total(") +
        grant::SQL_EXPIRED + "), total(" + expiringWithin(DAY) + "), total(" + expiringWithin(7 * DAY) +
        "), total(webapi_allow = '{}'), total(" + oldAndUnlimited() + ")";
    Steps steps(Store::Access::Glance, "Counting", Steps::Order::ByRow);
    while (steps.next([&](Store& store, const std::string& strThose) {
        store.select(strExpressions, strThose + " GROUP BY 1, 2", [&](const Row& row) {
            const auto nTokens = static_cast<uint64_t>(numberOf(row[2]));
            statistics.nTokens += nTokens;
            statistics.nUnlimited += static_cast<uint64_t>(numberOf(row[3]));
            statistics.nExpired += static_cast<uint64_t>(numberOf(row[4]));
            statistics.nExpiringInDay += static_cast<uint64_t>(numberOf(row[5]));
            statistics.nExpiringInWeek += static_cast<uint64_t>(numberOf(row[6]));
            statistics.nOpeningNothing += static_cast<uint64_t>(numberOf(row[7]));
            statistics.nOldUnlimited += static_cast<uint64_t>(numberOf(row[8]));
            functions[row[0].value_or("")] += nTokens;
            users[row[1] ? std::optional(numberOf(row[1])) : std::nullopt] += nTokens;
        });
    })) {
    }
    const Schema::Pages pages = Schema(Store::Access::Glance).pages();
    statistics.nFreePages = pages.nFree;
    statistics.nPageBytes = pages.nBytes;
    statistics.functions = groupsOf<Group>(functions);
    statistics.users = groupsOf<UserGroup>(users);
    const auto status = statusOf(VEMO_ATOKEN_DB_PATH);
    statistics.nFileBytes = status ? static_cast<uint64_t>(status->st_size) : 0;
    return statistics;
}

uint64_t countWithoutOwner(const Statistics& statistics)
{
    uint64_t nTokens = 0;
    for (const UserGroup& group : statistics.users) {
        try {
            nTokens += group.nUid && !findUserName(*group.nUid) ? group.nTokens : 0;
        } catch (const Failure&) {
            // Does not count, because nobody knows.
        }
    }
    return nTokens;
}

} // namespace tool
