#include "Examination.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <memory>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Failure.h"
#include "Layout.h"
#include "Place.h"
#include "Store.h"
#include "Values.h"

namespace {

using tool::Failure;
using tool::Finding;
using tool::Rows;
using tool::Store;
typedef std::vector<Finding> Findings;

const mode_t PRIVATE_MODE = 0700;
const mode_t OTHERS_MODE = 0077;
const mode_t OTHERS_WRITE_MODE = 0022;
const time_t JOURNAL_AGE_MAX = 10;    // seconds; a change takes far less
const int64_t BACKLOG_AGE_MAX = 3600; // seconds; every call purges
const int64_t TOKENS_WITHOUT_INDEX = 10000;
const size_t NAMED_MAX = 5; // tokens that a finding names

void requireCall(int nResult, const std::string& strPath)
{
    if (0 != nResult) {
        throw Failure(tool::EXIT_STATUS_STORE, strPath + ": " + strerror(errno));
    }
}

std::string octal(mode_t mode)
{
    char szMode[8];
    snprintf(szMode, sizeof(szMode), "%04o", static_cast<unsigned int>(mode & 07777));
    return szMode;
}

// Owner and mode of what should be root's alone.
void examinePrivacy(const std::string& strPath, const struct stat& status, Findings& findings)
{
    if (0 != status.st_uid) {
        findings.push_back(
            {Finding::Severity::Error, strPath + " belongs to uid " + std::to_string(status.st_uid),
             "its owner can read and change every token", "chown root " + strPath,
             [strPath] { requireCall(chown(strPath.c_str(), 0, static_cast<gid_t>(-1)), strPath); }});
    }
    const mode_t mode = status.st_mode & 07777;
    if (mode & OTHERS_MODE) {
        findings.push_back({Finding::Severity::Error, strPath + " has mode " + octal(mode),
                            "others than root can use it, and ids are credentials", "chmod 0700 " + strPath,
                            [strPath] { requireCall(chmod(strPath.c_str(), PRIVATE_MODE), strPath); }});
    }
}

// Whoever can write to a directory above can put another in the place of the private one.
void examineParents(Findings& findings)
{
    std::string strPath = tool::databaseDirectory();
    for (size_t nEnd = strPath.rfind('/'); nEnd != 0; nEnd = strPath.rfind('/')) {
        strPath.resize(nEnd);
        const auto status = tool::statusOf(strPath);
        if (status && (0 != status->st_uid || (status->st_mode & OTHERS_WRITE_MODE))) {
            findings.push_back({Finding::Severity::Warning,
                                strPath + " belongs to uid " + std::to_string(status->st_uid) +
                                    " and has mode " + octal(status->st_mode),
                                "others than root can replace the private directory below it",
                                "chown root " + strPath + " && chmod go-w " + strPath,
                                {}});
        }
    }
}

// Returns whether the directory is one.
bool examineDirectory(Findings& findings)
{
    const std::string strPath = tool::databaseDirectory();
    const auto status = tool::statusOf(strPath);
    if (!status) {
        findings.push_back({Finding::Severity::Error, "there is no directory " + strPath,
                            "no token can be created, and every call fails", "vemo-access-token init",
                            [] { tool::makeDirectory(); }});
        return false;
    }
    if (!S_ISDIR(status->st_mode)) {
        findings.push_back({Finding::Severity::Error,
                            strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is no directory"),
                            "the tokens stand elsewhere, or nowhere",
                            "find out who made it; move the database to a directory of that name",
                            {}});
        return S_ISLNK(status->st_mode);
    }
    examinePrivacy(strPath, *status, findings);
    examineParents(findings);
    return true;
}

// Returns whether the file can be opened.
bool examineFile(Findings& findings)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH;
    const auto status = tool::statusOf(strPath);
    if (!status) {
        findings.push_back({Finding::Severity::Error, "there is no database " + strPath,
                            "there are no tokens; the first call that needs it makes it",
                            "vemo-access-token init",
                            [] { Store(Store::Access::Plain, Store::Missing::Make).makeTable(); }});
        return false;
    }
    if (!S_ISREG(status->st_mode)) {
        findings.push_back(
            {Finding::Severity::Error,
             strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is no regular file"),
             "programs work on another file than this one, or on none",
             "find out who made it; move the database to this name",
             {}});
        return S_ISLNK(status->st_mode);
    }
    if (1 != status->st_nlink) {
        findings.push_back(
            {Finding::Severity::Warning,
             strPath + " has " + std::to_string(status->st_nlink) + " hard links",
             "the tokens can be reached under another name, and a journal of that name is not found",
             "find -samefile tells the other names; remove those",
             {}});
    }
    examinePrivacy(strPath, *status, findings);
    return true;
}

// Whether a journal stands there that no living program can be writing to any more.
bool hasOldJournal()
{
    const auto status = tool::statusOf(VEMO_ATOKEN_DB_PATH "-journal");
    return status && 0 != status->st_size && time(nullptr) - status->st_mtime > JOURNAL_AGE_MAX;
}

void examineJournals(Store& store, bool blOldJournal, Findings& findings)
{
    if (blOldJournal) {
        findings.push_back({Finding::Severity::Warning, VEMO_ATOKEN_DB_PATH "-journal was left behind",
                            "a program or the machine stopped in the middle of a change",
                            "none needed: reading the database has just undone the half change", [] {}});
    }
    const bool blWal = store.text("PRAGMA journal_mode") == "wal";
    if (!blWal && tool::statusOf(VEMO_ATOKEN_DB_PATH "-wal")) {
        findings.push_back({Finding::Severity::Warning,
                            VEMO_ATOKEN_DB_PATH "-wal does not belong to the database",
                            "the database was copied or replaced without it, and may lack changes",
                            "if the database is complete, remove it while no program runs",
                            {}});
    }
}

bool examineIntegrity(Store& store, Findings& findings)
{
    const std::string strReport = store.text("PRAGMA integrity_check");
    if (strReport == "ok") {
        return true;
    }
    findings.push_back(
        {Finding::Severity::Error,
         "the database is damaged: " + strReport,
         "tokens may be lost or wrong",
         "save what \"vemo-access-token export\" still reads; stop the programs, move the file away, "
         "and import that or a backup",
         {}});
    return false;
}

// Returns whether the table can be worked on.
bool examineTable(Store& store, Findings& findings)
{
    if (!store.hasTable()) {
        findings.push_back({Finding::Severity::Error, "the database has no table of tokens",
                            "every call fails: the table is made together with the file, and never later",
                            "vemo-access-token init", [] { Store(Store::Access::Plain).makeTable(); }});
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
                            "stop the programs, move the file away, and import a backup",
                            {}});
    }
    return strMissing.empty();
}

// "in 7 tokens (Ab12Cd34, ...)"
std::string tokensOf(Store& store, const std::string& strWhere)
{
    const int64_t nTokens = store.number("SELECT count(*) FROM token WHERE " + strWhere);
    std::string strNames;
    size_t nNamed = 0;
    for (const auto& row :
         store.query("SELECT tid FROM token WHERE " + strWhere + " LIMIT " + std::to_string(NAMED_MAX))) {
        strNames += (nNamed++ ? ", " : "") + tool::masked(row[0].value_or("NULL"));
    }
    return std::to_string(nTokens) + (1 == nTokens ? " token (" : " tokens (") + strNames +
           (static_cast<int64_t>(nNamed) < nTokens ? ", ..." : "") + ")";
}

bool isAny(Store& store, const std::string& strWhere)
{
    return !store.query("SELECT 1 FROM token WHERE " + strWhere + " LIMIT 1").empty();
}

// Joins what strTest says of each field that has a default of a kind.
template <typename Kind>
std::string anyField(Kind kind, const std::string& strTest)
{
    std::string strWhere;
    for (const std::string& strName : tool::fieldNames()) {
        if (kind(VEMO_ACCESS_TOKEN::tokenType()[strName][1])) {
            strWhere += (strWhere.empty() ? "" : " OR ") + strName + strTest;
        }
    }
    return "(" + strWhere + ")";
}

void examineNulls(Store& store, Findings& findings)
{
    const std::string strWhere = anyField([](const Json::Value&) { return true; }, " IS NULL");
    if (isAny(store, strWhere)) {
        findings.push_back({Finding::Severity::Error, "a NULL in " + tokensOf(store, strWhere),
                            "such a token cannot be read or granted, and every listing that meets it fails",
                            "delete them: \"vemo-access-token doctor --repair\"", [strWhere] {
                                Store repaired(Store::Access::Write);
                                repaired.query("DELETE FROM token WHERE " + strWhere);
                                repaired.commit();
                            }});
    }
}

void examineNumbers(Store& store, Findings& findings)
{
    std::string strWhere;
    for (const std::string& strName : tool::fieldNames()) {
        if (VEMO_ACCESS_TOKEN::tokenType()[strName][1].isIntegral()) {
            strWhere +=
                (strWhere.empty() ? "" : " OR ") + ("typeof(" + strName + ") NOT IN ('integer', 'null')");
        }
    }
    if (isAny(store, strWhere)) {
        findings.push_back(
            {Finding::Severity::Error,
             "no whole number where there should be one in " + tokensOf(store, strWhere),
             "it is read as another number, 0 for a word: deadline or uses are not what they seem",
             "revoke them, or update what is wrong",
             {}});
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
    const std::string strWhere =
        "json_type(CASE WHEN json_valid(webapi_allow) THEN webapi_allow ELSE '0' END) <> "
        "'object' OR json_type(CASE WHEN json_valid(extra) THEN extra ELSE '0' END) <> "
        "'object'";
    std::string strNames;
    for (const auto& row : store.query("SELECT tid FROM token WHERE " + strWhere)) {
        if (!hasObjects(store, row[0].value_or(""))) {
            strNames += (strNames.empty() ? "" : ", ") + tool::masked(row[0].value_or(""));
        }
    }
    if (!strNames.empty()) {
        findings.push_back({Finding::Severity::Error,
                            "no JSON object where there should be one in " + strNames,
                            "such a token opens nothing, or cannot be saved with a use less",
                            "revoke them, or update "
                            "--allow and --extra",
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
    const int64_t nTokens = store.number("SELECT count(*) FROM token");
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

void examineStore(Findings& findings)
{
    const bool blOldJournal = hasOldJournal();
    Store store(Store::Access::Read);
    examineJournals(store, blOldJournal, findings);
    if (examineIntegrity(store, findings) && examineTable(store, findings)) {
        examineNulls(store, findings);
        examineNumbers(store, findings);
        examineDeadlines(store, findings);
        examineIndexes(store, findings);
        examineObjects(store, findings);
    }
}

} // namespace

namespace tool {

std::vector<Finding> examine()
{
    Findings findings;
    if (0 != geteuid()) {
        findings.push_back({Finding::Severity::Error,
                            "not run as root: the effective uid is " + std::to_string(geteuid()),
                            "the database belongs to root and cannot be looked at",
                            "run doctor as root",
                            {}});
        return findings;
    }
    try {
        if (examineDirectory(findings) && examineFile(findings)) {
            examineStore(findings);
        }
    } catch (const Failure& failure) {
        findings.push_back({Finding::Severity::Error,
                            failure.what(),
                            "programs fail in the same way",
                            "mend the cause, or move the file away and import a backup",
                            {}});
    }
    return findings;
}

} // namespace tool
