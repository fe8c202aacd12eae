// All tokens, some at a time.
//
// Between two steps others can change tokens, and nobody waits long for one. Tokens do not depend on each
// other, so steps in the order of the ids are as good as one look at all tokens: one that is there throughout
// comes exactly once, and one that comes or goes meanwhile once or not at all.

#ifndef TOOLS_STEPS_H
#define TOOLS_STEPS_H

#include <chrono>
#include <functional>
#include <optional>
#include <string>

#include "Progress.h"
#include "Store.h"

namespace tool {

// Members throw Failure.
class Steps {
public:
    enum class Order {
        ById,
        // As the table lies on the disk, which is several times as fast. But a token that another program
        // changes meanwhile moves, and can come twice or not at all.
        ByRow,
    };

    // The most tokens of a step: large ones can follow small ones. Fewer where a step is kept in memory.
    static constexpr size_t TOKENS_MAX = 16000;
    static constexpr size_t KEPT_MAX = 4000;

    // access: Glance, or Write where something is to change. With a title, a bar shows how far they are where
    // there are many tokens. A step has nMax of them at most.
    explicit Steps(Store::Access access, const std::string& strTitle = "", Order order = Order::ById,
                   size_t nMax = TOKENS_MAX);

    // Looks at the next tokens, which fulfil a condition in SQL. The transaction ends, with what was changed
    // on the disk, when the function returns.
    typedef std::function<void(Store&, const std::string& strThose)> Use;

    // Returns false, and calls nothing, when there are no more. What it returns true for outlasts a power
    // cut, as do the changes of others that it met.
    bool next(const Use& use);

private:
    typedef std::chrono::steady_clock Clock;

    std::optional<Progress> m_progress;
    const Store::Access m_access;
    const Order m_order;
    const size_t m_nMax;
    size_t m_nTokens;      // of a step
    std::string m_strLast; // the id or row that the last step ended with, as SQL
    bool m_blEnd = false;
    Clock::time_point m_ended; // the last step
};

// Programs that wait for the database try each 10 ms; between two steps, one of them has it.
const std::chrono::milliseconds BETWEEN_STEPS(12);

// Waits while another program is at a change, for a second at most: for those who read many tokens, and have
// no database open. A reader in the way of a change costs it more than the time of the reading: the library
// begins its purge anew, which without an index reads all tokens.
void letOthersChange();

} // namespace tool

#endif
