// Notes about the tokens of a sound store. Only numbers, because who uses the tokens is not doctor's concern.

#include "Examination.h"
#include "Statistics.h"
#include "Values.h"

namespace tool {

void examineUse(Findings& findings)
{
    const Statistics statistics = collectStatistics();
    const auto note = [&findings](uint64_t nTokens, const std::string& strWhat, const std::string& strMeaning,
                                  const std::string& strRemedy) {
        if (nTokens) {
            findings.push_back(
                {Finding::Severity::Note, strWhat + countText(nTokens, "token"), strMeaning, strRemedy, {}});
        }
    };
    note(statistics.nExpiringInDay, "expiring within a day: ", "who uses them is refused then",
         "\"vemo-access-token list --expiring 1d\" tells which; update --ttl gives them time");
    note(statistics.nExpiringInWeek, "expiring within a week: ", "who uses them is refused then",
         "\"vemo-access-token list --expiring 7d\" tells which; update --ttl gives them time");
    note(countWithoutOwner(statistics), "without an owner who is a user of this machine: ",
         "they are granted on behalf of a number that another user can get",
         "\"vemo-access-token list --no-owner\" tells which; revoke --no-owner deletes them");
    note(statistics.nOpeningNothing, "opening nothing: ", "every call with them is refused",
         "update --add-allow lets them open calls; or revoke them");
    note(statistics.nOldUnlimited, "of unlimited uses, and older than a year: ",
         "whoever has got hold of one in all that time can use it", "revoke them, and create others");
}

} // namespace tool
