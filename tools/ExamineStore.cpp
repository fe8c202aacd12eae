// What can be wrong with what the database holds.

#include <ctime>

#include "AccessTokenDefine.h"
#include "Examination.h"
#include "Place.h"
#include "Store.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Store;

const time_t JOURNAL_AGE_MAX = 10; // seconds; a change takes far less

// Whether a journal stands there that holds half a change: one that was carried out is removed, or its
// beginning wiped.
bool isJournalFull()
{
    return tool::firstBytes("-journal", 1)[0] != '\0';
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

// Returns whether it is whole.
bool examineDatabase(Findings& findings)
{
    const bool blLeftBehind = isJournalFull() && isJournalOld();
    Store store(Store::Access::Read);
    if (blLeftBehind) {
        findings.push_back({Finding::Severity::Warning, VEMO_ATOKEN_DB_PATH "-journal was left behind",
                            "a program or the machine stopped in the middle of a change",
                            "none needed: reading the database has just undone the half change", [] {}});
    }
    return examineIntegrity(store, findings);
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
}

} // namespace tool
