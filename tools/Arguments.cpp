#include "Arguments.h"

#include <set>

#include "Console.h"
#include "Masking.h"
#include "Steps.h"

namespace {

// The uids of all owners who are not users of this machine, as SQL. Users are looked up after the store is
// closed, because a look-up can take long.
std::string ownersThatAreGone()
{
    std::set<Json::Int64> nUids;
    tool::Steps steps(tool::Store::Access::Glance);
    while (steps.next([&nUids](tool::Store& store, const std::string& strThose) {
        store.select("DISTINCT uid", "typeof(uid) = 'integer' AND " + strThose,
                     [&nUids](const tool::Row& row) { nUids.insert(strtoll(row[0]->c_str(), nullptr, 10)); });
    })) {
    }
    std::string strUids;
    for (const Json::Int64 nUid : nUids) {
        if (!tool::findUserName(nUid)) {
            strUids += (strUids.empty() ? "" : ", ") + std::to_string(nUid);
        }
    }
    return strUids;
}

} // namespace

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

std::vector<std::string> doubtsAbout(const std::string& strName, const std::vector<Allowance>& allowances)
{
    std::vector<std::string> strNames;
    for (const Allowance& allowance : allowances) {
        strNames.push_back(allowance.strApi);
        strNames.insert(strNames.end(), allowance.strMethods.begin(), allowance.strMethods.end());
    }
    std::vector<std::string> strDoubts;
    for (const std::string& strEach : strNames) {
        if (strEach.find('*') != std::string::npos) {
            strDoubts.push_back(strName + ": " + quoted(strEach) +
                                " stands for this name alone: \"*\" is no wildcard");
        }
        if (strEach.find_first_of(" \t\n") != std::string::npos) {
            strDoubts.push_back(strName + ": " + quoted(strEach) +
                                " holds a blank, which is part of the name");
        }
    }
    return strDoubts;
}

bool Selection::empty() const
{
    return !nUid && !strFunction && !strSid && !nCreatedBefore && !nCreatedAfter && opens.empty() &&
           !nExpiring && !blExpired && !blUnlimited && !blNoOwner;
}

std::string Selection::sql() const
{
    std::string strSql = "true";
    const auto add = [&strSql](const std::string& strCondition) { strSql += " AND " + strCondition; };
    if (nUid) {
        add("uid = " + std::to_string(*nUid));
    }
    if (strFunction) {
        add(sqlText("function = %Q", strFunction->c_str()));
    }
    if (strSid) {
        add(sqlText("bind_sid = %Q", strSid->c_str()));
    }
    if (nCreatedBefore) {
        add("create_time < " + std::to_string(*nCreatedBefore));
    }
    if (nCreatedAfter) {
        add("create_time >= " + std::to_string(*nCreatedAfter));
    }
    for (const Allowance& allowance : opens) {
        if (allowance.strMethods.empty()) {
            add(sqlText("opens(webapi_allow, %Q, '')", allowance.strApi.c_str()));
        }
        for (const std::string& strMethod : allowance.strMethods) {
            add(sqlText("opens(webapi_allow, %Q, %Q)", allowance.strApi.c_str(), strMethod.c_str()));
        }
    }
    const std::string strExpired = grant::SQL_EXPIRED;
    const std::string strSoon =
        nExpiring ? "(NOT (" + strExpired +
                        ") AND deadline - strftime('%s', 'now') <= " + std::to_string(*nExpiring) + ")"
                  : "false";
    if (blExpired || nExpiring) {
        add("(" + (blExpired ? strExpired : "false") + " OR " + strSoon + ")");
    }
    if (blUnlimited) {
        add("count < 0");
    }
    if (blNoOwner) {
        add("uid IN (" + ownersThatAreGone() + ")");
    }
    return strSql;
}

void addSelection(Command& command, Selection& selection)
{
    const auto keep = [](const std::string& strText) { return strText; };
    addUser(command, selection.nUid);
    addParsed(command, "--function", "TAG", selection.strFunction, keep, "those of this purpose");
    addParsed(command, "--bind-sid", "SID", selection.strSid, keep, "those bound to this login session");
    addParsed(command, "--created-before", "TIME", selection.nCreatedBefore, parseTime,
              "those made before a time, such as 2026-12-31 or \"2026-12-31 12:00\"");
    addParsed(command, "--created-after", "TIME", selection.nCreatedAfter, parseTime,
              "those made at this time or later");
    addAllowances(command, "--opens", selection.opens, "those that open these methods, or the API alone");
    command.flag("--no-owner", selection.blNoOwner,
                 "those whose owner is not a user of this machine any more");
    command.flag("--unlimited", selection.blUnlimited, "those with any number of uses");
    command.flag("--expired", selection.blExpired, "those whose deadline has passed");
    addParsed(command, "--expiring", "DURATION", selection.nExpiring, parseDuration,
              "those that expire within this time; with --expired, both");
}

uint64_t countSelected(const Selection& selection)
{
    const std::string strSelected = selection.sql();
    uint64_t nTokens = 0;
    Steps steps(Store::Access::Glance);
    while (steps.next([&](Store& store, const std::string& strThose) {
        nTokens += store.count(strThose + " AND " + strSelected);
    })) {
    }
    return nTokens;
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
              "your data, a JSON object or a file that holds one");
}

void addNote(Command& command, std::optional<std::string>& strNote)
{
    const auto keep = [](const std::string& strText) { return strText; };
    addParsed(command, "--note", "TEXT", strNote, keep, "your note, kept in the data; \"\" for none");
}

void setNote(Json::Value& jExtra, const std::string& strNote)
{
    if (strNote.empty()) {
        jExtra.removeMember("note");
    } else {
        jExtra["note"] = strNote;
    }
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
    return strTids;
}

std::string readTid(const std::string& strName, const std::string& strArgument)
{
    const std::vector<std::string> strTids = readTids(strName, strArgument);
    if (strTids.size() != 1) {
        throw Failure(EXIT_STATUS_USAGE, strName + ": there is " +
                                             (strTids.empty() ? "no" : "more than one") +
                                             " id on standard input");
    }
    return strTids[0];
}

Failure noSuchToken()
{
    return Failure(EXIT_STATUS_NO_TOKEN, "there is no such token");
}

} // namespace tool
