#include "ChangedTokens.h"

#include <vector>

#include "Json.h"

namespace {

// Those of the tokens that are there.
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

// Whether a number of uses is one from before the one that was set: no grant adds uses, takes a limit away or
// brings one. Negative ones are without a limit; of these, -1 is the one that is set.
bool isOldCount(int64_t nCount, int64_t nSet)
{
    return (nCount < 0) != (nSet < 0) || nCount > nSet;
}

// As texts: a NaN in it is not equal to itself.
bool isSame(const Json::Value& jLeft, const Json::Value& jRight)
{
    return tool::compactJson(jLeft) == tool::compactJson(jRight);
}

// Whether a record is one from before the change: a call that had read it has written it back, with a use
// less. It cannot be told from one whose uses were raised here, and spent since.
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
