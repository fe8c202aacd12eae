// The process that holds the tokens: it answers what the other process asks, batch by batch.

#ifndef GATE_SERVICE_H
#define GATE_SERVICE_H

#include <deque>
#include <vector>

#include "Link.h"
#include "Messages.h"
#include "Owners.h"
#include "Store.h"
#include "Turn.h"

namespace gate {

// An object is never destroyed, because its threads may be stuck at the lock or in a user database.
class Service {
public:
    // link leads to the other process. nSignals is a signalfd: it is readable when the service is to stop.
    Service(Link& link, int nSignals);

    // Serves until the other process ends. A signal makes it ask for that end. Returns whether it has asked.
    bool run();

private:
    int timeout() const;
    bool receive();
    void take(std::string_view strMessage);
    void cancel(uint64_t nNumber);
    void tellFigures(uint64_t nNumber);
    void look();
    void expire();
    void serve();
    void serveBatch();
    void answer(const Request& request, Outcome outcome);
    void failAll(const std::string& strReason);
    void wait(int64_t nNow);
    void endWait();
    void notifyManager();

    Link& m_link;
    const int m_nSignals;
    Store m_store;
    Turn m_turn;
    Owners m_owners{lookUpOwner};
    std::deque<Request> m_calls;   // wait for a decision
    std::vector<Request> m_parked; // wait for the names of their owners
    std::vector<Request> m_batch;  // are in the current transaction
    std::vector<Request> m_looks;  // ask for the health of the store
    Figures m_figures = {};
    int64_t m_nWaitingSince = 0; // when waiting for other programs' locks began; 0: not waiting
    int64_t m_nTryAt = 0;
    int64_t m_nHeard = 0; // when the other process last asked for figures
    int64_t m_nNotifyAt = 0;
    bool m_blReady = false;
    bool m_blStopping = false;
};

} // namespace gate

#endif
