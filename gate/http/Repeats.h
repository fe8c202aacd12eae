// Calls that come twice: proxies ask again for the same request of a client, and it is to spend one use.

#ifndef GATE_HTTP_REPEATS_H
#define GATE_HTTP_REPEATS_H

#include <cstdint>
#include <deque>
#include <string>
#include <unordered_map>

#include "gate/Messages.h"

namespace gate {

// What is remembered for some seconds of each call that has a key. A key counts for one call only: the same
// key with another id, API or method, or for an answer with the record, is another call.
class Repeats {
public:
    struct Remembered {
        uint64_t nCall = 0; // under which it was asked
        bool blAnswered = false;
        Answer answer; // once it is
    };

    // What is remembered of a call with this key; if nothing is, a new entry for nCall is made, and null is
    // returned.
    const Remembered* find(const std::string& strKey, uint64_t nCall, int64_t nNow);

    // Remembers the answer of a call. An answer that spent nothing because something failed is forgotten: the
    // next may have more luck.
    void answer(const std::string& strKey, const Answer& answer);
    void forget(const std::string& strKey, uint64_t nCall);

private:
    struct Due {
        int64_t nUntil;
        std::string strKey;
        uint64_t nCall;
    };
    void expire(int64_t nNow);

    std::unordered_map<std::string, Remembered> m_entries;
    std::deque<Due> m_due; // in the order in which they become due
    size_t m_cbHeld = 0;   // of memory, about
};

} // namespace gate

#endif
