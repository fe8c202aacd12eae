// revoke and purge: takes tokens back.

#include <unistd.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <set>

#include "Aftermath.h"
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

// Deletes the tokens again that find() finds in the store, for as long as calls can write them back.
template <typename Find>
void revokeAgain(Find find)
{
    const auto isUndone = [&find](tool::Store& store) { return !find(store).empty(); };
    const auto revoke = [&find](tool::Store& store) {
        uint64_t nRevoked = 0;
        for (const std::string& strTid : find(store)) {
            nRevoked += store.removeTid(strTid);
        }
        return nRevoked;
    };
    tool::outlastCalls({isUndone, revoke}, "a token came back", "revoked");
}

// The ids of the tokens that the names stand for; two can name the same.
std::set<std::string> tidsOf(tool::Store& store, const std::vector<std::string>& strNames)
{
    std::set<std::string> strTids;
    for (const std::string& strName : strNames) {
        const auto jToken = store.findByPrefix(strName);
        if (jToken) {
            strTids.insert((*jToken)["tid"].asString());
        }
    }
    return strTids;
}

size_t countNamed(const std::vector<std::string>& strNames)
{
    tool::Store store(tool::Store::Access::Read);
    return tidsOf(store, strNames).size();
}

std::set<std::string> removeNamed(const std::vector<std::string>& strNames)
{
    tool::Store store(tool::Store::Access::Write);
    const std::set<std::string> strTids = tidsOf(store, strNames);
    for (const std::string& strTid : strTids) {
        store.removeTid(strTid);
    }
    store.commit();
    return strTids;
}

int revokeNamed(const RevokeOptions& options)
{
    const std::vector<std::string> strNames = readAll(options.strTids);
    if (options.blDryRun) {
        report(countNamed(strNames), "revoked", true);
        return tool::EXIT_STATUS_DONE;
    }
    const std::set<std::string> strTids = removeNamed(strNames);
    revokeAgain([&strTids](tool::Store& store) {
        std::vector<std::string> strBack;
        for (const std::string& strTid : strTids) {
            if (store.find(strTid)) {
                strBack.push_back(strTid);
            }
        }
        return strBack;
    });
    report(strTids.size(), "revoked", false);
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

// Hashes of the ids of tokens: a million ids themselves would take much memory. That a new token has the hash
// of one of them has a chance of one in 10^13 then.
typedef std::vector<size_t> Hashes;

size_t hashOf(const std::string& strTid)
{
    return std::hash<std::string>()(strTid);
}

// Returns those of the tokens that it has deleted, in ascending order.
Hashes removeMany(const Json::Value& jFilter)
{
    tool::Store store(tool::Store::Access::Write);
    Hashes hashes;
    store.eachTid(jFilter, [&hashes](const std::string& strTid) { hashes.push_back(hashOf(strTid)); });
    store.remove(jFilter);
    store.commit();
    std::sort(hashes.begin(), hashes.end());
    return hashes;
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
    const Hashes revoked = removeMany(jFilter);
    revokeAgain([&](tool::Store& store) {
        std::vector<std::string> strBack;
        store.eachTid(jFilter, [&](const std::string& strTid) {
            if (std::binary_search(revoked.begin(), revoked.end(), hashOf(strTid))) {
                strBack.push_back(strTid);
            }
        });
        return strBack;
    });
    report(revoked.size(), "revoked", false);
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

uint64_t expired()
{
    tool::Store store(tool::Store::Access::Read);
    return store.number(std::string("SELECT count(*) FROM token WHERE ") + grant::SQL_EXPIRED);
}

uint64_t removeExpired()
{
    tool::Store store(tool::Store::Access::Write);
    const uint64_t nTokens = store.purge();
    store.commit();
    return nTokens;
}

int purge(const PurgeOptions& options)
{
    report(options.blDryRun ? expired() : removeExpired(), "purged", options.blDryRun);
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
