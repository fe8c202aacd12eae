// What can be wrong with what the database holds.

#include <algorithm>
#include <ctime>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Examination.h"
#include "Place.h"
#include "Store.h"
#include "Values.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Store;

const time_t JOURNAL_AGE_MAX = 10;    // seconds; a change takes far less
const int64_t BACKLOG_AGE_MAX = 3600; // seconds; every call purges
const uint64_t TOKENS_WITHOUT_INDEX = 10000;
const size_t NAMED_MAX = 5; // tokens that a finding names

// Whether a journal stands there that holds half a change: one that was carried out is removed, or its
// beginning wiped.
bool isJournalFull()
{
    const std::string strStart = tool::firstBytes("-journal", 1);
    return !strStart.empty() && strStart[0] != '\0';
}

// Whether no living program can be writing it any more.
bool isJournalOld()
{
    const auto status = tool::statusOf(VEMO_ATOKEN_DB_PATH "-journal");
    return status && time(nullptr) - status->st_mtime > JOURNAL_AGE_MAX;
}

bool examineIntegrity(Store& store, Findings& findings)
{
    tool::Rows rows;
    const std::string strErr = store.queryAsFarAsItGoes("PRAGMA integrity_check", rows);
    std::string strReport;
    for (const auto& row : rows) {
        strReport += (strReport.empty() ? "" : "\n") + row[0].value_or("");
    }
    if (strReport == "ok") {
        return true;
    }
    if (strReport.empty()) {
        strReport = strErr;
    }
    for (size_t i = strReport.find('\n'); i != std::string::npos; i = strReport.find('\n', i)) {
        strReport.replace(i, 1, "; ");
    }
    findings.push_back({Finding::Severity::Error,
                        "the database is damaged: " + strReport,
                        "tokens may be lost or wrong",
                        std::string(tool::REMEDY_SAVE_AND_REPLACE) +
                            "; where export fails, import a backup or what sqlite3 can still read: see "
                            "vemo-access-token(8)",
                        {}});
    return false;
}

// Returns whether the table can be worked on.
bool examineTable(Store& store, Findings& findings)
{
    if (!store.hasTable()) {
        findings.push_back({Finding::Severity::Error, "the database has no table of tokens",
                            "every call fails: the table is made together with the file, and never later",
                            "vemo-access-token init", [] { Store(Store::Access::Locked).makeTable(); }});
        return false;
    }
    std::string strMissing;
    for (const std::string& strName : tool::fieldNames()) {
        const std::string strSql =
            tool::sqlText("SELECT count(*) FROM pragma_table_info('token') WHERE name = %Q", strName.c_str());
        strMissing += store.number(strSql) ? "" : (strMissing.empty() ? "" : ", ") + strName;
    }
    if (!strMissing.empty()) {
        findings.push_back({Finding::Severity::Error,
                            "the table of tokens lacks columns: " + strMissing,
                            "every call that reads or writes a token fails",
                            tool::REMEDY_REPLACE,
                            {}});
    }
    return strMissing.empty();
}

// "7 tokens (Ab12Cd34, ...)"
std::string tokensText(const tool::Rows& tids)
{
    std::string strNames;
    for (size_t i = 0; i < std::min(tids.size(), NAMED_MAX); ++i) {
        strNames += (i ? ", " : "") + tool::masked(tids[i][0].value_or("NULL"));
    }
    return tool::countText(tids.size(), "token") + " (" + strNames +
           (NAMED_MAX < tids.size() ? ", ..." : "") + ")";
}

std::string tokensOf(Store& store, const std::string& strWhere)
{
    return tokensText(store.query("SELECT tid FROM token WHERE " + strWhere));
}

bool isAny(Store& store, const std::string& strWhere)
{
    return !store.query("SELECT 1 FROM token WHERE " + strWhere + " LIMIT 1").empty();
}

// A condition that holds for a row where the test holds for any field whose default is of a kind. The
// test is SQL with a "?" for the field.
template <typename IsOfKind>
std::string anyField(IsOfKind isOfKind, const std::string& strTest)
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
    return anyField([](const Json::Value&) { return true; }, "? IS NULL");
}

void examineNulls(Store& store, Findings& findings)
{
    const std::string strWhere = anyNull();
    if (isAny(store, strWhere)) {
        findings.push_back({Finding::Severity::Error, "a NULL in " + tokensOf(store, strWhere),
                            "such a token cannot be read or granted, and every listing that meets it fails",
                            "delete them: vemo-access-token doctor --repair", [strWhere] {
                                Store repaired(Store::Access::Write);
                                repaired.query("DELETE FROM token WHERE " + strWhere);
                                repaired.commit();
                            }});
    }
}

void examineNumbers(Store& store, Findings& findings)
{
    const auto isNumber = [](const Json::Value& jDefault) { return jDefault.isIntegral(); };
    const std::string strWhere = anyField(isNumber, "typeof(?) NOT IN ('integer', 'null')");
    if (isAny(store, strWhere)) {
        findings.push_back(
            {Finding::Severity::Error,
             "no whole number where there should be one in " + tokensOf(store, strWhere),
             "it is read as another number, 0 for a word: deadline or uses are not what they seem",
             "revoke them, or update what is wrong",
             {}});
    }
}

void examineTexts(Store& store, Findings& findings)
{
    const auto isText = [](const Json::Value& jDefault) { return jDefault.isString(); };
    const std::string strWhere = anyField(isText, "typeof(?) NOT IN ('text', 'null')");
    if (isAny(store, strWhere)) {
        std::string strTexts;
        for (const std::string& strName : tool::fieldNames()) {
            if (isText(VEMO_ACCESS_TOKEN::tokenType()[strName][1])) {
                strTexts += (strTexts.empty() ? "" : ", ") + strName + " = CAST(" + strName + " AS TEXT)";
            }
        }
        findings.push_back({Finding::Severity::Error,
                            "bytes where there should be a text in " + tokensOf(store, strWhere),
                            "no look-up by that field finds such a token",
                            "make texts of them: vemo-access-token doctor --repair", [strWhere, strTexts] {
                                Store repaired(Store::Access::Write);
                                repaired.query("UPDATE token SET " + strTexts + " WHERE " + strWhere);
                                repaired.commit();
                            }});
    }
}

// Whether the library reads a token's objects as such. Its reader takes more than SQLite's.
bool hasObjects(Store& store, const std::string& strTid)
{
    const auto jToken = store.find(strTid);
    return !jToken || ((*jToken)["webapi_allow"].isObject() && (*jToken)["extra"].isObject());
}

void examineObjects(Store& store, Findings& findings)
{
    const auto isObject = [](const Json::Value& jDefault) { return jDefault.isObject(); };
    const std::string strWhere =
        "NOT " + anyNull() + " AND " + anyField(isObject, "iif(json_valid(?), json_type(?), '') <> 'object'");
    tool::Rows tids;
    for (const auto& row : store.query("SELECT tid FROM token WHERE " + strWhere)) {
        if (!hasObjects(store, row[0].value_or(""))) {
            tids.push_back(row);
        }
    }
    if (!tids.empty()) {
        findings.push_back({Finding::Severity::Error,
                            "no JSON object where there should be one in " + tokensText(tids),
                            "such a token opens nothing, or cannot be saved with a use less",
                            "revoke them, or update --allow and --extra",
                            {}});
    }
}

void examineDeadlines(Store& store, Findings& findings)
{
    const std::string strNever = "deadline <= 0";
    if (isAny(store, strNever)) {
        findings.push_back({Finding::Severity::Warning,
                            "a deadline of 0 or less in " + tokensOf(store, strNever),
                            "there is no value for \"never\": the next purge deletes them",
                            "update --ttl gives them time",
                            {}});
    }
    const std::string strOld =
        "deadline > 0 AND deadline < strftime('%s', 'now') - " + std::to_string(BACKLOG_AGE_MAX);
    if (isAny(store, strOld)) {
        findings.push_back(
            {Finding::Severity::Warning, "expired for more than an hour: " + tokensOf(store, strOld),
             "no program has called since, or its purges fail", "vemo-access-token purge", [] {
                 Store repaired(Store::Access::Write);
                 repaired.query(std::string("DELETE FROM token WHERE deadline > 0 AND ") + tool::SQL_EXPIRED);
                 repaired.commit();
             }});
    }
}

void examineIndexes(Store& store, Findings& findings)
{
    const uint64_t nTokens = store.number("SELECT count(*) FROM token");
    const std::string strIndexed =
        "SELECT count(*) FROM pragma_index_list('token') AS list, "
        "pragma_index_info(list.name) AS info WHERE info.seqno = 0 AND info.name = 'deadline'";
    if (nTokens > TOKENS_WITHOUT_INDEX && 0 == store.number(strIndexed)) {
        findings.push_back({Finding::Severity::Warning,
                            std::to_string(nTokens) + " tokens, and no index on their deadline",
                            "every call reads the whole table for expired tokens",
                            "vemo-access-token tune",
                            {}});
    }
}

} // namespace

namespace tool {

void examineStore(Findings& findings)
{
    const bool blJournal = isJournalFull() && isJournalOld();
    Store store(Store::Access::Read);
    if (blJournal && !isJournalFull()) {
        findings.push_back({Finding::Severity::Warning, VEMO_ATOKEN_DB_PATH "-journal was left behind",
                            "a program or the machine stopped in the middle of a change",
                            "none needed: reading the database has just undone the half change", [] {}});
    }
    if (examineIntegrity(store, findings) && examineTable(store, findings)) {
        examineNulls(store, findings);
        examineNumbers(store, findings);
        examineTexts(store, findings);
        examineDeadlines(store, findings);
        examineIndexes(store, findings);
        examineObjects(store, findings);
    }
}

} // namespace tool
