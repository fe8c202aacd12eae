#include "Repeats.h"

#include "gate/Clock.h"

namespace {

const int64_t REMEMBERED = 5 * gate::SECOND;
const size_t HELD_MAX = 32 << 20; // bytes; beyond, the oldest are forgotten

size_t sizeOf(const gate::Reply& answer)
{
    return answer.strUser.size() + answer.strFunction.size() + answer.strRecord.size();
}

} // namespace

namespace gate {

void Repeats::expire(int64_t nNow)
{
    while (!m_due.empty() && (m_due.front().nUntil <= nNow || m_cbHeld > HELD_MAX)) {
        const Due due = std::move(m_due.front());
        m_due.pop_front();
        m_cbHeld -= sizeof(due) + due.strKey.size();
        forget(due.strKey, due.nCall);
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
    m_cbHeld += sizeof(Remembered) + sizeof(Due) + 2 * strKey.size();
    return nullptr;
}

void Repeats::answer(const std::string& strKey, const Reply& answer)
{
    if (Outcome::Granted != answer.outcome && Outcome::Refused != answer.outcome) {
        return forget(strKey, answer.nNumber);
    }
    const auto it = m_entries.find(strKey);
    if (it != m_entries.end() && it->second.nCall == answer.nNumber) {
        it->second.blAnswered = true;
        it->second.answer = answer;
        m_cbHeld += sizeOf(answer);
    }
}

void Repeats::forget(const std::string& strKey, uint64_t nCall)
{
    const auto it = m_entries.find(strKey);
    if (it != m_entries.end() && it->second.nCall == nCall) {
        m_cbHeld -= sizeof(Remembered) + strKey.size() + sizeOf(it->second.answer);
        m_entries.erase(it);
    }
}

} // namespace gate
