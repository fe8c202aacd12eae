// check and grant: whether a token allows a call.

#include <memory>

#include "AccessTokenDefine.h"
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

// The owner's name, after the use was spent.
std::string owner(int64_t nUid)
{
    try {
        return tool::userName(nUid);
    } catch (const tool::Failure& failure) {
        throw tool::Failure(failure.status(), "granted, but " + failure.fact());
    }
}

struct Outcome {
    grant::Verdict verdict;
    int64_t nUid;
    Json::Value jToken; // without its id; set only if granted and asked for
};

// Looks up the token and spends the use in one transaction, so that no other grant can spend the same use.
Outcome spendUse(const std::string& strTid, const Options& options)
{
    tool::Store store(tool::Store::Access::Write);
    std::optional<grant::Token> token = store.token(strTid);
    Outcome outcome = {judge(token, options), token ? token->nUid : 0, {}};
    if (grant::Verdict::Granted == outcome.verdict && tool::Layout::Form::Table != options.layout.form) {
        outcome.jToken = *store.find(strTid);
        outcome.jToken.removeMember("tid");
    }
    store.purge();
    if (grant::Verdict::Granted == outcome.verdict) {
        store.spend(*token);
    }
    store.commit();
    return outcome;
}

int printOutcome(const Outcome& outcome, const Options& options)
{
    const bool blGranted = grant::Verdict::Granted == outcome.verdict;
    Json::Value jResult;
    jResult["granted"] = blGranted;
    jResult["reason"] = reasonOf(outcome.verdict);
    if (blGranted) {
        jResult["token"] = outcome.jToken;
    }
    if (blGranted && options.blPrintUser) {
        jResult["user"] = owner(outcome.nUid);
    }
    tool::print(tool::compactJson(jResult) + "\n");
    return blGranted ? tool::EXIT_STATUS_DONE : tool::EXIT_STATUS_REFUSED;
}

int grantCall(const Options& options)
{
    const std::string strTid = tool::readTid("TID", options.strTid);
    const Outcome outcome = spendUse(strTid, options);
    if (tool::Layout::Form::Table != options.layout.form) {
        return printOutcome(outcome, options);
    }
    if (grant::Verdict::Granted != outcome.verdict) {
        const bool blPart =
            grant::Verdict::Unknown == outcome.verdict && strTid.size() < VEMO_ATOKEN_LENGTH_MIN;
        throw tool::Failure(tool::EXIT_STATUS_REFUSED, std::string("refused: ") + reasonOf(outcome.verdict),
                            blPart ? "a grant needs the whole id" : "");
    }
    if (options.blPrintUser) {
        tool::printLine(owner(outcome.nUid));
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
    command.example("- Backup put <id");
    command.example("- Backup put -o json <id");
}

void addGrant(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("grant", "grant a call, which spends one use of the token",
                                    [pOptions] { return grantCall(*pOptions); });
    addCall(command, *pOptions);
    command.flag("--print-user", pOptions->blPrintUser, "print the owner's name");
    addForm(command, pOptions->layout);
    command.example("- Backup put <id");
    command.example("- Backup put --print-user <id");
}

} // namespace tool
