#include "Steps.h"

#include <algorithm>
#include <thread>

#include "Place.h"

namespace {

// The time that a step should take. The first step has TOKENS_FIRST tokens, and no step has fewer.
const std::chrono::milliseconds STEP(100);
const size_t TOKENS_FIRST = 250;

const std::chrono::milliseconds FOR_OTHERS(1000); // at most

uint64_t countAll()
{
    uint64_t nTokens = 0;
    tool::Steps steps(tool::Store::Access::Glance);
    while (steps.next(
        [&nTokens](tool::Store& store, const std::string& strThose) { nTokens += store.count(strThose); })) {
    }
    return nTokens;
}

} // namespace

namespace tool {

Steps::Steps(Store::Access access, const std::string& strTitle, Order order, size_t nMax)
    : m_access(access),
      m_order(order),
      m_nMax(nMax),
      m_nTokens(TOKENS_FIRST),
      m_ended(Clock::now() - BETWEEN_STEPS)
{
    if (!strTitle.empty()) {
        m_progress.emplace(strTitle, countAll, true, MANY);
    }
}

void letOthersChange()
{
    typedef std::chrono::steady_clock Clock;
    for (const auto end = Clock::now() + FOR_OTHERS; isBeingChanged() && Clock::now() < end;) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
}

bool Steps::next(const Use& use)
{
    if (m_blEnd) {
        return false;
    }
    std::this_thread::sleep_until(m_ended + BETWEEN_STEPS);
    if (Store::Access::Write != m_access) {
        letOthersChange();
    }
    const Clock::time_point start = Clock::now();
    {
        Store store(m_access);
        const bool blIds = Order::ById == m_order || !store.hasRowIds();
        const std::string strKey = blIds ? "tid" : "rowid";
        const std::string strBehind = strKey + (m_strLast.empty() ? " IS NOT NULL" : " > " + m_strLast);
        std::string strBound;
        store.select(blIds ? SQL_QUOTED_TID : strKey,
                     strBehind + " ORDER BY " + strKey + " LIMIT 1 OFFSET " + std::to_string(m_nTokens - 1),
                     [&strBound](const Row& row) { strBound = row[0].value_or(""); });
        m_blEnd = strBound.empty();
        const std::string strUpTo = m_blEnd ? "true" : strKey + " <= " + strBound;
        // Tokens whose id is NULL have no place in the order; they come in the first step.
        use(store,
            "(" + (blIds && m_strLast.empty() ? "tid IS NULL OR " + strUpTo : strBehind + " AND " + strUpTo) +
                ")");
        m_strLast = strBound;
        if (Store::Access::Write == m_access) {
            store.commit();
        }
    }
    m_ended = Clock::now();
    if (Store::Access::Write != m_access) {
        syncDirectory("a power cut can undo what others changed last");
    }
    if (m_progress) {
        m_progress->step(m_nTokens);
    }
    if (m_ended - start > 2 * STEP) {
        m_nTokens = std::max(TOKENS_FIRST, m_nTokens / 2);
    } else if (m_ended - start < STEP) {
        m_nTokens = std::min(m_nMax, m_nTokens * 2);
    }
    return true;
}

} // namespace tool
