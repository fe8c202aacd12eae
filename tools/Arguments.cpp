#include "Arguments.h"

#include "Console.h"

namespace tool {

CLI::Validator notEmpty()
{
    return CLI::Validator([](const std::string& str) { return str.empty() ? "must not be empty" : ""; }, "");
}

CLI::Option* addAllowances(CLI::App& command, const std::string& strName, std::vector<Allowance>& allowances,
                           const std::string& strDescription)
{
    const auto read = [strName, &allowances](const std::vector<std::string>& strTexts) {
        for (const std::string& strText : strTexts) {
            allowances.push_back(argument(strName, [&] { return parseAllowance(strText); }));
        }
    };
    return command.add_option_function<std::vector<std::string>>(strName, read, strDescription)
        ->type_name("API[:METHOD,...]")
        ->allow_extra_args(false);
}

Json::Value Selection::filter() const
{
    Json::Value jFilter(Json::objectValue);
    if (nUid) {
        jFilter["uid"] = *nUid;
    }
    if (strFunction) {
        jFilter["function"] = *strFunction;
    }
    if (strSid) {
        jFilter["bind_sid"] = *strSid;
    }
    return jFilter;
}

void addSelection(CLI::App& command, Selection& selection)
{
    addUser(command, selection.nUid);
    command.add_option("--function", selection.strFunction, "those of this purpose")->type_name("TAG");
    command.add_option("--bind-sid", selection.strSid, "those bound to this login session")->type_name("SID");
}

void addUser(CLI::App& command, std::optional<unsigned int>& nUid)
{
    auto* pUid = addParsed(command, "--uid", "N", nUid, parseUid, "the owner, as a number");
    addParsed(command, "--user", "NAME", nUid, parseUser, "the owner, by name")->excludes(pUid);
}

void addUses(CLI::App& command, std::optional<int64_t>& nCount)
{
    const auto parse = [](const std::string& strText) { return parseNumber(strText, 1, INT64_MAX); };
    auto* pUses = addParsed(command, "--uses", "N", nCount, parse, "how many times it can be granted");
    command
        .add_flag_callback(
            "--unlimited", [&nCount] { nCount = -1; }, "any number of times")
        ->excludes(pUses);
}

CLI::Option* addTtl(CLI::App& command, std::optional<int64_t>& nTtl)
{
    return addParsed(command, "--ttl", "DURATION", nTtl, parseDuration,
                     "lifetime from now: 45s, 90m, 8h, 2d12h, 1w, or seconds");
}

CLI::Option* addExtra(CLI::App& command, std::optional<Json::Value>& jExtra)
{
    return addParsed(command, "--extra", "JSON|@FILE", jExtra, parseExtra,
                     "data of your own, a JSON object or a file of one");
}

void addTid(CLI::App& command, std::string& strTid)
{
    command.add_option("TID", strTid, "the id; \"-\" reads it from standard input")
        ->required()
        ->type_name("");
}

std::vector<std::string> readTids(const std::string& strArgument)
{
    if (strArgument.empty()) {
        throw Failure(EXIT_STATUS_USAGE, "TID: the id is empty");
    }
    if (strArgument != "-") {
        return {strArgument};
    }
    std::vector<std::string> strTids;
    for (const std::string& strLine : readSecrets("Token id: ")) {
        if (strLine.find('\0') != std::string::npos) {
            throw Failure(EXIT_STATUS_USAGE, "TID: an id on standard input holds a NUL byte");
        }
        if (!strLine.empty()) {
            strTids.push_back(strLine);
        }
    }
    if (strTids.empty()) {
        throw Failure(EXIT_STATUS_USAGE, "TID: there is no id on standard input");
    }
    return strTids;
}

std::string readTid(const std::string& strArgument)
{
    const std::vector<std::string> strTids = readTids(strArgument);
    if (strTids.size() > 1) {
        throw Failure(EXIT_STATUS_USAGE, "TID: there is more than one id on standard input");
    }
    return strTids[0];
}

Failure noSuchToken()
{
    return Failure(EXIT_STATUS_NO_TOKEN, "there is no such token");
}

} // namespace tool
