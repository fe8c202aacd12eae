#include "Batch.h"

#include <limits>

namespace {

gate::Figure figureOf(grant::Verdict verdict)
{
    switch (verdict) {
    case grant::Verdict::Unknown: return gate::REFUSED_UNKNOWN;
    case grant::Verdict::Expired: return gate::REFUSED_EXPIRED;
    case grant::Verdict::ApiNotListed: return gate::REFUSED_API;
    case grant::Verdict::MethodNotListed: return gate::REFUSED_METHOD;
    case grant::Verdict::Malformed: return gate::REFUSED_MALFORMED;
    case grant::Verdict::Granted: break;
    }
    return gate::GRANTED;
}

// The user of a uid; nothing for a number that cannot be a user's.
std::optional<uid_t> userOf(int64_t nUid)
{
    if (0 > nUid || nUid >= std::numeric_limits<uid_t>::max()) {
        return std::nullopt;
    }
    return static_cast<uid_t>(nUid);
}

} // namespace

namespace gate {

Reply Batch::refused(const Request& request, Figure figure)
{
    ++m_figures[figure];
    Reply answer;
    answer.nNumber = request.nNumber;
    answer.outcome = Outcome::Refused;
    return answer;
}

std::optional<Reply> Batch::call(const Request& request)
{
    const auto [it, blNew] = m_entries.try_emplace(request.strTid);
    Entry& entry = it->second;
    if (blNew) {
        entry.token = m_tokens.find(request.strTid);
    }
    if (!entry.token || entry.blSpent) {
        return refused(request, REFUSED_UNKNOWN);
    }
    grant::Token& token = *entry.token;
    const grant::Verdict verdict = grant::judge(token, request.strApi, request.strMethod);
    if (grant::Verdict::Granted != verdict) {
        return refused(request, figureOf(verdict));
    }
    // An answer names the owner, so a token without an owner opens nothing here.
    const std::optional<uid_t> uid = userOf(token.nUid);
    const Owners::Owner owner = uid ? m_fOwner(*uid) : Owners::Owner{Owners::State::Nobody, ""};
    Reply answer;
    answer.nNumber = request.nNumber;
    switch (owner.state) {
    case Owners::State::Asked: return std::nullopt;
    case Owners::State::Failing: ++m_figures[FAILED]; return answer;
    case Owners::State::Nobody: return refused(request, REFUSED_OWNER);
    case Owners::State::Known: break;
    }
    // As in the library's record, the count after the last use is still the one before it.
    const grant::Left left = grant::left(token.nCount);
    if (request.blRecord) {
        grant::Token shown = token;
        shown.nCount -= grant::Left::Less == left ? 1 : 0;
        answer.strRecord = shown.recordWithoutTid();
    }
    if (token.strFunction.size() > FUNCTION_MAX || answer.strRecord.size() > RECORD_MAX) {
        return refused(request, REFUSED_LARGE);
    }
    answer.outcome = Outcome::Granted;
    answer.nUid = *uid;
    answer.strUser = owner.strName;
    answer.strFunction = token.strFunction;
    entry.blChanged = entry.blChanged || grant::Left::All != left;
    entry.blSpent = grant::Left::Nothing == left;
    token.nCount -= grant::Left::Less == left ? 1 : 0;
    ++m_figures[GRANTED];
    return answer;
}

void Batch::save()
{
    for (const auto& [strTid, entry] : m_entries) {
        if (entry.blSpent) {
            m_tokens.remove(strTid);
        } else if (entry.blChanged) {
            m_tokens.setCount(strTid, entry.token->nCount);
        }
    }
}

} // namespace gate
