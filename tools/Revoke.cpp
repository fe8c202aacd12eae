// revoke and purge: takes tokens back.

#include <unistd.h>

#include <memory>
#include <set>

#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Store.h"

namespace {

struct RevokeOptions {
    std::vector<std::string> strTids;
    tool::Selection selection;
    bool blAll = false;
    bool blDryRun = false;
    bool blYes = false;
};

struct PurgeOptions {
    bool blDryRun = false;
};

void report(uint64_t nTokens, const std::string& strDone, bool blDryRun)
{
    tool::print(tool::countText(nTokens, "token") + (blDryRun ? " would be " : " ") + strDone + "\n");
}

// The ids that the arguments stand for.
std::vector<std::string> readAll(const std::vector<std::string>& strArguments)
{
    std::vector<std::string> strTids;
    for (const std::string& strArgument : strArguments) {
        for (const std::string& strTid : tool::readTids("TID", strArgument)) {
            strTids.push_back(strTid);
        }
    }
    return strTids;
}

int revokeNamed(const RevokeOptions& options)
{
    const std::vector<std::string> strNamed = readAll(options.strTids);
    tool::Store store(options.blDryRun ? tool::Store::Access::Read : tool::Store::Access::Write);
    std::set<std::string> strTids; // two arguments can name the same token
    for (const std::string& strName : strNamed) {
        const auto jToken = store.findByPrefix(strName);
        if (jToken) {
            strTids.insert((*jToken)["tid"].asString());
        }
    }
    if (!options.blDryRun) {
        for (const std::string& strTid : strTids) {
            store.removeTid(strTid);
        }
        store.commit();
    }
    report(strTids.size(), "revoked", options.blDryRun);
    return tool::EXIT_STATUS_DONE;
}

uint64_t countOf(const Json::Value& jFilter)
{
    return tool::Store(tool::Store::Access::Read).count(jFilter);
}

// Whether the administrator wants it. Tokens that come or go meanwhile do not matter: those that are
// there in the end are revoked, and counted.
bool isWanted(const Json::Value& jFilter)
{
    if (!tool::isTerminal(stdin) || !tool::isTerminal(stderr)) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "--yes is needed to revoke many where there is nobody to ask");
    }
    const uint64_t nTokens = countOf(jFilter);
    return 0 == nTokens || tool::confirm("Revoke " + tool::countText(nTokens, "token") + "?");
}

int revokeMany(const RevokeOptions& options)
{
    const Json::Value jFilter = options.selection.filter();
    if (options.blDryRun) {
        report(countOf(jFilter), "revoked", true);
        return tool::EXIT_STATUS_DONE;
    }
    if (!options.blYes && !isWanted(jFilter)) {
        report(0, "revoked", false);
        return tool::EXIT_STATUS_DONE;
    }
    tool::Store store(tool::Store::Access::Write);
    const uint64_t nRevoked = store.remove(jFilter);
    store.commit();
    report(nRevoked, "revoked", false);
    return tool::EXIT_STATUS_DONE;
}

int revoke(const RevokeOptions& options)
{
    const int nWays = !options.strTids.empty() + !options.selection.empty() + options.blAll;
    if (nWays != 1) {
        throw tool::Failure(
            tool::EXIT_STATUS_USAGE,
            "say which tokens: by TID, by --uid, --user, --function and --bind-sid, or --all");
    }
    // A script's empty variable shall not revoke all that is bound to no session.
    if (options.selection.strSid == "") {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--bind-sid: must not be empty");
    }
    return options.strTids.empty() ? revokeMany(options) : revokeNamed(options);
}

int purge(const PurgeOptions& options)
{
    tool::Store store(options.blDryRun ? tool::Store::Access::Read : tool::Store::Access::Write);
    uint64_t nTokens = 0;
    if (options.blDryRun) {
        nTokens = store.number(std::string("SELECT count(*) FROM token WHERE ") + tool::SQL_EXPIRED);
    } else {
        nTokens = store.purge();
        store.commit();
    }
    report(nTokens, "purged", options.blDryRun);
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addRevoke(Commands& commands)
{
    auto pOptions = std::make_shared<RevokeOptions>();
    Command& command = commands.add("revoke", "delete tokens", [pOptions] { return revoke(*pOptions); });
    const auto add = [pOptions](const std::string& strTid) { pOptions->strTids.push_back(strTid); };
    command.remainingArguments("TID", add, "ids; \"-\" reads them from standard input, one on each line");
    addSelection(command, pOptions->selection);
    command.flag("--all", pOptions->blAll, "every token there is");
    command.flag("--dry-run", pOptions->blDryRun, "only tell how many");
    command.flag("--yes", pOptions->blYes, "do not ask");
}

void addPurge(Commands& commands)
{
    auto pOptions = std::make_shared<PurgeOptions>();
    Command& command =
        commands.add("purge", "delete the expired tokens", [pOptions] { return purge(*pOptions); });
    command.flag("--dry-run", pOptions->blDryRun, "only tell how many");
}

} // namespace tool
