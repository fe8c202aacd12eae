// stats: what the store holds, in numbers.

#include <algorithm>
#include <map>
#include <memory>

#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Json.h"
#include "Layout.h"
#include "Place.h"
#include "Steps.h"
#include "Table.h"
#include "Values.h"

namespace {

typedef tool::Layout::Form Form;
typedef tool::Table::Kind Kind;

struct Options {
    bool blPrometheus = false;
    tool::Layout layout;
};

struct Group {
    std::string strName;
    uint64_t nTokens;
};

struct UserGroup {
    std::optional<Json::Int64> nUid; // nothing for a NULL
    uint64_t nTokens;
};

struct Statistics {
    uint64_t nTokens;
    uint64_t nExpired;
    uint64_t nUnlimited;
    std::vector<Group> functions;
    std::vector<UserGroup> users;
    uint64_t nFileBytes;
    uint64_t nFreePages;
    uint64_t nPageBytes;
};

Json::Int64 numberOf(const std::optional<std::string>& strText)
{
    return strtoll(strText.value_or("").c_str(), nullptr, 10);
}

// Those of a name, with the most tokens first.
template <typename Group, typename Name>
std::vector<Group> groupsOf(const std::map<Name, uint64_t>& counts)
{
    std::vector<Group> groups;
    for (const auto& [name, nTokens] : counts) {
        groups.push_back({name, nTokens});
    }
    std::stable_sort(groups.begin(), groups.end(),
                     [](const Group& left, const Group& right) { return left.nTokens > right.nTokens; });
    return groups;
}

Statistics collect()
{
    Statistics statistics = {};
    std::map<std::string, uint64_t> functions;
    std::map<std::optional<Json::Int64>, uint64_t> users;
    const std::string strSelect = std::string("SELECT function, CAST(uid AS INTEGER), count(*), "
                                              "total(count < 0), total(") +
                                  grant::SQL_EXPIRED + ") FROM token WHERE ";
    tool::Steps steps(tool::Store::Access::Glance);
    while (steps.next([&](tool::Store& store, const std::string& strThose) {
        store.eachRow(strSelect + strThose + " GROUP BY 1, 2", [&](const tool::Row& row) {
            const auto nTokens = static_cast<uint64_t>(numberOf(row[2]));
            statistics.nTokens += nTokens;
            statistics.nUnlimited += static_cast<uint64_t>(numberOf(row[3]));
            statistics.nExpired += static_cast<uint64_t>(numberOf(row[4]));
            functions[row[0].value_or("")] += nTokens;
            users[row[1] ? std::optional(numberOf(row[1])) : std::nullopt] += nTokens;
        });
        statistics.nFreePages = store.number("PRAGMA freelist_count");
        statistics.nPageBytes = store.number("PRAGMA page_size");
    })) {
    }
    statistics.functions = groupsOf<Group>(functions);
    statistics.users = groupsOf<UserGroup>(users);
    const auto status = tool::statusOf(VEMO_ATOKEN_DB_PATH);
    statistics.nFileBytes = status ? static_cast<uint64_t>(status->st_size) : 0;
    return statistics;
}

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

// A label's value in the exposition format, which is UTF-8.
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
    // Purposes that differ can read the same, and over a metric that is there twice the collector fails.
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
}

int stats(const Options& options)
{
    const Statistics statistics = collect();
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
    addFormOptions(command, pOptions->layout);
    command.exclude("--output", "--prometheus");
    command.example("");
    command.example("-o json");
}

} // namespace tool
