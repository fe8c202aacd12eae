// check and grant: whether a token allows a call.

#include <memory>

#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Json.h"
#include "Layout.h"
#include "Store.h"

namespace {

struct Options {
    std::string strTid;
    std::string strApi;
    std::string strMethod;
    bool blPrintUser = false;
    tool::Layout layout;
};

const char* reasonOf(grant::Verdict verdict)
{
    switch (verdict) {
    case grant::Verdict::Granted: break;
    case grant::Verdict::Unknown: return "unknown token";
    case grant::Verdict::Expired: return "expired";
    case grant::Verdict::ApiNotListed: return "API not listed";
    case grant::Verdict::MethodNotListed: return "method not listed";
    case grant::Verdict::Malformed: return "malformed token";
    }
    return "";
}

grant::Verdict judge(std::optional<grant::Token>& token, const Options& options)
{
    return token ? grant::judge(*token, options.strApi, options.strMethod) : grant::Verdict::Unknown;
}

std::string refusalNow(const std::string& strTid, const Options& options)
{
    tool::Store store(tool::Store::Access::Read);
    const std::optional<Json::Value> jFound = store.findByPrefix(strTid);
    std::optional<grant::Token> token;
    if (jFound) {
        token = store.token((*jFound)["tid"].asString());
    }
    return reasonOf(judge(token, options));
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

// The owner's name, when the use has been spent.
std::string owner(int64_t nUid)
{
    try {
        return tool::userName(nUid);
    } catch (const tool::Failure& failure) {
        throw tool::Failure(failure.status(), "granted, but " + failure.fact());
    }
}

// In one transaction with the look-up, so that no other grant spends the same use. Returns the owner.
int64_t spendUse(const std::string& strTid, const Options& options)
{
    tool::Store store(tool::Store::Access::Write);
    std::optional<grant::Token> token = store.token(strTid);
    const grant::Verdict verdict = judge(token, options);
    store.purge();
    if (grant::Verdict::Granted == verdict) {
        store.spend(*token);
    }
    store.commit();
    if (grant::Verdict::Granted != verdict) {
        throw tool::Failure(tool::EXIT_STATUS_REFUSED, std::string("refused: ") + reasonOf(verdict));
    }
    return token->nUid;
}

int grantCall(const Options& options)
{
    const int64_t nUid = spendUse(tool::readTid("TID", options.strTid), options);
    if (options.blPrintUser) {
        tool::printLine(owner(nUid));
    } else {
        tool::print("granted\n");
    }
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
                                    [pOptions] { return grantCall(*pOptions); });
    addCall(command, *pOptions);
    command.flag("--print-user", pOptions->blPrintUser, "print the owner's name");
}

} // namespace tool
