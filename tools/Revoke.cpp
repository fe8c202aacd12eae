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

std::string tokensText(int64_t nTokens)
{
    return std::to_string(nTokens) + (1 == nTokens ? " token" : " tokens");
}

void report(int64_t nTokens, const std::string& strDone, bool blDryRun)
{
    tool::print(tokensText(nTokens) + (blDryRun ? " would be " : " ") + strDone + "\n");
}

// The ids that the arguments stand for.
std::vector<std::string> readAll(const std::vector<std::string>& strArguments)
{
    std::vector<std::string> strTids;
    for (const std::string& strArgument : strArguments) {
        for (const std::string& strTid : tool::readTids(strArgument)) {
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
    report(static_cast<int64_t>(strTids.size()), "revoked", options.blDryRun);
    return tool::EXIT_STATUS_DONE;
}

// Whether the administrator wants it. Tokens that come or go meanwhile do not matter: those that are
// there in the end are revoked, and counted.
bool isWanted(int64_t nTokens, bool blYes)
{
    if (blYes) {
        return true;
    }
    if (!tool::isTerminal(stdin) || !tool::isTerminal(stderr)) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "--yes is needed to revoke many where there is nobody to ask");
    }
    return 0 == nTokens || tool::confirm("Revoke " + tokensText(nTokens) + "?");
}

int revokeMany(const RevokeOptions& options)
{
    const Json::Value jFilter = options.selection.filter();
    const int64_t nTokens = tool::Store(tool::Store::Access::Read).count(jFilter);
    if (options.blDryRun) {
        report(nTokens, "revoked", true);
        return tool::EXIT_STATUS_DONE;
    }
    if (!isWanted(nTokens, options.blYes)) {
        report(0, "revoked", false);
        return tool::EXIT_STATUS_DONE;
    }
    tool::Store store(tool::Store::Access::Write);
    const int64_t nRevoked = store.remove(jFilter);
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
    return options.strTids.empty() ? revokeMany(options) : revokeNamed(options);
}

int purge(const PurgeOptions& options)
{
    tool::Store store(options.blDryRun ? tool::Store::Access::Read : tool::Store::Access::Write);
    int64_t nTokens = 0;
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
    Command command = commands.add("revoke", "delete tokens", [pOptions] { return revoke(*pOptions); });
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
    Command command =
        commands.add("purge", "delete the expired tokens", [pOptions] { return purge(*pOptions); });
    command.flag("--dry-run", pOptions->blDryRun, "only tell how many");
}

} // namespace tool
