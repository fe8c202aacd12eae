// Repeated calls: a proxy can ask several times for one request of a client, which must spend one use only.

#ifndef GATE_HTTP_REPEATS_H
#define GATE_HTTP_REPEATS_H

#include <cstdint>
#include <deque>
#include <string>
#include <unordered_map>

#include "gate/Messages.h"

namespace gate {

// Remembers each call that has a key, for some seconds. The key must differ if the id, the API, the method or
// the wish for the record differs.
class Repeats {
public:
    struct Remembered {
        uint64_t nCall = 0; // the number of the call
        bool blAnswered = false;
        Reply answer; // once blAnswered
    };

    // Returns what is remembered of the call with this key. If that is nothing, returns null, and remembers
    // the call as nCall.
    const Remembered* find(const std::string& strKey, uint64_t nCall, int64_t nNow);

    // Remembers the answer of a call. If something failed, forgets the call: the next try is a new one.
    void answer(const std::string& strKey, const Reply& answer);
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
    size_t m_cbHeld = 0;   // bytes of memory, roughly
};

} // namespace gate

#endif
