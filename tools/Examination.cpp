#include "Examination.h"

#include <unistd.h>

#include <algorithm>

#include "Failure.h"
#include "Masking.h"
#include "Values.h"

namespace {

const uint64_t NAMED_MAX = 5; // tokens that a finding names

} // namespace

namespace tool {

const char* const REMEDY_REPLACE =
    "stop the programs, move the directory away, run \"vemo-access-token init\" and import a backup";
const char* const REMEDY_SAVE_AND_REPLACE =
    "stop the programs, save the tokens with \"vemo-access-token export\", move the directory away, run "
    "\"vemo-access-token init\" and import them";

void TokenNames::add(const std::optional<std::string>& strTid)
{
    if (m_nTokens++ < NAMED_MAX) {
        m_strNames += (m_strNames.empty() ? "" : ", ") + masked(strTid.value_or("NULL"));
    }
}

std::string TokenNames::text() const
{
    return countText(m_nTokens, "token") + " (" + m_strNames + (NAMED_MAX < m_nTokens ? ", ..." : "") + ")";
}

bool areNotes(const Findings& findings)
{
    return std::all_of(findings.begin(), findings.end(),
                       [](const Finding& each) { return Finding::Severity::Note == each.severity; });
}

Findings examine()
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
        if (examinePlace(findings)) {
            examineStore(findings);
        }
    } catch (const LockedFailure& failure) {
        findings.push_back({Finding::Severity::Error,
                            failure.fact(),
                            "programs that wait for it fail, too",
                            "find out which program holds it so long, and run doctor again",
                            {}});
    } catch (const Failure& failure) {
        findings.push_back({Finding::Severity::Error,
                            failure.fact(),
                            "programs fail in the same way",
                            std::string("mend the cause; or ") + REMEDY_REPLACE,
                            {}});
    }
    return findings;
}

} // namespace tool
