// stats: what the store holds, in numbers.

#include <map>
#include <memory>

#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Json.h"
#include "Layout.h"
#include "Statistics.h"
#include "Table.h"
#include "Values.h"

namespace {

typedef tool::Layout::Form Form;
typedef tool::Table::Kind Kind;

struct Options {
    bool blPrometheus = false;
    tool::Layout layout;
};

using tool::Group;
using tool::Statistics;
using tool::UserGroup;

std::string numberText(const UserGroup& group)
{
    return group.nUid ? std::to_string(*group.nUid) : "NULL";
}

std::string nameOf(const UserGroup& group)
{
    return group.nUid ? tool::userNameIfKnown(*group.nUid).value_or("") : "";
}

void printTables(const Statistics& statistics, bool blHeader)
{
    tool::Table totals({{"STORE", Kind::Short}, {"NUMBER", Kind::Right}}, blHeader);
    totals.add({"tokens", std::to_string(statistics.nTokens)});
    totals.add({"expired", std::to_string(statistics.nExpired)});
    totals.add({"unlimited uses", std::to_string(statistics.nUnlimited)});
    totals.add({"file size in bytes", std::to_string(statistics.nFileBytes)});
    totals.add({"free pages of " + std::to_string(statistics.nPageBytes) + " bytes",
                std::to_string(statistics.nFreePages)});
    totals.print();
    tool::Table functions({{"FUNCTION", Kind::Long}, {"TOKENS", Kind::Right}}, blHeader);
    for (const Group& group : statistics.functions) {
        functions.add({group.strName, std::to_string(group.nTokens)});
    }
    tool::print("\n");
    functions.print();
    tool::Table users({{"UID", Kind::Right}, {"USER", Kind::Short}, {"TOKENS", Kind::Right}}, blHeader);
    for (const UserGroup& group : statistics.users) {
        users.add({numberText(group), nameOf(group), std::to_string(group.nTokens)});
    }
    tool::print("\n");
    users.print();
}

Json::Value jsonOf(const Statistics& statistics)
{
    Json::Value jStatistics;
    jStatistics["tokens"] = Json::UInt64{statistics.nTokens};
    jStatistics["expired"] = Json::UInt64{statistics.nExpired};
    jStatistics["unlimited"] = Json::UInt64{statistics.nUnlimited};
    jStatistics["file_bytes"] = Json::UInt64{statistics.nFileBytes};
    jStatistics["free_pages"] = Json::UInt64{statistics.nFreePages};
    jStatistics["page_bytes"] = Json::UInt64{statistics.nPageBytes};
    jStatistics["functions"] = Json::Value(Json::arrayValue);
    for (const Group& group : statistics.functions) {
        Json::Value jGroup;
        jGroup["function"] = group.strName;
        jGroup["tokens"] = Json::UInt64{group.nTokens};
        jStatistics["functions"].append(jGroup);
    }
    jStatistics["users"] = Json::Value(Json::arrayValue);
    for (const UserGroup& group : statistics.users) {
        Json::Value jGroup;
        jGroup["uid"] = group.nUid ? Json::Value(*group.nUid) : Json::Value();
        jGroup["user"] = nameOf(group);
        jGroup["tokens"] = Json::UInt64{group.nTokens};
        jStatistics["users"].append(jGroup);
    }
    return jStatistics;
}

// The value of a label in Prometheus' text format, which is UTF-8.
std::string label(const std::string& strValue)
{
    std::string strEscaped;
    for (const char c : tool::validUtf8(strValue)) {
        strEscaped += c == '\\' ? "\\\\" : c == '"' ? "\\\"" : c == '\n' ? "\\n" : std::string(1, c);
    }
    return "\"" + strEscaped + "\"";
}

void printFamily(const std::string& strName, const std::string& strHelp)
{
    tool::print("# HELP " + strName + " " + strHelp + "\n# TYPE " + strName + " gauge\n");
}

void printMetric(const std::string& strName, const std::string& strHelp, uint64_t nValue)
{
    printFamily(strName, strHelp);
    tool::print(strName + " " + std::to_string(nValue) + "\n");
}

void printMetrics(const Statistics& statistics)
{
    const std::string strPrefix = "vemo_access_token_";
    printMetric(strPrefix + "tokens", "Tokens in the store.", statistics.nTokens);
    printMetric(strPrefix + "expired_tokens", "Tokens whose deadline has passed.", statistics.nExpired);
    printMetric(strPrefix + "unlimited_tokens", "Tokens with any number of uses.", statistics.nUnlimited);
    printMetric(strPrefix + "database_bytes", "Size of the database file.", statistics.nFileBytes);
    printMetric(strPrefix + "database_free_pages", "Unused pages of the database file.",
                statistics.nFreePages);
    printMetric(strPrefix + "database_page_bytes", "Size of a page of the database file.",
                statistics.nPageBytes);
    printFamily(strPrefix + "function_tokens", "Tokens by the purpose they were made for.");
    // Different purposes can have the same label, and the collector fails if a metric comes twice. So such
    // purposes are added up.
    std::map<std::string, uint64_t> nTokensOf;
    for (const Group& group : statistics.functions) {
        nTokensOf[label(group.strName)] += group.nTokens;
    }
    for (const auto& [strLabel, nTokens] : nTokensOf) {
        tool::printLine(strPrefix + "function_tokens{function=" + strLabel + "} " + std::to_string(nTokens));
    }
    printFamily(strPrefix + "user_tokens", "Tokens by the user who owns them.");
    for (const UserGroup& group : statistics.users) {
        tool::printLine(strPrefix + "user_tokens{uid=\"" + numberText(group) +
                        "\",user=" + label(nameOf(group)) + "} " + std::to_string(group.nTokens));
    }
    printFamily(strPrefix + "expiring_tokens", "Tokens that expire within this time.");
    tool::print(strPrefix + "expiring_tokens{within=\"day\"} " + std::to_string(statistics.nExpiringInDay) +
                "\n");
    tool::print(strPrefix + "expiring_tokens{within=\"week\"} " + std::to_string(statistics.nExpiringInWeek) +
                "\n");
    printMetric(strPrefix + "no_owner_tokens", "Tokens whose owner is not a user of this machine.",
                tool::countWithoutOwner(statistics));
    printMetric(strPrefix + "no_api_tokens", "Tokens that open nothing.", statistics.nOpeningNothing);
    printMetric(strPrefix + "old_unlimited_tokens",
                "Tokens with any number of uses that are older than a year.", statistics.nOldUnlimited);
}

int stats(const Options& options)
{
    const Statistics statistics = tool::collectStatistics();
    if (options.blPrometheus) {
        printMetrics(statistics);
        return tool::EXIT_STATUS_DONE;
    }
    if (Form::Table == options.layout.form) {
        printTables(statistics, !options.layout.blNoHeader);
    } else {
        const Json::Value jStatistics = jsonOf(statistics);
        const bool blStyled = Form::Json == options.layout.form;
        tool::print((blStyled ? tool::styledJson(jStatistics) : tool::compactJson(jStatistics)) + "\n");
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addStats(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("stats", "count the tokens, by purpose and by owner",
                                    [pOptions] { return stats(*pOptions); });
    command.flag("--prometheus", pOptions->blPrometheus,
                 "as metrics for the textfile collector of Prometheus' node exporter");
    const auto takeForm = [pOptions](const std::string& strText) {
        pOptions->blPrometheus = strText == "metrics";
        pOptions->layout.form =
            pOptions->blPrometheus ? Form::Table : parseForm(strText, "table, json, jsonl or metrics");
    };
    command.option("-o,--output", "FORM", takeForm,
                   "table (the default), json, jsonl, or metrics, as --prometheus does");
    addNoHeader(command, pOptions->layout);
    command.exclude("--output", "--prometheus");
    command.example("");
    command.example("-o metrics >tokens.prom");
}

} // namespace tool
