// create and generate: new tokens, new ids.

#include <ctime>
#include <memory>

#include "AccessTokenDefine.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Handover.h"
#include "Layout.h"
#include "Store.h"

namespace {

struct Options {
    std::optional<unsigned int> nUid;
    std::string strFunction;
    std::optional<int64_t> nTtl;
    std::optional<int64_t> nCount;
    std::vector<tool::Allowance> allowances;
    std::string strSid;
    std::optional<Json::Value> jExtra;
    std::optional<std::string> strNote;
    std::optional<std::string> strTid;
    tool::Layout layout;
};

const int64_t TTL_DEFAULT = 86400; // seconds, as in the library

std::string ownTid(const std::string& strArgument)
{
    std::string strTid = tool::readTid("--tid", strArgument);
    if (strTid.size() < VEMO_ATOKEN_LENGTH_MIN) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "--tid: an id needs " + std::to_string(VEMO_ATOKEN_LENGTH_MIN) +
                                " characters at least, this one has " + std::to_string(strTid.size()));
    }
    return strTid;
}

Json::Value recordOf(const Options& options)
{
    Json::Value jToken;
    jToken["tid"] = options.strTid ? ownTid(*options.strTid) : tool::newTid();
    jToken["bind_sid"] = options.strSid;
    jToken["uid"] = *options.nUid;
    jToken["create_time"] = Json::Int64{time(nullptr)};
    jToken["deadline"] = jToken["create_time"].asInt64() + options.nTtl.value_or(TTL_DEFAULT);
    jToken["count"] = Json::Int64{options.nCount.value_or(1)};
    jToken["function"] = options.strFunction;
    jToken["webapi_allow"] = tool::allowanceJson(options.allowances);
    jToken["extra"] = options.jExtra.value_or(Json::Value(Json::objectValue));
    if (options.strNote) {
        tool::setNote(jToken["extra"], *options.strNote);
    }
    return jToken;
}

// Writes the token, without committing yet.
std::unique_ptr<tool::Store> prepare(const Json::Value& jToken)
{
    auto pStore = std::make_unique<tool::Store>(tool::Store::Access::Write, tool::Store::Missing::Make);
    pStore->purge();
    if (pStore->find(jToken["tid"].asString())) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--tid: there is a token with this id already");
    }
    pStore->create(jToken);
    return pStore;
}

// Sentences about what the user probably did not mean.
std::vector<std::string> doubtsAbout(const Options& options)
{
    if (options.allowances.empty()) {
        return {"the token opens nothing: there is no --allow"};
    }
    return tool::doubtsAbout("--allow", options.allowances);
}

int create(const Options& options)
{
    if (!options.nUid) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--uid or --user is required");
    }
    const Json::Value jToken = recordOf(options);
    const std::string strTid = jToken["tid"].asString();
    // Made before the token is: lack of memory does no harm here.
    const std::string strResult = tool::Layout::Form::Table == options.layout.form
                                      ? tool::resultLine(strTid)
                                      : tool::recordText(jToken, options.layout.form);
    const std::vector<std::string> strDoubts = doubtsAbout(options);
    tool::handOver(prepare(jToken), strResult, [&strTid](tool::Store& store) {
        return 0 == store.removeTid(strTid) ? "" : "the token was taken back";
    });
    for (const std::string& strDoubt : strDoubts) {
        tool::complain(strDoubt);
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addCreate(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command =
        commands.add("create", "create a token, of one use and for a day unless told otherwise; print its id",
                     [pOptions] { return create(*pOptions); });
    addUser(command, pOptions->nUid);
    command.option("--function", "TAG", notEmptyInto(pOptions->strFunction), "its purpose");
    command.require("--function");
    addTtl(command, pOptions->nTtl);
    addUses(command, pOptions->nCount);
    addAllowances(command, "--allow", pOptions->allowances, "an API, and methods of it, that it opens");
    command.option("--bind-sid", "SID", into(pOptions->strSid), "bind it to this login session");
    addExtra(command, pOptions->jExtra);
    addNote(command, pOptions->strNote);
    const auto keep = [](const std::string& strText) { return strText; };
    addParsed(command, "--tid", "TID", pOptions->strTid, keep,
              "your own id; \"-\" reads it from standard input");
    addForm(command, pOptions->layout);
    command.example("--user root --function backup --allow Backup:put >id");
    command.example("--uid 1000 --function login --ttl 8h --allow Login");
}

void addGenerate(Commands& commands)
{
    const auto generate = [] {
        print(newTid() + "\n");
        return EXIT_STATUS_DONE;
    };
    Command& command =
        commands.add("generate", "print a fresh id; touches no database", generate, Commands::Needs::Nothing);
    command.example(">id");
    command.example("--verbose >id");
}

} // namespace tool
