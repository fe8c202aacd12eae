#include "Server.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <new>

#include "gate/Clock.h"

namespace {

// The bounds, which the manual page lists.
const size_t CONNECTIONS_MAX = gate::DESCRIPTORS - 64;
const size_t CONNECTIONS_OF_USER_MAX = 768;
const int64_t HEAD_WAIT = 5 * gate::SECOND;
const int64_t IDLE_WAIT = 75 * gate::SECOND;
const int64_t CLOSE_WAIT = gate::SECOND;
const int64_t SEND_WAIT = 5 * gate::SECOND;
const int64_t CALL_WAIT = gate::SECOND;
const int64_t STOP_WAIT = gate::SECOND / 2; // for a request on an idle connection
const size_t ACCEPTED_AT_ONCE = 64;
const size_t SENT_AT_ONCE = 16; // messages; so calls go on while others are still read
const size_t UNSENT_MAX = 2048; // messages; with more, the other process does not read

template <typename Pointer>
Pointer required(Pointer p)
{
    if (!p) {
        throw std::bad_alloc();
    }
    return p;
}

} // namespace

namespace gate {

Server::Server(int nLink, int nCalls, int nStatus, std::string strOnceHeader)
    : m_pBase(required(event_base_new())),
      m_strOnceHeader(std::move(strOnceHeader)),
      m_link(nLink),
      m_nCalls(nCalls),
      m_nStatus(nStatus),
      m_linkReadable(required(event_new(m_pBase.get(), nLink, EV_READ | EV_PERSIST, onLink, this))),
      m_linkWritable(required(event_new(
          m_pBase.get(), nLink, EV_WRITE, [](int, short, void*) {}, nullptr))),
      m_tick(required(event_new(m_pBase.get(), -1, EV_PERSIST, onTick, this))),
      m_callsListening(listen(nCalls)),
      m_statusListening(0 <= nStatus ? listen(nStatus) : nullptr)
{
    const struct timeval period = {0, 250000};
    event_add(m_linkReadable.get(), nullptr);
    event_add(m_tick.get(), &period);
}

Event Server::listen(int nSocket)
{
    Event listening(required(event_new(m_pBase.get(), nSocket, EV_READ | EV_PERSIST, onConnection, this)));
    event_add(listening.get(), nullptr);
    return listening;
}

void Server::run()
{
    tick();
    while (!m_blAlone && !(m_nStopping && m_connections.empty())) {
        if (!m_link.flush()) {
            return;
        }
        if (m_link.waiting()) {
            event_add(m_linkWritable.get(), nullptr);
        }
        event_base_loop(m_pBase.get(), EVLOOP_ONCE);
        sweep();
    }
}

void Server::onConnection(int nSocket, short, void* pServer)
{
    static_cast<Server*>(pServer)->accept(nSocket);
}

void Server::onLink(int, short, void* pServer)
{
    Server& server = *static_cast<Server*>(pServer);
    if (!server.m_link.receive([&server](std::string_view strMessage) { server.take(strMessage); })) {
        server.m_blAlone = true;
    }
}

void Server::onTick(int, short, void* pServer)
{
    static_cast<Server*>(pServer)->tick();
}

void Server::accept(int nSocket)
{
    for (size_t i = 0; i < ACCEPTED_AT_ONCE; ++i) {
        const int nConnection = accept4(nSocket, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
        if (0 > nConnection) {
            return;
        }
        m_connections.emplace_back(m_pBase.get(), nConnection, nSocket == m_nStatus,
                                   [this](Connection& connection) { changed(connection); });
        if (!makeRoomFor(m_connections.back())) {
            m_connections.pop_back();
            m_metrics.countTurnedAway();
        }
    }
}

// If there are too many connections now, closes one: one of the same user, if that user has too many. Returns
// false if there is none to close.
bool Server::makeRoomFor(const Connection& connection)
{
    size_t nOfUser = 0;
    for (const Connection& other : m_connections) {
        nOfUser += other.uid == connection.uid;
    }
    const bool blUser = nOfUser > CONNECTIONS_OF_USER_MAX;
    return (!blUser && m_connections.size() <= CONNECTIONS_MAX) || closeOldest(connection, blUser);
}

// Closes the connection that has waited longest for its client. Returns false if all wait for the gate.
bool Server::closeOldest(const Connection& newest, bool blOfUser)
{
    const Connection* pOldest = nullptr;
    for (const Connection& connection : m_connections) {
        const bool blCandidate = &connection != &newest && Connection::State::Waiting != connection.state &&
                                 (!blOfUser || connection.uid == newest.uid);
        if (blCandidate && (!pOldest || connection.nSince < pOldest->nSince)) {
            pOldest = &connection;
        }
    }
    if (!pOldest) {
        return false;
    }
    m_metrics.countTurnedAway();
    m_connections.remove_if([pOldest](const Connection& connection) { return &connection == pOldest; });
    return true;
}

void Server::changed(Connection& connection)
{
    if (connection.isReady()) {
        readNext(connection);
    }
    if (connection.hasEnded() && connection.isIdle()) {
        connection.end(); // all requests were answered
    }
    m_blOver = m_blOver || connection.isOver();
}

// Destroys the connections that are over. Must not be called from their events.
void Server::sweep()
{
    if (!m_blOver) {
        return;
    }
    m_blOver = false;
    m_connections.remove_if([this](Connection& connection) {
        if (connection.isOver()) {
            forget(connection);
        }
        return connection.isOver();
    });
}

// Removes a connection that ends from those that wait for an answer. Cancels its call if none is left.
void Server::forget(Connection& connection)
{
    const auto it = m_asked.find(connection.nCall);
    if (Connection::State::Waiting != connection.state || it == m_asked.end()) {
        return;
    }
    std::vector<Connection*>& waiting = it->second.waiting;
    waiting.erase(std::remove(waiting.begin(), waiting.end(), &connection), waiting.end());
    if (!waiting.empty()) {
        return;
    }
    Request cancel;
    cancel.ask = Ask::Cancel;
    cancel.nNumber = it->first;
    m_link.add(encode(cancel));
    if (it->second.strKey.empty()) {
        m_asked.erase(it);
    } // else it may be repeated before the answer says whether a use was spent
}

void Server::readNext(Connection& connection)
{
    while (connection.isReady() && !connection.strInput.empty()) {
        Head head;
        size_t cbHead = 0;
        const Reading reading = readHead(connection.strInput, connection.cbSeen, head, cbHead);
        if (Reading::Incomplete == reading && !connection.hasEnded()) {
            return;
        }
        connection.manner = {head.blKeepAlive && !m_nStopping, "HEAD" == head.strMethod, head.blOld};
        connection.nSince = now();
        switch (reading) {
        case Reading::TargetTooLong: connection.manner = {}; return respond(connection, 414);
        case Reading::HeadTooLarge: connection.manner = {}; return respond(connection, 431);
        case Reading::Incomplete:
        case Reading::BadRequest: connection.manner = {}; return respond(connection, 400);
        case Reading::Whole: break;
        }
        if (connection.blStatus) {
            readStatus(connection, head);
            connection.take(cbHead);
            continue;
        }
        Call call;
        const int nStatus = readCall(head, m_strOnceHeader, call);
        connection.take(cbHead);
        if (nStatus) {
            respond(connection, nStatus);
        } else {
            askCall(connection, call);
        }
    }
}

void Server::readStatus(Connection& connection, const Head& head)
{
    if ("GET" != head.strMethod && "HEAD" != head.strMethod) {
        return respond(connection, 405);
    }
    if ("/metrics" == head.strTarget) {
        return respond(connection, 200,
                       textResponse(200, "text/plain; version=0.0.4",
                                    m_metrics.text(m_figures, m_connections.size()), connection.manner));
    }
    if ("/health" != head.strTarget) {
        return respond(connection, 404);
    }
    Request request;
    request.ask = Ask::Health;
    Asked asked;
    asked.blHealth = true;
    ask(std::move(request), connection, std::move(asked));
}

void Server::askCall(Connection& connection, const Call& call)
{
    Asked asked;
    asked.call = call;
    if (!call.strOnce.empty()) {
        for (const std::string* pText : {&call.strOnce, &call.strTid, &call.strApi, &call.strMethod}) {
            asked.strKey.append(*pText).append(1, '\0');
        }
        asked.strKey.append(call.blRecord ? "record" : "");
        if (const Repeats::Remembered* pRemembered = m_repeats.find(asked.strKey, m_nNumber + 1, now())) {
            m_metrics.countRepeated();
            if (pRemembered->blAnswered) {
                return respond(connection, pRemembered->answer);
            }
            connection.nCall = pRemembered->nCall;
            connection.changeTo(Connection::State::Waiting);
            m_asked[pRemembered->nCall].waiting.push_back(&connection);
            return;
        }
    }
    Request request;
    request.ask = Ask::Grant;
    request.nDue = connection.nSince + CALL_WAIT;
    request.blRecord = call.blRecord;
    request.strTid = call.strTid;
    request.strApi = call.strApi;
    request.strMethod = call.strMethod;
    ask(std::move(request), connection, std::move(asked));
}

void Server::ask(Request request, Connection& connection, Asked asked)
{
    request.nNumber = ++m_nNumber;
    if (m_link.waiting() >= UNSENT_MAX) {
        m_repeats.forget(asked.strKey, request.nNumber);
        return respond(connection, 503);
    }
    connection.nCall = request.nNumber;
    connection.changeTo(Connection::State::Waiting);
    asked.waiting.push_back(&connection);
    m_asked[request.nNumber] = std::move(asked);
    m_link.add(encode(request));
    if (m_link.waiting() >= SENT_AT_ONCE) {
        m_blAlone = m_blAlone || !m_link.flush();
    }
}

void Server::respond(Connection& connection, int nStatus, const std::string& strResponse)
{
    m_metrics.count(nStatus, now() - connection.nSince);
    connection.send(strResponse);
}

void Server::respond(Connection& connection, int nStatus)
{
    respond(connection, nStatus, plainResponse(nStatus, connection.manner));
}

void Server::respond(Connection& connection, const Reply& answer)
{
    switch (answer.outcome) {
    case Outcome::Granted: return respond(connection, 200, grantedResponse(answer, connection.manner));
    case Outcome::Refused: return respond(connection, 403);
    default: return respond(connection, 503);
    }
}

void Server::take(std::string_view strMessage)
{
    const std::optional<Reply> answer = decodeReply(strMessage);
    if (!answer) {
        m_blAlone = true;
        return;
    }
    if (Outcome::Stop == answer->outcome) {
        return stop();
    }
    if (m_nFigures == answer->nNumber) {
        m_figures = answer->figures;
        return;
    }
    const auto it = m_asked.find(answer->nNumber);
    if (it == m_asked.end()) {
        return;
    }
    const Asked asked = std::move(it->second);
    m_asked.erase(it);
    m_repeats.answer(asked.strKey, *answer);
    for (Connection* pConnection : asked.waiting) {
        if (Outcome::Cancelled == answer->outcome) {
            askCall(*pConnection, asked.call); // the call was repeated after the cancellation
        } else if (asked.blHealth) {
            const int nStatus = answer->blHealthy ? 200 : 503;
            const char* szBody = answer->blHealthy ? "healthy\n" : "the token database cannot be read\n";
            respond(*pConnection, nStatus, textResponse(nStatus, "text/plain", szBody, pConnection->manner));
        } else {
            respond(*pConnection, *answer);
        }
        changed(*pConnection); // the next request may have come already
    }
}

// Ends connections that take too long, and asks for figures.
void Server::tick()
{
    const int64_t nNow = now();
    for (Connection& connection : m_connections) {
        const int64_t nTook = nNow - connection.nSince;
        const bool blHurry = m_nStopping && nNow - m_nStopping > STOP_WAIT;
        int64_t nWait = HEAD_WAIT;
        switch (connection.state) {
        case Connection::State::Waiting: // at most a second, unless the other process is stuck
            nWait = connection.hasGone() ? 0 : INT64_MAX;
            break;
        case Connection::State::Closing: nWait = CLOSE_WAIT; break;
        case Connection::State::Reading:
            nWait = connection.isIdle() ? (blHurry ? 0 : IDLE_WAIT)
                                        : (connection.isReady() ? HEAD_WAIT : SEND_WAIT);
            break;
        }
        if (nTook > nWait) {
            connection.end();
            m_blOver = true;
        }
    }
    if (nNow >= m_nTickAt) {
        m_nTickAt = nNow + SECOND;
        Request request;
        request.ask = Ask::Figures;
        request.nNumber = m_nFigures = ++m_nNumber;
        m_link.add(encode(request));
    }
}

// Stops: serves all who have connected. Others wait at the sockets for the next process that listens.
void Server::stop()
{
    m_nStopping = now();
    for (size_t nAccepted = 0; nAccepted < CONNECTIONS_MAX; nAccepted += ACCEPTED_AT_ONCE) { // bounded
        accept(m_nCalls);
    }
    m_callsListening.reset();
    m_statusListening.reset();
    close(m_nCalls);
    if (0 <= m_nStatus) {
        close(m_nStatus);
    }
    for (Connection& connection : m_connections) {
        connection.manner.blKeepAlive = false;
    }
}

} // namespace gate
