// Works on all tokens in steps, a part of them in each.
//
// Other programs can change tokens between two steps, so nobody waits long for one. Tokens do not depend on
// each other, so steps in the order of ids are as good as one transaction: a token that exists all the time
// comes exactly once; a token that is created or deleted meanwhile comes once or not at all.

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
        // In the order of the table on the disk, which is several times as fast. But a token that another
        // program changes meanwhile moves, and can come twice or not at all.
        ByRow,
    };

    // The most tokens of a step. TOKENS_MAX is bounded, because large tokens can follow small ones. KEPT_MAX
    // is for steps whose tokens stay in memory.
    static constexpr size_t TOKENS_MAX = 16000;
    static constexpr size_t KEPT_MAX = 4000;

    // access is Glance, or Write to change tokens. With a title, a progress bar is shown if there are many
    // tokens. A step has at most nMax tokens.
    explicit Steps(Store::Access access, const std::string& strTitle = "", Order order = Order::ById,
                   size_t nMax = TOKENS_MAX);

    // Works on the tokens of a step, which strThose, a condition in SQL, selects. After it returns, the
    // transaction ends, and its changes are on the disk.
    typedef std::function<void(Store&, const std::string& strThose)> Use;

    // Does the next step. Returns false, without calling use(), if there are no more tokens. When it returns
    // true, the changes of this step outlast a power cut, and so does all that it read.
    bool next(const Use& use);

private:
    typedef std::chrono::steady_clock Clock;

    std::optional<Progress> m_progress;
    const Store::Access m_access;
    const Order m_order;
    const size_t m_nMax;
    size_t m_nTokens;      // of the next step
    std::string m_strLast; // the id or row number at the end of the last step, as SQL
    bool m_blEnd = false;
    Clock::time_point m_ended; // when the last step ended
};

// Programs that wait for the database try every 10 ms, so one of them gets it between two steps.
const std::chrono::milliseconds BETWEEN_STEPS(12);

// Waits while another program changes the database, at most for a second. For commands that read many tokens;
// call it while this process does not have the database open. A reader that delays a change costs it more
// than the time of the reading: the library repeats its purge, which reads all tokens if there is no index.
void letOthersChange();

} // namespace tool

#endif
