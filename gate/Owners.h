// The names of the users that own tokens, for answers.

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

// Keeps names for some seconds, because a user database can be slow. Looks them up in a thread, because a
// user database can hang.
class Owners {
public:
    enum class State {
        Asked,   // not known yet; the descriptor becomes readable when it is
        Known,   // strName
        Nobody,  // there is no such user, or the name is too long
        Failing, // the user database failed
    };
    struct Owner {
        State state = State::Asked;
        std::string strName;
        int64_t nFreshUntil = 0; // when to look again
        int64_t nUntil = 0;      // when to stop using it
        bool blAsked = false;    // it is being looked up
    };

    // fLookUp returns the state and the name. The thread calls it.
    explicit Owners(std::function<Owner(uid_t)> fLookUp);

    // Returns what is known of a user now, and starts a look-up if needed.
    Owner find(uid_t uid);

    // Readable after a look-up has ended. Call clear() before find().
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

// Looks up a user in the user database of this machine.
Owners::Owner lookUpOwner(uid_t uid);

} // namespace gate

#endif
