#include "ChangedTokens.h"

#include <vector>

#include "Json.h"

namespace {

// The ids of those tokens that are in the store again.
std::vector<std::string> findBack(tool::Store& store, const std::set<std::string>& strTids)
{
    std::vector<std::string> strBack;
    for (const std::string& strTid : strTids) {
        if (store.find(strTid)) {
            strBack.push_back(strTid);
        }
    }
    return strBack;
}

// Whether a number of uses is from before the change. A grant only lowers a number; it never adds uses, and
// never adds or removes a limit. Negative numbers mean no limit.
bool isOldCount(int64_t nCount, int64_t nSet)
{
    return (nCount < 0) != (nSet < 0) || nCount > nSet;
}

// Compares as texts, because a NaN in a value is not equal to itself.
bool isSame(const Json::Value& jLeft, const Json::Value& jRight)
{
    return tool::compactJson(jLeft) == tool::compactJson(jRight);
}

// Whether a call has written back a record that it had read before the change, with one use less. Such a
// record looks like one whose uses were raised here and spent since; that counts as undone too.
bool isUndone(const Json::Value& jNow, const Json::Value& jBefore, const Json::Value& jChange)
{
    for (const std::string& strName : jChange.getMemberNames()) {
        const Json::Value& jSet = jChange[strName];
        const Json::Value& jIs = jNow[strName];
        const bool blUndone = strName == "count" ? isOldCount(jIs.asInt64(), jSet.asInt64())
                                                 : !isSame(jIs, jSet) && isSame(jIs, jBefore[strName]);
        if (blUndone) {
            return true;
        }
    }
    return false;
}

} // namespace

namespace tool {

void outlastRevoked(const Change& change)
{
    outlastCalls(change, "a token came back", "revoked");
}

void outlastRevoked(const std::set<std::string>& strTids)
{
    const auto isUndoneNow = [&strTids] {
        Store store(Store::Access::Glance);
        return !findBack(store, strTids).empty();
    };
    const auto revokeAgain = [&strTids](Store& store) { return store.removeTids(findBack(store, strTids)); };
    outlastRevoked({isUndoneNow, revokeAgain});
}

std::optional<Json::Value> outlastUpdated(const Json::Value& jBefore, const Json::Value& jChange)
{
    const std::string strTid = jBefore["tid"].asString();
    std::optional<Json::Value> jNow;
    const auto isNeeded = [&](Store& store) {
        jNow = store.find(strTid);
        return jNow && isUndone(*jNow, jBefore, jChange);
    };
    const auto updateAgain = [&](Store& store) -> uint64_t {
        const bool blNeeded = isNeeded(store);
        if (blNeeded) {
            store.update(strTid, jChange);
        }
        return blNeeded;
    };
    const auto isUndoneNow = [&] {
        Store store(Store::Access::Glance);
        return isNeeded(store);
    };
    outlastCalls({isUndoneNow, updateAgain}, "the token was written back as it had been", "updated");
    return jNow;
}

} // namespace tool
