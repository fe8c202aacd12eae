// What can be wrong with the tokens.

#include <algorithm>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Examination.h"
#include "Failure.h"
#include "Json.h"
#include "Memo.h"
#include "Schema.h"
#include "Steps.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Schema;
using tool::Store;
using tool::TokenNames;

const int64_t BACKLOG_AGE_MAX = 3600; // seconds; each call of a program purges, so none should be as old
const uint64_t TOKENS_WITHOUT_INDEX = 10000;
const int NESTING_MAX = 100; // levels that a stack of 64 KiB has room for

// Repairs the tokens that a condition in SQL selects.
typedef std::function<void(Store&, const std::string& strWhere)> Repair;

void remove(Store& store, const std::string& strWhere)
{
    store.remove(strWhere);
}

// A finding about the tokens that fulfil a condition in SQL.
struct Check {
    std::string strWhere;
    Finding::Severity severity;
    std::string strWhat; // the text before the tokens
    std::string strMeaning;
    std::string strRemedy;
    Repair repair;                // empty if an administrator must decide
    std::string strRepaired = {}; // the condition of the tokens to repair; empty: strWhere
};

bool isAny(const Json::Value&)
{
    return true;
}

bool isNumber(const Json::Value& jDefault)
{
    return jDefault.isIntegral();
}

bool isText(const Json::Value& jDefault)
{
    return jDefault.isString();
}

// A condition in SQL that holds for a row if a test holds for any field whose default is of a kind. The test
// is SQL with "?" in place of the field.
std::string anyField(bool (*isOfKind)(const Json::Value&), const std::string& strTest)
{
    std::string strWhere;
    for (const std::string& strName : tool::fieldNames()) {
        if (isOfKind(VEMO_ACCESS_TOKEN::tokenType()[strName][1])) {
            strWhere += strWhere.empty() ? "" : " OR ";
            for (const char c : strTest) {
                strWhere += c == '?' ? strName : std::string(1, c);
            }
        }
    }
    return "(" + strWhere + ")";
}

std::string anyNull()
{
    return anyField(isAny, "? IS NULL");
}

Check nulls()
{
    return {anyNull(),
            Finding::Severity::Error,
            "a NULL in ",
            "such a token cannot be read or granted, and every listing that meets it fails",
            "delete them: vemo-access-token doctor --repair",
            remove};
}

Check numbers()
{
    return {anyField(isNumber, "typeof(?) NOT IN ('integer', 'null')"),
            Finding::Severity::Error,
            "no whole number where there should be one in ",
            "it is read as another number, 0 for a word: deadline or uses are not what they seem",
            "revoke them, or update what is wrong",
            {}};
}

Check texts()
{
    const std::string strWhere = anyField(isText, "typeof(?) NOT IN ('text', 'null')");
    std::string strTexts;
    for (const std::string& strName : tool::fieldNames()) {
        if (isText(VEMO_ACCESS_TOKEN::tokenType()[strName][1])) {
            strTexts += (strTexts.empty() ? "" : ", ") + strName + " = CAST(" + strName + " AS TEXT)";
        }
    }
    return {strWhere,
            Finding::Severity::Error,
            "bytes where there should be a text in ",
            "no look-up by that field finds such a token",
            "make texts of them: vemo-access-token doctor --repair",
            [strTexts](Store& store, const std::string& strWhich) { store.change(strTexts, strWhich); }};
}

Check users()
{
    return {"typeof(uid) = 'integer' AND (uid < 0 OR uid >= " + std::to_string(UID_ERR) + ")",
            Finding::Severity::Error,
            "a uid that is no user's in ",
            "programs take the lower 32 bits of it for the owner: 4294967296 is root's",
            "revoke them",
            {}};
}

Check unnamed()
{
    const std::string strWhere = "typeof(tid) = 'text' AND (tid = '' OR instr(tid, char(0)))";
    return {strWhere,
            Finding::Severity::Error,
            "an id that is empty or holds a NUL byte in ",
            "no call can name such a token: it is listed, but cannot be granted or revoked",
            "sqlite3 " VEMO_ATOKEN_DB_PATH " \"DELETE FROM token WHERE " + strWhere + "\"",
            {}};
}

Check shortened()
{
    const std::string strLength = std::to_string(VEMO_ATOKEN_LENGTH_MIN);
    return {"length(CAST(tid AS BLOB)) BETWEEN 1 AND " + std::to_string(VEMO_ATOKEN_LENGTH_MIN - 1),
            Finding::Severity::Warning,
            "an id of fewer than " + strLength + " bytes in ",
            "it was not made by the library, and may be guessed",
            "revoke them, and create others",
            {}};
}

Check cutTexts()
{
    return {anyField([](const Json::Value& jDefault) { return !isNumber(jDefault); }, "instr(?, char(0))") +
                " AND NOT instr(tid, char(0))",
            Finding::Severity::Error,
            "a NUL byte in a text of ",
            "programs see what stands before it, and no look-up by that field finds such a token",
            "revoke them",
            {}};
}

Check purposes()
{
    return {"function = ''",
            Finding::Severity::Warning,
            "an empty purpose in ",
            "no call deletes such a token by its purpose",
            "revoke them, and create others",
            {}};
}

Check deadlines()
{
    return {"deadline <= 0",
            Finding::Severity::Warning,
            "a deadline of 0 or less in ",
            "there is no value for \"never\": the next purge deletes them",
            "update --ttl gives them time",
            {}};
}

Check backlog()
{
    return {"deadline > 0 AND deadline < strftime('%s', 'now') - " + std::to_string(BACKLOG_AGE_MAX),
            Finding::Severity::Warning,
            "expired for more than an hour: ",
            "no program has called since, or its purges fail",
            "vemo-access-token purge",
            remove,
            std::string("deadline > 0 AND ") + grant::SQL_EXPIRED};
}

void execute(const Repair& repair, const std::string& strWhere)
{
    tool::Steps steps(Store::Access::Write);
    while (steps.next(
        [&](Store& store, const std::string& strThose) { repair(store, strThose + " AND " + strWhere); })) {
    }
}

// Adds a finding. It has no repair unless the table is sound, because whatever is wrong with the table, such
// as a trigger, would take part in the repair.
void report(const Check& check, const TokenNames& names, bool blTableSound, Findings& findings)
{
    Finding finding = {check.severity, check.strWhat + names.text(), check.strMeaning, check.strRemedy, {}};
    if (check.repair && blTableSound) {
        finding.repair = [repair = check.repair,
                          strWhere = check.strRepaired.empty() ? check.strWhere : check.strRepaired] {
            execute(repair, strWhere);
        };
    } else if (check.repair) {
        finding.strRemedy = "when the table is mended: " + finding.strRemedy;
    }
    findings.push_back(finding);
}

// Runs all checks in one pass over the table. Reads a step's tokens again for each check that finds some.
void examineRows(bool blTableSound, Findings& findings)
{
    const std::vector<Check> checks = {nulls(),     numbers(),  texts(),    users(),     unnamed(),
                                       shortened(), cutTexts(), purposes(), deadlines(), backlog()};
    std::string strAny;
    for (const Check& check : checks) {
        strAny += (strAny.empty() ? "max(" : ", max(") + check.strWhere + ")";
    }
    std::vector<TokenNames> names(checks.size());
    tool::Steps steps(Store::Access::Glance, "Examining", tool::Steps::Order::ByRow);
    while (steps.next([&](Store& store, const std::string& strThose) {
        tool::Row isThere;
        store.select(strAny, strThose, [&isThere](tool::Row row) { isThere = std::move(row); });
        for (size_t i = 0; i < checks.size(); ++i) {
            if (isThere[i] == "1") {
                store.eachTid(strThose + " AND " + checks[i].strWhere,
                              [&](const auto& strTid) { names[i].add(strTid); });
            }
        }
    })) {
    }
    for (size_t i = 0; i < checks.size(); ++i) {
        if (names[i].count()) {
            report(checks[i], names[i], blTableSound, findings);
        }
    }
}

// Whether an API's entry can open calls that name a method.
bool isEntry(const Json::Value& jEntry)
{
    return jEntry.isObject() && jEntry["method"].isArray();
}

// Whether the list of methods holds something that cannot be read as a text.
bool holdsNoMethod(const Json::Value& jEntry)
{
    const auto isNone = [](const Json::Value& jMethod) { return jMethod.isArray() || jMethod.isObject(); };
    return isEntry(jEntry) && std::any_of(jEntry["method"].begin(), jEntry["method"].end(), isNone);
}

// What can be wrong with a JSON text of a token.
struct Flaws {
    bool blDeep = false;
    bool blBroken = false;
    bool blOdd = false; // blOdd and blThrowing: only if it is the field webapi_allow
    bool blThrowing = false;
};

Flaws flawsOf(const tool::ObjectReader& reader, const std::string& strText)
{
    Flaws flaws;
    flaws.blDeep = tool::nestingOf(strText) > NESTING_MAX;
    try {
        const Json::Value jValue = reader.read(strText);
        flaws.blOdd = !std::all_of(jValue.begin(), jValue.end(), isEntry);
        flaws.blThrowing = std::any_of(jValue.begin(), jValue.end(), holdsNoMethod);
    } catch (const tool::BadValue&) {
        flaws.blBroken = true;
    }
    return flaws;
}

void examineObjects(Findings& findings)
{
    TokenNames broken;
    TokenNames odd;
    TokenNames throwing;
    TokenNames deep;
    const tool::ObjectReader reader;
    tool::Memo<Flaws> flaws([&reader](const std::string& strText) { return flawsOf(reader, strText); });
    tool::Steps steps(Store::Access::Glance, "Examining", tool::Steps::Order::ByRow);
    const auto examine = [&](const tool::Row& row) {
        const auto addIf = [&row](bool blFlawed, TokenNames& names) {
            if (blFlawed) {
                names.add(row[0]);
            }
        };
        const Flaws allow = flaws.of(*row[1]);
        const Flaws extra = flaws.of(*row[2]);
        const bool blBroken = allow.blBroken || extra.blBroken;
        addIf(blBroken, broken);
        addIf(!blBroken && allow.blOdd, odd);
        addIf(!blBroken && allow.blThrowing, throwing);
        addIf(allow.blDeep || extra.blDeep, deep);
    };
    while (steps.next([&](Store& store, const std::string& strThose) {
        store.select("tid, webapi_allow, extra",
                     strThose + " AND (webapi_allow <> '{}' OR extra <> '{}') AND NOT " + anyNull(), examine);
    })) {
    }
    const auto add = [&](const TokenNames& names, Finding::Severity severity, const std::string& strWhat,
                         const std::string& strMeaning, const std::string& strRemedy) {
        if (names.count()) {
            findings.push_back({severity, strWhat + names.text(), strMeaning, strRemedy, {}});
        }
    };
    add(broken, Finding::Severity::Error, "no JSON object where there should be one in ",
        "such a token opens nothing, or only what stands before the fault, or cannot be saved with a use "
        "less",
        "revoke them, or update --allow and --extra");
    add(throwing, Finding::Severity::Error, "lists of methods that hold an array or an object in ",
        "the library throws an exception where it should grant or refuse, which ends a program that does not "
        "catch it",
        "revoke them, or update --allow");
    add(odd, Finding::Severity::Warning, "an API without a list of methods in ",
        "it is open to calls that name no method, and to no others", "revoke them, or update --allow");
    add(deep, Finding::Severity::Warning, "JSON of more than " + std::to_string(NESTING_MAX) + " levels in ",
        "a program that reads such a token in a thread of a small stack crashes: 64 KiB have room for that "
        "many "
        "levels, 128 KiB for twice as many",
        "revoke them, or update --allow and --extra");
}

void examineSpeed(Findings& findings)
{
    const uint64_t nTokens = tool::countSelected({});
    if (nTokens > TOKENS_WITHOUT_INDEX && !Schema(Store::Access::Glance).isIndexed("deadline")) {
        findings.push_back({Finding::Severity::Warning,
                            std::to_string(nTokens) + " tokens, and no index on their deadline",
                            "every call reads the whole table for expired tokens",
                            "vemo-access-token tune",
                            {}});
    }
}

} // namespace

namespace tool {

void examineTokens(bool blTableSound, Findings& findings)
{
    examineRows(blTableSound, findings);
    examineSpeed(findings);
    examineObjects(findings);
}

} // namespace tool
