// update: changes fields of a token.

#include <algorithm>
#include <ctime>
#include <memory>

#include "Arguments.h"
#include "ChangedTokens.h"
#include "Commands.h"
#include "Console.h"
#include "Json.h"
#include "Masking.h"
#include "Store.h"

namespace {

struct Options {
    std::string strTid;
    std::optional<int64_t> nCount;
    std::optional<int64_t> nDeadline;
    std::optional<int64_t> nTtl;
    std::vector<tool::Allowance> allow;
    std::vector<tool::Allowance> addAllow;
    std::vector<tool::Allowance> removeAllow;
    std::optional<std::string> strSid;
    std::optional<Json::Value> jExtra;
    std::optional<std::string> strNote;

    bool empty() const
    {
        return !nCount && !nDeadline && !nTtl && allow.empty() && addAllow.empty() && removeAllow.empty() &&
               !strSid && !jExtra && !strNote;
    }
};

int64_t parseDeadline(const std::string& strText)
{
    const int64_t nDeadline = tool::parseTime(strText);
    if (nDeadline < time(nullptr)) {
        throw tool::BadValue(tool::quoted(strText) + " has passed; to take the token back, revoke it");
    }
    return nDeadline;
}

[[noreturn]] void failOnMalformed()
{
    throw tool::Failure(
        tool::EXIT_STATUS_USAGE,
        "what the token opens is malformed and cannot be changed in part; replace it with --allow");
}

// The methods that a token lists for an API.
Json::Value& methodsOf(Json::Value& jAllow, const std::string& strApi)
{
    if (!jAllow[strApi].isObject() || !jAllow[strApi]["method"].isArray()) {
        failOnMalformed();
    }
    return jAllow[strApi]["method"];
}

void addAllowed(Json::Value& jAllow, const std::vector<tool::Allowance>& allowances)
{
    const Json::Value jAdded = tool::allowanceJson(allowances);
    for (const std::string& strApi : jAdded.getMemberNames()) {
        if (!jAllow.isMember(strApi)) {
            jAllow[strApi] = jAdded[strApi];
        }
        Json::Value& jMethods = methodsOf(jAllow, strApi);
        for (const Json::Value& jMethod : jAdded[strApi]["method"]) {
            if (std::find(jMethods.begin(), jMethods.end(), jMethod) == jMethods.end()) {
                jMethods.append(jMethod);
            }
        }
    }
}

void removeMethod(Json::Value& jMethods, const std::string& strApi, const std::string& strMethod)
{
    Json::Value jKept(Json::arrayValue);
    for (const Json::Value& jMethod : jMethods) {
        if (jMethod != Json::Value(strMethod)) {
            jKept.append(jMethod);
        }
    }
    if (jKept.size() == jMethods.size()) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--remove-allow: the token does not list " +
                                                         tool::quoted(strApi + ":" + strMethod));
    }
    jMethods = jKept;
}

void removeAllowed(Json::Value& jAllow, const std::vector<tool::Allowance>& allowances)
{
    for (const tool::Allowance& allowance : allowances) {
        if (!jAllow.isMember(allowance.strApi)) {
            throw tool::Failure(tool::EXIT_STATUS_USAGE,
                                "--remove-allow: the token does not list " + tool::quoted(allowance.strApi));
        }
        if (allowance.strMethods.empty()) {
            jAllow.removeMember(allowance.strApi);
            continue;
        }
        Json::Value& jMethods = methodsOf(jAllow, allowance.strApi);
        for (const std::string& strMethod : allowance.strMethods) {
            removeMethod(jMethods, allowance.strApi, strMethod);
        }
    }
}

// What the token opens after the change.
Json::Value changedAllow(const Json::Value& jToken, const Options& options)
{
    if (!options.allow.empty()) {
        return tool::allowanceJson(options.allow);
    }
    Json::Value jAllow = jToken["webapi_allow"];
    if (!jAllow.isObject()) {
        failOnMalformed();
    }
    addAllowed(jAllow, options.addAllow);
    removeAllowed(jAllow, options.removeAllow);
    return jAllow;
}

// The field "extra" after the change. A note cannot be added to a text that the library cannot read
// completely: the rest would be lost.
Json::Value changedExtra(tool::Store& store, const Json::Value& jToken, const Options& options)
{
    Json::Value jExtra = options.jExtra.value_or(jToken["extra"]);
    bool blWhole = true;
    if (!options.jExtra) {
        store.select(
            "extra", tool::sqlText("tid = %Q", jToken["tid"].asCString()),
            [&blWhole](const tool::Row& row) { blWhole = tool::flawOfStored(row[0].value_or("")).empty(); });
    }
    if (!blWhole || !jExtra.isObject()) {
        throw tool::Failure(
            tool::EXIT_STATUS_USAGE,
            "the data of the token are malformed and cannot hold a note; replace them with --extra");
    }
    if (options.strNote) {
        tool::setNote(jExtra, *options.strNote);
    }
    return jExtra;
}

// The new values of the fields that change.
Json::Value changeOf(tool::Store& store, const Json::Value& jToken, const Options& options)
{
    Json::Value jChange(Json::objectValue);
    if (options.nCount) {
        jChange["count"] = Json::Int64{*options.nCount};
    }
    if (options.nDeadline) {
        jChange["deadline"] = Json::Int64{*options.nDeadline};
    }
    if (options.nTtl) {
        jChange["deadline"] = Json::Int64{time(nullptr) + *options.nTtl};
    }
    if (options.strSid) {
        jChange["bind_sid"] = *options.strSid;
    }
    if (options.jExtra || options.strNote) {
        jChange["extra"] = changedExtra(store, jToken, options);
    }
    if (!options.allow.empty() || !options.addAllow.empty() || !options.removeAllow.empty()) {
        jChange["webapi_allow"] = changedAllow(jToken, options);
    }
    return jChange;
}

// Makes the change again for as long as calls can write the token back as it was.
void updateAgain(const Json::Value& jBefore, const Json::Value& jChange)
{
    const std::optional<Json::Value> jNow = tool::outlastUpdated(jBefore, jChange);
    if (!jNow) {
        tool::complain("the token is gone: a call has spent its last use meanwhile, or deleted it");
        return;
    }
    const int64_t nLeft = (*jNow)["count"].asInt64();
    if (jChange.isMember("count") && nLeft >= 0 && nLeft != jChange["count"].asInt64()) {
        tool::complain(tool::countText(static_cast<uint64_t>(nLeft), "use") +
                       " left: calls have spent some meanwhile, or written back an old number");
    }
}

// Changes the token. Returns it as it was before.
Json::Value updateToken(const std::string& strTid, const Options& options, Json::Value& jChange)
{
    tool::Store store(tool::Store::Access::Write);
    const std::optional<Json::Value> jToken = store.findByPrefix(strTid);
    if (!jToken) {
        store.commit();
        throw tool::noSuchToken();
    }
    jChange = changeOf(store, *jToken, options);
    store.update((*jToken)["tid"].asString(), jChange);
    store.commit();
    return *jToken;
}

int update(const Options& options)
{
    if (options.empty()) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "say what to change; \"update --help\" lists the fields");
    }
    Json::Value jChange;
    const Json::Value jToken = updateToken(tool::readTid("TID", options.strTid), options, jChange);
    updateAgain(jToken, jChange);
    tool::print("1 token updated\n");
    for (const auto& [szName, pAllowances] :
         {std::pair("--allow", &options.allow), std::pair("--add-allow", &options.addAllow)}) {
        for (const std::string& strDoubt : tool::doubtsAbout(szName, *pAllowances)) {
            tool::complain(strDoubt);
        }
    }
    if (jChange.get("deadline", jToken["deadline"]).asInt64() < time(nullptr)) {
        tool::complain(
            "the token has expired; the next call of a program purges it, unless --ttl or --deadline "
            "give it time");
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addUpdate(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command =
        commands.add("update", "change fields of a token", [pOptions] { return update(*pOptions); });
    addTid(command, pOptions->strTid);
    addUses(command, pOptions->nCount);
    addParsed(command, "--deadline", "TIME", pOptions->nDeadline, parseDeadline,
              "expiry: 2026-12-31, \"2026-12-31 23:59\", 2026-12-31T23:59:59Z or @SECONDS");
    addTtl(command, pOptions->nTtl);
    command.exclude("--ttl", "--deadline");
    addAllowances(command, "--allow", pOptions->allow, "all that it opens from now on");
    addAllowances(command, "--add-allow", pOptions->addAllow, "what it opens in addition");
    addAllowances(command, "--remove-allow", pOptions->removeAllow, "what it no longer opens");
    command.exclude("--add-allow", "--allow");
    command.exclude("--remove-allow", "--allow");
    const auto keep = [](const std::string& strText) { return strText; };
    addParsed(command, "--bind-sid", "SID", pOptions->strSid, keep,
              "bind it to this login session; \"\" unbinds it");
    addExtra(command, pOptions->jExtra);
    addNote(command, pOptions->strNote);
    command.example("- --ttl 30d --uses 5 <id");
    command.example("- --add-allow Backup:list,get <id");
}

} // namespace tool
