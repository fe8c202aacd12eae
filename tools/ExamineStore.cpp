// What can be wrong with what the database holds.

#include <chrono>
#include <ctime>

#include "AccessTokenDefine.h"
#include "Console.h"
#include "Examination.h"
#include "Place.h"
#include "Steps.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Store;

const std::chrono::milliseconds CHECK_MAX(500);
const time_t JOURNAL_AGE_MAX = 10; // seconds; a change takes far less

// Whether there is a journal with half a change: after a change, SQLite deletes or clears its journal.
bool isJournalFull()
{
    return tool::firstBytes("-journal", 1)[0] != '\0';
}

// Whether the journal is too old for a program that is still writing it.
bool isJournalOld()
{
    const auto status = tool::statusOf(VEMO_ATOKEN_DB_PATH "-journal");
    return status && time(nullptr) - status->st_mtime > JOURNAL_AGE_MAX;
}

// The index of the ids, which belongs to the primary key.
const char* const INDEX_OF_IDS = "(SELECT name FROM pragma_index_list('token') WHERE origin = 'pk')";

// Reads each token by its id, and checks that the id of each row leads back to it. Returns what is wrong.
std::string damageOfParts()
{
    std::string strRead = "SELECT 0";
    for (const std::string& strName : tool::fieldNames()) {
        strRead += " + total(length(" + strName + "))";
    }
    tool::Rows rows;
    std::string strErr;
    tool::Steps steps(Store::Access::Glance, "Reading");
    while (strErr.empty() && steps.next([&](Store& store, const std::string& strThose) {
        strErr = store.queryPartially(strRead + " FROM token WHERE " + strThose, rows);
    })) {
    }
    // Now the other way: look up the id of each row in the index.
    tool::Steps byRow(Store::Access::Glance, "Comparing", tool::Steps::Order::ByRow);
    while (strErr.empty() && byRow.next([&](Store& store, const std::string& strThose) {
        const std::string strIndex = store.text("SELECT " + std::string(INDEX_OF_IDS));
        if (strIndex.empty()) {
            return;
        }
        rows.clear();
        strErr = store.queryPartially("SELECT count(*) FROM token NOT INDEXED WHERE " + strThose +
                                          " AND NOT EXISTS (SELECT 1 FROM token AS other INDEXED BY " +
                                          tool::sqlText("\"%w\"", strIndex.c_str()) +
                                          " WHERE other.tid = token.tid AND other.rowid = token.rowid)",
                                      rows);
        if (!rows.empty() && rows[0][0] != "0") {
            strErr = rows[0][0].value_or("") + " rows are missing in the index of the ids";
        }
    })) {
    }
    return strErr;
}

// Returns what is damaged, or "". A whole check takes some seconds for a million tokens. Without a
// write-ahead journal, others cannot commit in that time, so a long check is done in parts.
std::string damage()
{
    tool::Rows rows;
    std::optional<std::string> strErr;
    {
        Store store(Store::Access::Read);
        const bool blOthersCommit = store.text("PRAGMA journal_mode") == "wal";
        strErr = blOthersCommit ? store.queryPartially("PRAGMA integrity_check", rows)
                                : store.queryWithin(CHECK_MAX, "PRAGMA integrity_check", rows);
    }
    if (!strErr) {
        tool::complain(
            "to hold no program up, the database is checked in parts, and pages that hold no token are "
            "not looked at; \"sqlite3 " VEMO_ATOKEN_DB_PATH " 'PRAGMA integrity_check'\" looks at all");
        return damageOfParts();
    }
    std::string strReport;
    for (const auto& row : rows) {
        strReport += (strReport.empty() ? "" : "\n") + row[0].value_or("");
    }
    return strReport == "ok" ? "" : strReport.empty() ? *strErr : strReport;
}

bool examineIntegrity(Findings& findings)
{
    std::string strReport = damage();
    if (strReport.empty()) {
        return true;
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

// Returns whether the database is undamaged.
bool examineDatabase(Findings& findings)
{
    const bool blLeftBehind = isJournalFull() && isJournalOld();
    {
        const Store opened(Store::Access::Read); // this undoes half a change
    }
    if (blLeftBehind) {
        findings.push_back({Finding::Severity::Warning, VEMO_ATOKEN_DB_PATH "-journal was left behind",
                            "a program or the machine stopped in the middle of a change",
                            "none needed: reading the database has just undone the half change", [] {}});
    }
    return examineIntegrity(findings);
}

} // namespace

namespace tool {

void examineStore(Findings& findings)
{
    const bool blWhole = examineDatabase(findings);
    const size_t nBefore = findings.size();
    const bool blReadable = examineSchema(findings);
    if (blWhole && blReadable) {
        examineTokens(findings.size() == nBefore, findings);
    }
    if (areNotes(findings)) { // notes are only for a store in which nothing is wrong
        examineUse(findings);
    }
}

} // namespace tool
