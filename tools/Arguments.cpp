#include "Arguments.h"

#include "Console.h"

namespace tool {

Command::Take into(std::string& strTarget)
{
    return [&strTarget](const std::string& strText) { strTarget = strText; };
}

Command::Take notEmptyInto(std::string& strTarget)
{
    return [&strTarget](const std::string& strText) {
        if (strText.empty()) {
            throw BadValue("must not be empty");
        }
        strTarget = strText;
    };
}

void addAllowances(Command& command, const std::string& strName, std::vector<Allowance>& allowances,
                   const std::string& strDescription)
{
    command.repeatedOption(
        strName, "API[:METHOD,...]",
        [&allowances](const std::string& strText) { allowances.push_back(parseAllowance(strText)); },
        strDescription);
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

void addSelection(Command& command, Selection& selection)
{
    const auto keep = [](const std::string& strText) { return strText; };
    addUser(command, selection.nUid);
    addParsed(command, "--function", "TAG", selection.strFunction, keep, "those of this purpose");
    addParsed(command, "--bind-sid", "SID", selection.strSid, keep, "those bound to this login session");
}

void addUser(Command& command, std::optional<unsigned int>& nUid)
{
    addParsed(command, "--uid", "N", nUid, parseUid, "the owner, as a number");
    addParsed(command, "--user", "NAME", nUid, parseUser, "the owner, by name");
    command.exclude("--user", "--uid");
}

void addUses(Command& command, std::optional<int64_t>& nCount)
{
    const auto parse = [](const std::string& strText) { return parseNumber(strText, 1, INT64_MAX); };
    addParsed(command, "--uses", "N", nCount, parse, "how many times it can be granted");
    command.flag(
        "--unlimited", [&nCount] { nCount = -1; }, "any number of times");
    command.exclude("--unlimited", "--uses");
}

void addTtl(Command& command, std::optional<int64_t>& nTtl)
{
    addParsed(command, "--ttl", "DURATION", nTtl, parseDuration,
              "lifetime from now: 45s, 90m, 8h, 2d12h, 1w, or seconds");
}

void addExtra(Command& command, std::optional<Json::Value>& jExtra)
{
    addParsed(command, "--extra", "JSON|@FILE", jExtra, parseExtra,
              "data of your own, a JSON object or a file of one");
}

void addTid(Command& command, std::string& strTid)
{
    command.argument("TID", into(strTid), "the id; \"-\" reads it from standard input");
}

std::vector<std::string> readTids(const std::string& strName, const std::string& strArgument)
{
    const auto bad = [&strName](const char* szReason) {
        return Failure(EXIT_STATUS_USAGE, strName + ": " + szReason);
    };
    if (strArgument.empty()) {
        throw bad("the id is empty");
    }
    if (strArgument != "-") {
        return {strArgument};
    }
    std::vector<std::string> strTids;
    for (const std::string& strLine : readSecrets("Token id: ")) {
        if (strLine.find('\0') != std::string::npos) {
            throw bad("an id on standard input holds a NUL byte");
        }
        if (!strLine.empty()) {
            strTids.push_back(strLine);
        }
    }
    if (strTids.empty()) {
        throw bad("there is no id on standard input");
    }
    return strTids;
}

std::string readTid(const std::string& strName, const std::string& strArgument)
{
    const std::vector<std::string> strTids = readTids(strName, strArgument);
    if (strTids.size() > 1) {
        throw Failure(EXIT_STATUS_USAGE, strName + ": there is more than one id on standard input");
    }
    return strTids[0];
}

Failure noSuchToken()
{
    return Failure(EXIT_STATUS_NO_TOKEN, "there is no such token");
}

} // namespace tool
