// The process that holds the tokens: takes what the other one asks, batch by batch.

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

// An object is never destroyed: its threads may stand still in the locks and the user database of others.
class Service {
public:
    // link: to the other process. nSignals: a signalfd, which is readable when the service is to stop.
    Service(Link& link, int nSignals);

    // Serves until the other process ends. It is asked to when a signal comes. Returns whether it was.
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
    std::deque<Request> m_calls;   // to be decided
    std::vector<Request> m_parked; // until their owners' names are known
    std::vector<Request> m_batch;  // of the transaction at hand
    std::vector<Request> m_looks;  // at the store, for those who ask for its health
    Figures m_figures = {};
    int64_t m_nWaitingSince = 0; // for the locks of others; 0: not waiting
    int64_t m_nTryAt = 0;
    int64_t m_nHeard = 0; // when the other process asked for figures
    int64_t m_nNotifyAt = 0;
    bool m_blReady = false;
    bool m_blStopping = false;
};

} // namespace gate

#endif
