#include "Service.h"

#include <poll.h>
#include <sys/signalfd.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <new>
#include <system_error>

#include "Batch.h"
#include "Clock.h"
#include "Log.h"
#include "Notice.h"

namespace {

const size_t BATCH_MAX = 256;
const size_t CALLS_MAX = 4096;              // while so many wait, run() takes no more from the socket
const size_t ANSWERS_MAX = 4096;            // the same for answers that were not sent yet
const int64_t CALL_WAIT_MAX = gate::SECOND; // whatever the request says
const int64_t TRY_AGAIN_AFTER = gate::MILLISECOND;
const int64_t COMMIT_WAIT = gate::SECOND / 2; // how long a commit waits for readers
const int64_t LOOK_WAIT = gate::SECOND / 2;   // how long a look at the store waits for writers

gate::Figure sizeFigure(size_t nCalls)
{
    size_t nFigure = gate::BATCH_LE_1;
    for (size_t nLimit = 1; nLimit < nCalls && nFigure < gate::BATCH_LE_256; nLimit *= 4) {
        ++nFigure;
    }
    return static_cast<gate::Figure>(nFigure);
}

// Calls fTry() until it returns true. Returns false if that takes longer than nWait.
bool isDoneWithin(int64_t nWait, const std::function<bool()>& fTry)
{
    for (const int64_t nEnd = gate::now() + nWait; !fTry();) {
        if (gate::now() >= nEnd) {
            return false;
        }
        usleep(1000);
    }
    return true;
}

} // namespace

namespace gate {

Service::Service(Link& link, int nSignals) : m_link(link), m_nSignals(nSignals) {}

bool Service::run()
{
    for (;;) {
        const bool blTakes =
            m_calls.size() + m_parked.size() + m_looks.size() < CALLS_MAX && m_link.waiting() < ANSWERS_MAX;
        struct pollfd rgEvent[] = {
            {m_link.descriptor(),
             static_cast<short>((blTakes ? POLLIN : 0) | (m_link.waiting() ? POLLOUT : 0)), 0},
            {m_owners.descriptor(), POLLIN, 0},
            {m_turn.descriptor(), POLLIN, 0},
            {m_nSignals, POLLIN, 0},
        };
        poll(rgEvent, std::size(rgEvent), timeout());
        if (rgEvent[1].revents) {
            m_owners.clear();
            m_calls.insert(m_calls.begin(), m_parked.begin(), m_parked.end());
            m_parked.clear();
        }
        if (rgEvent[2].revents) {
            m_nTryAt = 0;
        }
        if (rgEvent[3].revents) {
            struct signalfd_siginfo signal;
            if (sizeof(signal) == read(m_nSignals, &signal, sizeof(signal)) && !m_blStopping) {
                m_blStopping = true;
                notify("STOPPING=1");
                Reply stop;
                stop.outcome = Outcome::Stop;
                m_link.add(encode(stop));
            }
        }
        if (blTakes && rgEvent[0].revents & (POLLIN | POLLHUP) && !receive()) {
            return m_blStopping;
        }
        expire();
        serve();
        look();
        if (!m_link.flush()) {
            return m_blStopping;
        }
        notifyManager();
    }
}

// How long run() may wait for an event, in ms: 0 if there is work to do.
int Service::timeout() const
{
    if (!m_calls.empty() && !m_nTryAt) {
        return 0;
    }
    if (!m_calls.empty() || !m_looks.empty()) {
        return 1;
    }
    return m_parked.empty() ? 1000 : 10;
}

bool Service::receive()
{
    return m_link.receive([this](std::string_view strMessage) { take(strMessage); });
}

void Service::take(std::string_view strMessage)
{
    std::optional<Request> request = decodeRequest(strMessage);
    if (!request) {
        log(LOG_ERR, "the process that reads HTTP sent a malformed message");
        _exit(EXIT_FAILURE); // an attacker has taken that process over
    }
    switch (request->ask) {
    case Ask::Grant:
        request->nDue = std::min(request->nDue, now() + CALL_WAIT_MAX);
        m_calls.push_back(std::move(*request));
        return;
    case Ask::Cancel: cancel(request->nNumber); return;
    case Ask::Health: // done later, outside a transaction
        request->nDue = now() + LOOK_WAIT;
        m_looks.push_back(std::move(*request));
        return;
    case Ask::Figures: tellFigures(request->nNumber); return;
    }
}

void Service::tellFigures(uint64_t nNumber)
{
    m_nHeard = now();
    Reply told;
    told.nNumber = nNumber;
    told.outcome = Outcome::Told;
    told.figures = m_figures;
    told.figures[STORE_BYTES] = Store::size();
    m_link.add(encode(told));
}

void Service::cancel(uint64_t nNumber)
{
    const auto isIt = [nNumber](const Request& request) { return nNumber == request.nNumber; };
    const auto itCall = std::find_if(m_calls.begin(), m_calls.end(), isIt);
    const auto itParked = std::find_if(m_parked.begin(), m_parked.end(), isIt);
    if (itCall != m_calls.end()) {
        answer(*itCall, Outcome::Cancelled);
        m_calls.erase(itCall);
    } else if (itParked != m_parked.end()) {
        answer(*itParked, Outcome::Cancelled);
        m_parked.erase(itParked);
    } else {
        return; // the call was answered already
    }
    ++m_figures[CANCELLED];
}

// Looks at the store once for all who have asked. They wait while other programs hold the database.
void Service::look()
{
    if (m_looks.empty()) {
        return;
    }
    bool blHealthy = false;
    bool blFailed = false;
    try {
        blHealthy = m_store.canRead();
    } catch (const std::runtime_error& error) {
        log(LOG_ERR, std::string("store: ") + error.what());
        m_store.close();
        blFailed = true;
    }
    const int64_t nNow = now();
    const auto isTold = [&](const Request& request) {
        if (!blHealthy && !blFailed && nNow < request.nDue) {
            return false;
        }
        Reply told;
        told.nNumber = request.nNumber;
        told.outcome = Outcome::Told;
        told.blHealthy = blHealthy;
        m_link.add(encode(told));
        return true;
    };
    m_looks.erase(std::remove_if(m_looks.begin(), m_looks.end(), isTold), m_looks.end());
}

void Service::answer(const Request& request, Outcome outcome)
{
    Reply answer;
    answer.nNumber = request.nNumber;
    answer.outcome = outcome;
    m_link.add(encode(answer));
}

void Service::expire()
{
    const int64_t nNow = now();
    const auto isLate = [this, nNow](const Request& request) {
        if (nNow < request.nDue) {
            return false;
        }
        answer(request, Outcome::Late);
        ++m_figures[LATE];
        return true;
    };
    m_calls.erase(std::remove_if(m_calls.begin(), m_calls.end(), isLate), m_calls.end());
    m_parked.erase(std::remove_if(m_parked.begin(), m_parked.end(), isLate), m_parked.end());
    if (m_calls.empty()) {
        endWait();
    }
}

// Notes that other programs hold the lock or the database, and when to try again.
void Service::wait(int64_t nNow)
{
    m_nWaitingSince = m_nWaitingSince ? m_nWaitingSince : nNow;
    m_nTryAt = nNow + TRY_AGAIN_AFTER;
}

// Ends the wait: other programs hold neither any more, or no call is left that waits.
void Service::endWait()
{
    m_figures[WAIT_NS] += m_nWaitingSince ? static_cast<uint64_t>(now() - m_nWaitingSince) : 0;
    m_nWaitingSince = m_nTryAt = 0;
}

void Service::serve()
{
    const int64_t nNow = now();
    if (m_calls.empty()) {
        m_turn.give(); // the lock may have come after the last call had gone
        return;
    }
    if (nNow < m_nTryAt) {
        return;
    }
    try {
        if (!m_turn.take()) {
            wait(nNow);
            return;
        }
    } catch (const std::system_error& error) {
        failAll(std::string("lock: ") + error.what());
        return;
    }
    try {
        if (m_store.begin()) {
            endWait();
            serveBatch();
        } else {
            wait(nNow);
        }
    } catch (const std::exception& error) {
        m_store.rollBack();
        m_store.close();
        m_calls.insert(m_calls.end(), m_batch.begin(), m_batch.end());
        failAll(std::string("store: ") + error.what());
    }
    m_turn.give();
}

// Answers all calls that wait with a failure. Nothing is spent.
void Service::failAll(const std::string& strReason)
{
    log(LOG_ERR, strReason);
    for (const Request& request : m_calls) {
        answer(request, Outcome::Failed);
    }
    m_figures[FAILED] += m_calls.size();
    ++m_figures[BATCHES_FAILED];
    m_calls.clear();
    m_batch.clear();
    endWait();
}

// Serves a batch of calls within a transaction, and commits it.
void Service::serveBatch()
{
    // Calls that have come meanwhile join, and calls that are too late or cancelled leave.
    receive();
    expire();
    const size_t nCalls = std::min(BATCH_MAX, m_calls.size());
    m_batch.assign(std::make_move_iterator(m_calls.begin()),
                   std::make_move_iterator(m_calls.begin() + static_cast<ptrdiff_t>(nCalls)));
    m_calls.erase(m_calls.begin(), m_calls.begin() + static_cast<ptrdiff_t>(nCalls));

    const uint64_t nPurged = m_store.purge();
    const std::function<Owners::Owner(uid_t)> fOwner = [this](uid_t uid) { return m_owners.find(uid); };
    Batch batch(m_store.tokens(), fOwner);
    std::vector<std::string> strAnswers;
    std::vector<Request> parked;
    for (const Request& request : m_batch) {
        if (const std::optional<Reply> answer = batch.call(request)) {
            strAnswers.push_back(encode(*answer));
        } else {
            parked.push_back(request);
        }
    }
    batch.save();
    const int64_t nStart = now();
    if (!isDoneWithin(COMMIT_WAIT, [this] { return m_store.commit(); })) {
        throw std::runtime_error("others keep it from being committed");
    }
    m_figures[COMMIT_NS] += static_cast<uint64_t>(now() - nStart);
    m_batch.clear();
    for (std::string& strAnswer : strAnswers) {
        m_link.add(std::move(strAnswer));
    }
    m_parked.insert(m_parked.end(), parked.begin(), parked.end());
    for (size_t nFigure = 0; nFigure < FIGURES; ++nFigure) {
        m_figures[nFigure] += batch.figures()[nFigure];
    }
    m_figures[PURGED] += nPurged;
    ++m_figures[BATCHES];
    ++m_figures[sizeFigure(nCalls)];
}

// Tells the service manager that the gate is ready, and that both processes are alive: the other process asks
// for figures each second.
void Service::notifyManager()
{
    static const int64_t nPeriod = watchdogPeriod();
    const int64_t nNow = now();
    if (!m_blReady && m_nHeard) {
        m_blReady = true;
        notify("READY=1");
    }
    if (nPeriod && nNow >= m_nNotifyAt && nNow - m_nHeard < nPeriod) {
        m_nNotifyAt = nNow + nPeriod / 4;
        notify("WATCHDOG=1");
    }
}

} // namespace gate
