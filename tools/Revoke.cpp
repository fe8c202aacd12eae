// revoke and purge: delete tokens.

#include <unistd.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <set>
#include <thread>

#include "Arguments.h"
#include "ChangedTokens.h"
#include "Commands.h"
#include "Console.h"
#include "Progress.h"
#include "Steps.h"

namespace {

const size_t NAMES_MAX = 100000;     // their ids take less than 100 MB of memory
const size_t NAMES_OF_A_STEP = 1000; // one transaction

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

// The ids of the tokens that names stand for, and how many names stand for none. Two can name the same token.
struct Named {
    std::set<std::string> strTids;
    uint64_t nUnknown = 0;
};

// The failure of a step, with the number of tokens that earlier steps removed. The message says already what
// became of the step itself.
tool::Failure ofStep(const tool::Failure& failure, uint64_t nRemoved)
{
    return 0 == nRemoved ? failure
                         : tool::Failure(failure.status(), failure.what(),
                                         tool::countText(nRemoved, "token") +
                                             " were gone before that; repeat the command for the rest");
}

// Looks up tokens by their names. Names of tokens in before, which are deleted, do not count as unknown.
Named findNamed(tool::Store& store, const std::vector<std::string>& strNames, const Named& before)
{
    Named named;
    for (const std::string& strName : strNames) {
        const auto jToken = store.findByPrefix(strName);
        const auto pBefore = before.strTids.lower_bound(strName);
        if (jToken) {
            named.strTids.insert((*jToken)["tid"].asString());
        } else if (before.strTids.end() == pBefore || 0 != pBefore->compare(0, strName.size(), strName)) {
            ++named.nUnknown;
        }
    }
    return named;
}

void add(Named& named, Named more)
{
    named.strTids.merge(more.strTids);
    named.nUnknown += more.nUnknown;
}

// Calls use() with groups of the names, and lets other programs work between two groups.
template <typename Use>
void eachStep(const std::vector<std::string>& strNames, Use use)
{
    for (size_t i = 0; i < strNames.size(); i += NAMES_OF_A_STEP) {
        if (0 != i) {
            std::this_thread::sleep_for(tool::BETWEEN_STEPS);
        }
        const auto pFirst = strNames.begin() + static_cast<std::ptrdiff_t>(i);
        const size_t nNames = std::min(NAMES_OF_A_STEP, strNames.size() - i);
        use(std::vector<std::string>(pFirst, pFirst + static_cast<std::ptrdiff_t>(nNames)));
    }
}

Named lookUpNamed(const std::vector<std::string>& strNames)
{
    Named named;
    eachStep(strNames, [&named](const std::vector<std::string>& strSome) {
        tool::Store store(tool::Store::Access::Read);
        add(named, findNamed(store, strSome, named));
    });
    return named;
}

Named removeNamed(const std::vector<std::string>& strNames)
{
    if (strNames.size() > NAMES_OF_A_STEP) {
        lookUpNamed(strNames); // so a name that stands for several tokens fails before any is deleted
    }
    Named removed;
    eachStep(strNames, [&removed](const std::vector<std::string>& strSome) {
        Named now;
        try {
            tool::Store store(tool::Store::Access::Write);
            now = findNamed(store, strSome, removed);
            for (const std::string& strTid : now.strTids) {
                store.removeTid(strTid);
            }
            store.commit();
        } catch (const tool::Failure& failure) {
            throw ofStep(failure, removed.strTids.size());
        }
        add(removed, std::move(now));
    });
    return removed;
}

int revokeNamed(const RevokeOptions& options)
{
    const std::vector<std::string> strNames = readAll(options.strTids);
    if (strNames.size() > NAMES_MAX) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "TID: there are more than " + std::to_string(NAMES_MAX) + " ids",
                            "revoke them some at a time, or by what they have in common");
    }
    const Named named = options.blDryRun ? lookUpNamed(strNames) : removeNamed(strNames);
    if (!options.blDryRun && !named.strTids.empty()) {
        tool::outlastRevoked(named.strTids);
    }
    report(named.strTids.size(), "revoked", options.blDryRun);
    if (strNames.empty()) {
        tool::complain("no token matches");
    }
    if (named.nUnknown) {
        tool::complain(tool::countText(named.nUnknown, "id") + (1 == named.nUnknown ? " is" : " are") +
                       " unknown");
    }
    return tool::EXIT_STATUS_DONE;
}

// Asks the administrator. Tokens may come or go meanwhile: those that are there in the end are revoked.
bool isWanted(const tool::Selection& selection)
{
    if (!tool::isTerminal(stdin) || !tool::isTerminal(stderr)) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "repeat with --yes: there is nobody to ask");
    }
    const uint64_t nTokens = tool::countSelected(selection);
    return 0 == nTokens || tool::confirm("Revoke " + tool::countText(nTokens, "token") + "?");
}

// Hashes of ids, because a million ids would take much memory. The chance that a new token has the same hash
// as one of a million revoked tokens is less than one in 10^13.
typedef std::vector<size_t> Hashes;

size_t hashOf(const std::string& strTid)
{
    return std::hash<std::string>()(strTid);
}

// Deletes the tokens that a condition in SQL selects, in steps that let other programs work. Calls gone() for
// each id. Returns how many were deleted.
uint64_t removeInSteps(const std::string& strTitle, const std::string& strWhere,
                       const std::function<uint64_t()>& count,
                       const std::function<void(const std::string&)>& gone)
{
    tool::Progress progress(strTitle, count, true, tool::MANY);
    uint64_t nRemoved = 0;
    try {
        tool::Steps steps(tool::Store::Access::Write);
        uint64_t nNow = 0;
        while (steps.next([&](tool::Store& store, const std::string& strThose) {
            const std::string strNow = strThose + " AND " + strWhere;
            store.eachTid(strNow, [&](const auto& strTid) { gone(strTid.value_or("")); });
            nNow = store.remove(strNow);
        })) {
            nRemoved += nNow;
            progress.step(nNow);
        }
    } catch (const tool::Failure& failure) {
        throw ofStep(failure, nRemoved);
    }
    return nRemoved;
}

// hashes must be sorted.
bool isOneOf(const Hashes& hashes, const std::string& strTid)
{
    return std::binary_search(hashes.begin(), hashes.end(), hashOf(strTid));
}

int revokeMany(const RevokeOptions& options)
{
    const tool::Selection& selection = options.selection;
    if (options.blDryRun) {
        report(tool::countSelected(selection), "revoked", true);
        return tool::EXIT_STATUS_DONE;
    }
    if (!options.blYes && !isWanted(selection)) {
        report(0, "revoked", false);
        return tool::EXIT_STATUS_DONE;
    }
    const std::string strWhere = selection.sql();
    Hashes revoked;
    removeInSteps(
        "Revoking", strWhere, [&selection] { return tool::countSelected(selection); },
        [&revoked](const std::string& strTid) { revoked.push_back(hashOf(strTid)); });
    std::sort(revoked.begin(), revoked.end());

    const auto findBack = [&](tool::Store& store, const std::string& strThose) {
        std::vector<std::string> strTids;
        store.eachTid(strThose + " AND " + strWhere, [&](const auto& strTid) {
            if (isOneOf(revoked, strTid.value_or(""))) {
                strTids.push_back(strTid.value_or(""));
            }
        });
        return strTids;
    };
    std::vector<std::string> strBack;
    const auto isUndone = [&] {
        tool::Steps steps(tool::Store::Access::Glance);
        while (steps.next([&](tool::Store& store, const std::string& strThose) {
            const std::vector<std::string> strMore = findBack(store, strThose);
            strBack.insert(strBack.end(), strMore.begin(), strMore.end());
        })) {
        }
        return !strBack.empty();
    };
    const auto revokeAgain = [&](tool::Store& store) {
        const auto strTids = strBack.empty() ? findBack(store, "true") : std::exchange(strBack, {});
        return store.removeTids(strTids);
    };
    if (!revoked.empty()) {
        tool::outlastRevoked({isUndone, revokeAgain});
    }
    report(revoked.size(), "revoked", false);
    return tool::EXIT_STATUS_DONE;
}

int revoke(const RevokeOptions& options)
{
    const int nWays = !options.strTids.empty() + !options.selection.empty() + options.blAll;
    if (nWays != 1) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE,
                            "say which tokens: by TID, by options that select, or --all");
    }
    // An empty variable in a script must not revoke all tokens that are bound to no session.
    if (options.selection.strSid == "") {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--bind-sid: must not be empty");
    }
    return options.strTids.empty() ? revokeMany(options) : revokeNamed(options);
}

int purge(const PurgeOptions& options)
{
    tool::Selection expired;
    expired.blExpired = true;
    const auto count = [&expired] { return tool::countSelected(expired); };
    const uint64_t nTokens = options.blDryRun
                                 ? count()
                                 : removeInSteps("Purging", expired.sql(), count, [](const std::string&) {});
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
    command.flag("--dry-run", pOptions->blDryRun, "only say how many");
    command.flag("--yes", pOptions->blYes, "do not ask");
    command.example("- <id");
    command.example("--user root --function backup --yes");
}

void addPurge(Commands& commands)
{
    auto pOptions = std::make_shared<PurgeOptions>();
    Command& command =
        commands.add("purge", "delete the expired tokens", [pOptions] { return purge(*pOptions); });
    command.flag("--dry-run", pOptions->blDryRun, "only say how many");
    command.example("");
    command.example("--dry-run");
}

} // namespace tool
