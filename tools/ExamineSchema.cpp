// What can be wrong with the table of tokens, and with everything else in the database that changes what
// programs do.

#include <algorithm>
#include <cctype>
#include <map>

#include "AccessTokenDefine.h"
#include "Examination.h"
#include "Masking.h"
#include "Schema.h"
#include "Steps.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Schema;
using tool::Store;

std::string joined(const std::vector<std::string>& strParts)
{
    std::string strJoined;
    for (const std::string& strPart : strParts) {
        strJoined += (strJoined.empty() ? "" : ", ") + strPart;
    }
    return strJoined;
}

// A shell command that runs SQL on the database.
std::string sqliteCommand(const std::string& strSql)
{
    std::string strQuoted;
    for (const char c : strSql) {
        strQuoted += c == '\'' ? "'\\''" : std::string(1, c);
    }
    return "sqlite3 " VEMO_ATOKEN_DB_PATH " '" + strQuoted + "'";
}

// The text with each run of spaces as one space, and none at its ends.
std::string compressed(const std::string& strText)
{
    std::string strCompressed;
    for (const char c : strText) {
        const bool blSpace = isspace(static_cast<unsigned char>(c));
        if (!blSpace) {
            strCompressed += c;
        } else if (!strCompressed.empty() && strCompressed.back() != ' ') {
            strCompressed += ' ';
        }
    }
    strCompressed.resize(strCompressed.find_last_not_of(' ') + 1);
    return strCompressed;
}

std::string lowered(std::string strText)
{
    std::transform(strText.begin(), strText.end(), strText.begin(),
                   [](unsigned char c) { return static_cast<char>(tolower(c)); });
    return strText;
}

// The columns and constraints of a CREATE TABLE statement, and what follows them. The keys are their texts in
// lower case. Their order means nothing to programs. Quotes and comments are not parsed: the library's
// statement has none, so a statement with some differs from it however it is split.
std::map<std::string, std::string> definitions(const std::string& strSql)
{
    std::map<std::string, std::string> strDefinitions;
    std::string strPart;
    const auto end = [&] {
        const std::string strDefinition = compressed(strPart);
        if (!strDefinition.empty()) {
            strDefinitions.emplace(lowered(strDefinition), strDefinition);
        }
        strPart.clear();
    };
    int nDepth = 1;
    for (size_t i = strSql.find('(') + 1; i < strSql.size() && strSql[i] != ';'; ++i) {
        nDepth += strSql[i] == '(' ? 1 : strSql[i] == ')' ? -1 : 0;
        if ((1 == nDepth && strSql[i] == ',') || (0 == nDepth && strSql[i] == ')')) {
            end();
        } else {
            strPart += strSql[i];
        }
    }
    end();
    return strDefinitions;
}

// The definitions that the first map has and the second lacks, quoted.
std::string lacking(const std::map<std::string, std::string>& strDefinitions,
                    const std::map<std::string, std::string>& strOthers)
{
    std::vector<std::string> strQuoted;
    for (const auto& [strKey, strDefinition] : strDefinitions) {
        if (!strOthers.count(strKey)) {
            strQuoted.push_back(tool::quoted(strDefinition));
        }
    }
    return joined(strQuoted);
}

// Ids are unique in the library's table, so only another table can have two tokens with the same id.
void examineDuplicates(Findings& findings)
{
    tool::TokenNames names;
    tool::Steps steps(Store::Access::Glance);
    while (steps.next([&](Store& step, const std::string& strThose) {
        step.eachTid(strThose + " GROUP BY tid HAVING count(*) > 1",
                     [&](const auto& strTid) { names.add(strTid); });
    })) {
    }
    if (names.count()) {
        findings.push_back({Finding::Severity::Error,
                            "several tokens of the same id: " + names.text(),
                            "a grant reads one of them and saves another: their uses never end",
                            "revoke them by their whole ids",
                            {}});
    }
}

// A comment can look like a definition, or hide one. The library's statement has none.
bool holdsComment(const std::string& strSql)
{
    return std::string::npos != strSql.find("/*") || std::string::npos != strSql.find("--");
}

// Returns whether the table has exactly the columns that the library makes.
bool examineColumns(Schema& schema, Findings& findings)
{
    std::string strOwn;
    AccessTokenDbApi().SqlExpandCreateTable(strOwn);
    const auto strMade = definitions(strOwn);
    const std::string strSql = schema.tableStatement();
    const auto strFound = definitions(strSql);
    const std::string strMore = holdsComment(strSql) ? "a comment" : lacking(strFound, strMade);
    const std::string strLess = lacking(strMade, strFound);
    if (strMore.empty()) {
        return true; // then strLess is empty too: each of the library's columns exists, as the library has it
    }
    findings.push_back(
        {Finding::Severity::Error,
         "the table of tokens is not the one that the library makes: it has " + strMore +
             (strLess.empty() ? "" : ", and lacks " + strLess),
         "calls can fail, spend no use, report what did not happen, or take one token for another",
         tool::REMEDY_SAVE_AND_REPLACE,
         {}});
    return false;
}

// Reports objects of the schema, with the statements that drop them.
void reportObjects(const std::vector<std::string>& strObjects, const std::string& strKind,
                   const std::string& strWhat, const std::string& strMeaning, Findings& findings)
{
    std::vector<std::string> strNames;
    std::string strDrops;
    for (const std::string& strName : strObjects) {
        strNames.push_back(tool::quoted(strName));
        strDrops += (strDrops.empty() ? "" : " ") +
                    tool::sqlText("DROP %s \"%w\";", strKind.c_str(), strName.c_str());
    }
    if (!strNames.empty()) {
        findings.push_back(
            {Finding::Severity::Error,
             strWhat + ": " + joined(strNames),
             strMeaning,
             sqliteCommand(".schema token") + " shows what it does; " + sqliteCommand(strDrops),
             {}});
    }
}

void examineTriggers(Schema& schema, Findings& findings)
{
    reportObjects(
        schema.triggers(), "TRIGGER", "a trigger on the table of tokens",
        "it runs in every change that it is for: calls can report what did not happen, change other "
        "tokens, fail, or never end",
        findings);
}

void examineOddIndexes(Schema& schema, Findings& findings)
{
    reportObjects(
        schema.oddIndexes(), "INDEX", "an index on the table of tokens that does not only find them",
        "changes can fail, and a grant can delete other tokens: those that a unique index takes for "
        "the same",
        findings);
}

void examineEncoding(Schema& schema, Findings& findings)
{
    const std::string strEncoding = schema.encoding();
    if (strEncoding != "UTF-8") {
        findings.push_back({Finding::Severity::Error,
                            "the database is in " + strEncoding + ", and not in UTF-8",
                            "bytes that are not UTF-8 are not kept: such an id is never found again",
                            tool::REMEDY_SAVE_AND_REPLACE,
                            {}});
    }
}

// Returns whether there is a table that can be read.
bool examineKind(Schema& schema, Findings& findings)
{
    const std::string strKind = schema.tableKind();
    if (strKind.empty()) {
        findings.push_back({Finding::Severity::Error, "the database has no table of tokens",
                            "every call fails: the table is made together with the file, and never later",
                            "vemo-access-token init", [] { Store(Store::Access::Locked).makeTable(); }});
    } else if (strKind != "table") {
        findings.push_back({Finding::Severity::Error,
                            "a " + strKind + " stands in the place of the table of tokens",
                            "programs read what it makes up, and their changes fail or go elsewhere",
                            tool::REMEDY_REPLACE,
                            {}});
    }
    return strKind == "table";
}

// Returns whether the fields can be read.
bool examineMissing(Schema& schema, Findings& findings)
{
    std::vector<std::string> strMissing;
    for (const std::string& strName : tool::fieldNames()) {
        if (!schema.hasColumn(strName)) {
            strMissing.push_back(strName);
        }
    }
    if (!strMissing.empty()) {
        findings.push_back({Finding::Severity::Error,
                            "the table of tokens lacks columns: " + joined(strMissing),
                            "every call that reads or writes a token fails",
                            tool::REMEDY_REPLACE,
                            {}});
    }
    return strMissing.empty();
}

} // namespace

namespace tool {

bool examineSchema(Findings& findings)
{
    bool blOwn = false;
    {
        Schema schema(Store::Access::Read);
        if (!examineKind(schema, findings)) {
            return false;
        }
        examineTriggers(schema, findings);
        examineOddIndexes(schema, findings);
        if (!examineMissing(schema, findings)) {
            return false;
        }
        blOwn = examineColumns(schema, findings);
    }
    if (!blOwn) {
        examineDuplicates(findings);
    }
    Schema schema(Store::Access::Read);
    examineEncoding(schema, findings);
    return true;
}

} // namespace tool
