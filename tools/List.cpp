// list and show: which tokens there are.

#include <algorithm>
#include <map>
#include <memory>

#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "Layout.h"
#include "SortedIds.h"
#include "Steps.h"

namespace {

// A field to sort by, and the direction.
struct Order {
    std::string strField;
    bool blDescending;
};

struct ListOptions {
    tool::Selection selection;
    Order order = {"deadline", false};
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

// The sort key in SQL: the field itself, but unlimited uses sort after all numbers of uses.
std::string keyOf(const Order& order)
{
    return order.strField == "count" ? "iif(count < 0, " + std::to_string(INT64_MAX) + ", count)"
                                     : order.strField;
}

// Adds the ids of the selected tokens, up to the limit. Returns how many tokens are selected.
uint64_t sort(const ListOptions& options, tool::SortedIds& ids)
{
    const bool blNumber = VEMO_ACCESS_TOKEN::tokenType()[options.order.strField][1].isIntegral();
    const std::string strSelected = options.selection.sql();
    std::string strOrder;
    if (options.nLimit) {
        strOrder = std::string(" ORDER BY 2") + (options.order.blDescending ? " DESC" : "") + ", 3 LIMIT " +
                   std::to_string(*options.nLimit);
    }
    uint64_t nTokens = 0;
    const size_t nMax = blNumber ? tool::Steps::TOKENS_MAX : tool::Steps::KEPT_MAX; // texts can be long
    for (tool::Steps steps(tool::Store::Access::Glance, "Sorting", tool::Steps::Order::ById, nMax);;) {
        tool::Rows rows;
        const auto read = [&](tool::Store& store, const std::string& strThose) {
            const std::string strWhere = strThose + " AND " + strSelected;
            store.select(std::string(tool::SQL_QUOTED_TID) + ", " + keyOf(options.order) +
                             (store.hasRowIds() ? ", rowid" : ", 0"),
                         strWhere + strOrder, [&rows](tool::Row row) { rows.push_back(std::move(row)); });
            nTokens += options.nLimit ? store.count(strWhere) : rows.size();
        };
        if (!steps.next(read)) {
            return nTokens;
        }
        for (const tool::Row& row : rows) {
            ids.add({row[0].value_or(""), strtoll(row[2]->c_str(), nullptr, 10)}, row[1].value_or(""),
                    blNumber);
        }
    }
}

template <typename Part>
std::string listOf(const std::vector<tool::SortedIds::Id>& ids, Part part)
{
    std::string strList;
    for (const auto& id : ids) {
        strList += (strList.empty() ? "" : ",") + part(id);
    }
    return strList;
}

typedef std::multimap<std::string, Json::Value> Tokens; // by their ids as SQL literals

// Reads those tokens of the ids that still exist. Looks for their rows first, which is faster than by their
// ids; then for the ids of tokens that a program has changed since, and that moved to another row.
Tokens tokensOf(std::vector<tool::SortedIds::Id> ids)
{
    Tokens tokens;
    tool::letOthersChange();
    tool::Store store(tool::Store::Access::Read);
    const auto add = [&](const std::string& strWhere) {
        store.eachToken(strWhere, std::string(", ") + tool::SQL_QUOTED_TID,
                        [&tokens](Json::Value jToken, const tool::Row& columns) {
                            tokens.emplace(*columns[0], std::move(jToken));
                        });
    };
    if (store.hasRowIds()) {
        add("rowid IN (" + listOf(ids, [](const auto& id) { return std::to_string(id.nRow); }) + ")");
    }
    ids.erase(
        std::remove_if(ids.begin(), ids.end(), [&tokens](const auto& id) { return tokens.count(id.strTid); }),
        ids.end());
    if (!ids.empty()) {
        add("tid IN (" + listOf(ids, [](const auto& id) { return id.strTid; }) + ")");
    }
    return tokens;
}

// Calls use() with the tokens of the ids, in their order. Leaves out tokens that are gone.
template <typename Use>
void eachOf(tool::SortedIds& ids, const ListOptions& options, Use use)
{
    ids.each(static_cast<uint64_t>(options.nLimit.value_or(INT64_MAX)),
             [&](const std::vector<tool::SortedIds::Id>& group) {
                 Tokens tokens = tokensOf(group);
                 for (const auto& id : group) {
                     const auto pToken = tokens.find(id.strTid);
                     if (pToken != tokens.end()) {
                         use(pToken->second);
                         tokens.erase(pToken);
                     }
                 }
             });
}

int list(const ListOptions& options)
{
    if (options.blCount) {
        tool::print(std::to_string(tool::countSelected(options.selection)) + "\n");
        return tool::EXIT_STATUS_DONE;
    }
    tool::TokenPrinter printer(options.layout);
    tool::SortedIds ids(options.order.blDescending);
    const uint64_t nTokens = sort(options, ids);
    if (printer.measures()) {
        eachOf(ids, options, [&printer](Json::Value& jToken) { printer.measure(jToken); });
    }
    {
        // On one terminal, the bar and the tokens would get mixed.
        const bool blProgress = !tool::isTerminal(tool::resultStream());
        tool::Progress progress(
            "Listing", [nTokens] { return nTokens; }, blProgress, tool::MANY);
        eachOf(ids, options, [&](Json::Value& jToken) {
            printer.print(jToken);
            progress.step();
        });
        printer.end();
    }
    if (0 == nTokens) {
        tool::complain("no token matches");
    }
    if (options.nLimit && static_cast<uint64_t>(*options.nLimit) < nTokens) {
        tool::complain(std::to_string(*options.nLimit) + " of " + std::to_string(nTokens) +
                       " tokens are shown");
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
    addParsed(command, "--sort", "FIELD[:desc]", pOptions->order, parseOrder,
              "sort by this field instead of the deadline");
    const auto parseLimit = [](const std::string& strText) { return parseNumber(strText, 1, INT64_MAX); };
    addParsed(command, "--limit", "N", pOptions->nLimit, parseLimit,
              "only the first N; says how many there are");
    command.flag("--count", pOptions->blCount, "print only how many there are");
    addTokenOptions(command, pOptions->layout);
    command.flag("--show-ids", pOptions->layout.blShowIds, "whole ids, not their first 8 characters");
    command.example("--user root --expiring 7d");
    command.example("--sort count:desc --limit 10 -o jsonl");
}

void addShow(Commands& commands)
{
    auto pOptions = std::make_shared<ShowOptions>();
    Command& command = commands.add("show", "show one token in full, its id too; spends and purges nothing",
                                    [pOptions] { return show(*pOptions); });
    addTid(command, pOptions->strTid);
    addTokenOptions(command, pOptions->layout);
    command.example("- <id");
    command.example("- --field deadline <id");
}

} // namespace tool
