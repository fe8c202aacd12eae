// What can be wrong with what the database holds.

#include <chrono>
#include <ctime>

#include "AccessTokenDefine.h"
#include "Console.h"
#include "Examination.h"
#include "Place.h"
#include "Schema.h"
#include "Steps.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Schema;
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

// Reads each token by its id, and then looks up the id of each row. Returns what is damaged, or "".
std::string damageOfParts()
{
    std::string strDamage;
    tool::Steps steps(Store::Access::Glance, "Reading");
    while (strDamage.empty() && steps.next([&strDamage](Store& store, const std::string& strThose) {
        strDamage = store.damageOfRows(strThose);
    })) {
    }
    tool::Steps byRow(Store::Access::Glance, "Comparing", tool::Steps::Order::ByRow);
    while (strDamage.empty() && byRow.next([&strDamage](Store& store, const std::string& strThose) {
        strDamage = store.damageOfIndex(strThose);
    })) {
    }
    return strDamage;
}

// Returns what is damaged, or "".
std::string damage()
{
    const auto strDamage = Schema(Store::Access::Read).damage(CHECK_MAX);
    if (!strDamage) {
        tool::complain(
            "to hold no program up, the database is checked in parts, and pages that hold no token are "
            "not looked at; \"sqlite3 " VEMO_ATOKEN_DB_PATH " 'PRAGMA integrity_check'\" looks at all");
    }
    return strDamage ? *strDamage : damageOfParts();
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
