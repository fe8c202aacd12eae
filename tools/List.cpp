// list and show: which tokens there are.

#include <algorithm>
#include <ctime>
#include <memory>

#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Layout.h"
#include "Store.h"

namespace {

// A field to sort by, and whether downwards.
struct Order {
    std::string strField;
    bool blDescending;
};

struct ListOptions {
    tool::Selection selection;
    bool blExpired = false;
    std::optional<int64_t> nExpiring;
    std::optional<Order> order;
    std::optional<int64_t> nLimit;
    bool blCount = false;
    tool::Layout layout;
};

struct ShowOptions {
    std::string strTid;
    tool::Layout layout;
};

Order parseOrder(const std::string& strText)
{
    const std::string strDescending = ":desc";
    Order order{strText, false};
    if (strText.size() > strDescending.size() &&
        0 == strText.compare(strText.size() - strDescending.size(), strDescending.size(), strDescending)) {
        order = {strText.substr(0, strText.size() - strDescending.size()), true};
    }
    order.strField = tool::parseField(order.strField);
    return order;
}

// What a token is sorted by: its field, but that more uses than any number sort behind all numbers.
Json::Value sortKey(const Json::Value& jToken, const std::string& strField)
{
    const Json::Value& jValue = jToken[strField];
    return strField == "count" && jValue.asInt64() < 0 ? Json::Value(Json::Value::maxInt64) : jValue;
}

void sort(std::vector<Json::Value>& jTokens, const Order& order)
{
    std::stable_sort(jTokens.begin(), jTokens.end(),
                     [&order](const Json::Value& jLeft, const Json::Value& jRight) {
                         const Json::Value jLeftKey = sortKey(jLeft, order.strField);
                         const Json::Value jRightKey = sortKey(jRight, order.strField);
                         return order.blDescending ? jRightKey < jLeftKey : jLeftKey < jRightKey;
                     });
}

std::vector<Json::Value> selected(const ListOptions& options)
{
    const int64_t nNow = time(nullptr);
    tool::Store store(tool::Store::Access::Read);
    const std::set<std::string> strExpired = store.expiredTids();
    std::vector<Json::Value> jTokens;
    for (Json::Value& jToken : store.tokens(options.selection.filter())) {
        const int64_t nDeadline = jToken["deadline"].asInt64();
        const bool blExpired = strExpired.count(jToken["tid"].asString()) != 0;
        const bool blExpiring = !blExpired && options.nExpiring && nDeadline - nNow <= *options.nExpiring;
        if ((!options.blExpired && !options.nExpiring) || (options.blExpired && blExpired) || blExpiring) {
            jTokens.push_back(std::move(jToken));
        }
    }
    return jTokens;
}

int list(const ListOptions& options)
{
    std::vector<Json::Value> jTokens = selected(options);
    const size_t nTokens = jTokens.size();
    if (options.blCount) {
        tool::print(std::to_string(nTokens) + "\n");
        return tool::EXIT_STATUS_DONE;
    }
    sort(jTokens, options.order.value_or(Order{"deadline", false}));
    const size_t nLimit = options.nLimit ? static_cast<size_t>(*options.nLimit) : nTokens;
    Json::Value jShown(Json::arrayValue);
    for (size_t i = 0; i < std::min(nTokens, nLimit); ++i) {
        jShown.append(std::move(jTokens[i]));
    }
    tool::printTokens(jShown, options.layout);
    if (0 == nTokens) {
        tool::complain("there are no such tokens");
    }
    if (nLimit < nTokens) {
        tool::complain(std::to_string(nLimit) + " of " + std::to_string(nTokens) + " tokens are shown");
    }
    return tool::EXIT_STATUS_DONE;
}

int show(const ShowOptions& options)
{
    const std::string strTid = tool::readTid("TID", options.strTid);
    const auto jToken = tool::Store(tool::Store::Access::Read).findByPrefix(strTid);
    if (!jToken) {
        throw tool::noSuchToken();
    }
    tool::printToken(*jToken, options.layout);
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addList(Commands& commands)
{
    auto pOptions = std::make_shared<ListOptions>();
    Command& command =
        commands.add("list", "list tokens; purges nothing", [pOptions] { return list(*pOptions); });
    addSelection(command, pOptions->selection);
    command.flag("--expired", pOptions->blExpired, "those whose deadline has passed");
    addParsed(command, "--expiring", "DURATION", pOptions->nExpiring, parseDuration,
              "those that expire within this time");
    addParsed(command, "--sort", "FIELD[:desc]", pOptions->order, parseOrder,
              "by this field, not by deadline");
    const auto parseLimit = [](const std::string& strText) { return parseNumber(strText, 1, INT64_MAX); };
    addParsed(command, "--limit", "N", pOptions->nLimit, parseLimit, "the first N; says how many there are");
    command.flag("--count", pOptions->blCount, "how many there are, no more");
    addTokenOptions(command, pOptions->layout);
    command.flag("--show-ids", pOptions->layout.blShowIds, "whole ids, not their first 8 characters");
}

void addShow(Commands& commands)
{
    auto pOptions = std::make_shared<ShowOptions>();
    Command& command = commands.add("show", "show one token in full, its id too; spends and purges nothing",
                                    [pOptions] { return show(*pOptions); });
    addTid(command, pOptions->strTid);
    addTokenOptions(command, pOptions->layout);
}

} // namespace tool
