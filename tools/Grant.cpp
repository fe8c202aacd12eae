// check and grant: whether a token allows a call.

#include <memory>

#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Json.h"
#include "Layout.h"
#include "Store.h"

namespace {

const char* const EXPIRED = "expired";

struct Options {
    std::string strTid;
    std::string strApi;
    std::string strMethod;
    bool blPrintUser = false;
    tool::Layout layout;
};

// 1, 0 or -1, as the library has it; -1 too where it meets what cannot be a method.
int permission(Json::Value jToken, const Options& options)
{
    try {
        return VEMO_ACCESS_TOKEN::checkPermission(jToken, options.strApi.c_str(), options.strMethod.c_str());
    } catch (const Json::Exception&) {
        return -1;
    }
}

// Why the token of an id, if there is one, does not allow the call; "" when it does.
std::string refusal(tool::Store& store, const std::optional<Json::Value>& jFound, const Options& options)
{
    if (!jFound) {
        return "unknown token";
    }
    Json::Value jToken = *jFound;
    if (store.isExpired(jToken["tid"].asString())) {
        return EXPIRED;
    }
    const int nPermission = permission(jToken, options);
    const Json::Value& jAllow = jToken["webapi_allow"];
    if (0 == nPermission) {
        return "method not listed";
    }
    if (0 > nPermission) {
        return jAllow.isObject() && !jAllow.isMember(options.strApi) ? "API not listed" : "malformed token";
    }
    // What is saved with its uses lowered must be sound in all its fields.
    const bool blSaved = jToken["count"].asInt64() > 1;
    return blSaved && 0 > VEMO_ACCESS_TOKEN::checkJsonType(jToken) ? "malformed token" : "";
}

std::string refusalNow(const std::string& strTid, const Options& options)
{
    tool::Store store(tool::Store::Access::Read);
    return refusal(store, store.findByPrefix(strTid), options);
}

int check(const Options& options)
{
    const std::string strTid = tool::readTid("TID", options.strTid);
    const std::string strReason = refusalNow(strTid, options);
    if (tool::Layout::Form::Table == options.layout.form) {
        tool::print(strReason.empty() ? "allowed\n" : "refused: " + strReason + "\n");
    } else {
        Json::Value jResult;
        jResult["allowed"] = strReason.empty();
        jResult["reason"] = strReason;
        tool::print(tool::compactJson(jResult) + "\n");
    }
    return strReason.empty() ? tool::EXIT_STATUS_DONE : tool::EXIT_STATUS_REFUSED;
}

// Spends one use, by the rules of the library's grant. In one transaction with the look-up, so that no
// other grant spends the same use.
void spend(tool::Store& store, const Json::Value& jToken)
{
    const Json::Int64 nCount = jToken["count"].asInt64();
    if (nCount > 1) {
        Json::Value jChange;
        jChange["count"] = nCount - 1;
        store.update(jToken["tid"].asString(), jChange);
    } else if (nCount >= 0) {
        store.removeTid(jToken["tid"].asString());
    }
}

// The owner's name, when the use has been spent.
std::string owner(const Json::Value& jToken)
{
    try {
        return tool::userName(jToken["uid"].asInt64());
    } catch (const tool::Failure& failure) {
        throw tool::Failure(failure.status(), "granted, but " + failure.fact());
    }
}

int grant(const Options& options)
{
    const std::string strTid = tool::readTid("TID", options.strTid);
    tool::Store store(tool::Store::Access::Write);
    const bool blThere = store.find(strTid).has_value();
    store.purge();
    const std::optional<Json::Value> jToken = store.find(strTid);
    const std::string strReason = blThere && !jToken ? EXPIRED : refusal(store, jToken, options);
    if (strReason.empty()) {
        spend(store, *jToken);
    }
    store.commit();
    if (!strReason.empty()) {
        throw tool::Failure(tool::EXIT_STATUS_REFUSED, "refused: " + strReason);
    }
    if (!options.blPrintUser) {
        tool::print("granted\n");
        return tool::EXIT_STATUS_DONE;
    }
    tool::printLine(owner(*jToken));
    return tool::EXIT_STATUS_DONE;
}

void addCall(tool::Command& command, Options& options)
{
    tool::addTid(command, options.strTid);
    command.argument("API", tool::notEmptyInto(options.strApi), "the API that is called");
    command.optionalArgument("METHOD", tool::into(options.strMethod),
                             "its method; without it, the API alone");
}

} // namespace

namespace tool {

void addCheck(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command =
        commands.add("check", "tell whether a grant would succeed, and why not; spends nothing",
                     [pOptions] { return check(*pOptions); });
    addCall(command, *pOptions);
    addForm(command, pOptions->layout);
}

void addGrant(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("grant", "grant a call, which spends one use of the token",
                                    [pOptions] { return grant(*pOptions); });
    addCall(command, *pOptions);
    command.flag("--print-user", pOptions->blPrintUser, "print the owner's name");
}

} // namespace tool
