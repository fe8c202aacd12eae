// The names of users, as answers carry them.

#ifndef GATE_OWNERS_H
#define GATE_OWNERS_H

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <unordered_map>

namespace gate {

// Keeps names for some seconds, because a user database can be slow, and looks them up in a thread of its
// own, because it can stall.
class Owners {
public:
    enum class State {
        Asked,   // not known yet: the descriptor becomes readable when it is
        Known,   // strName
        Nobody,  // there is no such user
        Failing, // the user database cannot tell
    };
    struct Owner {
        State state = State::Asked;
        std::string strName;
        int64_t nFreshUntil = 0; // when to look again
        int64_t nUntil = 0;      // when to believe it no more
        bool blAsked = false;    // it is being looked up
    };

    // fLookUp tells the state and the name; it runs in the thread.
    explicit Owners(std::function<Owner(uid_t)> fLookUp);

    // What is known of a user now.
    Owner find(uid_t uid);

    // Readable when a name that was asked for is there; clear() before looking.
    int descriptor() const { return m_nEvent; }
    void clear();

private:
    void run();

    const std::function<Owner(uid_t)> m_fLookUp;
    const int m_nEvent;
    std::mutex m_mutex;
    std::condition_variable m_asked;
    std::deque<uid_t> m_queue;
    std::unordered_map<uid_t, Owner> m_owners;
};

// The user database of this machine.
Owners::Owner lookUpOwner(uid_t uid);

} // namespace gate

#endif
