#include "Repeats.h"

#include "gate/Clock.h"

namespace {

const int64_t REMEMBERED = 5 * gate::SECOND;
const size_t REMEMBERED_MAX = 65536; // the oldest are forgotten beyond

} // namespace

namespace gate {

void Repeats::expire(int64_t nNow)
{
    while (!m_due.empty() && (m_due.front().nUntil <= nNow || m_due.size() > REMEMBERED_MAX)) {
        const auto it = m_entries.find(m_due.front().strKey);
        if (it != m_entries.end() && it->second.nCall == m_due.front().nCall) {
            m_entries.erase(it);
        }
        m_due.pop_front();
    }
}

const Repeats::Remembered* Repeats::find(const std::string& strKey, uint64_t nCall, int64_t nNow)
{
    expire(nNow);
    const auto [it, blNew] = m_entries.try_emplace(strKey);
    if (!blNew) {
        return &it->second;
    }
    it->second.nCall = nCall;
    m_due.push_back({nNow + REMEMBERED, strKey, nCall});
    return nullptr;
}

void Repeats::answer(const std::string& strKey, const Answer& answer)
{
    const auto it = m_entries.find(strKey);
    if (it == m_entries.end() || it->second.nCall != answer.nNumber) {
        return;
    }
    if (Outcome::Granted == answer.outcome || Outcome::Refused == answer.outcome) {
        it->second.blAnswered = true;
        it->second.answer = answer;
    } else {
        m_entries.erase(it);
    }
}

} // namespace gate
