#include "Connection.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <new>

#include "Head.h"
#include "gate/Clock.h"

namespace gate {

Connection::Connection(struct event_base* pBase, int nSocket, bool blStatusIn,
                       std::function<void(Connection&)> fChanged)
    : blStatus(blStatusIn),
      nSince(now()),
      m_nSocket(nSocket),
      m_fChanged(std::move(fChanged)),
      m_readable(event_new(pBase, nSocket, EV_READ | EV_PERSIST, onReadable, this)),
      m_writable(event_new(pBase, nSocket, EV_WRITE | EV_PERSIST, onWritable, this))
{
    if (!m_readable || !m_writable || 0 != event_add(m_readable.get(), nullptr)) {
        m_blOver = true;
    }
    struct ucred peer = {};
    socklen_t cbPeer = sizeof(peer);
    const bool blKnown = 0 == getsockopt(nSocket, SOL_SOCKET, SO_PEERCRED, &peer, &cbPeer);
    uid = blKnown ? peer.uid : static_cast<uid_t>(-1);
}

Connection::~Connection()
{
    m_readable.reset();
    m_writable.reset();
    close(m_nSocket);
}

void Connection::changeTo(State stateNew)
{
    state = stateNew;
    nSince = now();
}

void Connection::take(size_t cbBytes)
{
    strInput.erase(0, cbBytes);
    cbSeen = 0;
}

void Connection::onReadable(int, short, void* pConnection)
{
    Connection& connection = *static_cast<Connection*>(pConnection);
    connection.receive();
    connection.m_fChanged(connection);
}

void Connection::onWritable(int, short, void* pConnection)
{
    Connection& connection = *static_cast<Connection*>(pConnection);
    connection.flush();
    connection.m_fChanged(connection);
}

void Connection::receive()
{
    char rgBytes[16384];
    const ssize_t cbBytes = recv(m_nSocket, rgBytes, sizeof(rgBytes), MSG_DONTWAIT);
    if (0 > cbBytes && (EAGAIN == errno || EINTR == errno)) {
        return;
    }
    if (0 >= cbBytes) {
        m_blEnded = true;
        event_del(m_readable.get());
        // A client that has only finished sending still wants the answer under way.
        m_blOver = m_blOver || 0 > cbBytes || State::Closing == state || hasGone() || isIdle();
        return;
    }
    if (State::Closing == state) {
        return;
    }
    if (isIdle()) {
        nSince = now(); // a head begins
    }
    strInput.append(rgBytes, static_cast<size_t>(cbBytes));
    if (!isReady() && strInput.size() > HEAD_MAX_BYTES) {
        event_del(m_readable.get()); // until a response was sent
    }
}

bool Connection::hasGone() const
{
    struct pollfd end = {m_nSocket, 0, 0};
    return 1 == poll(&end, 1, 0) && end.revents & (POLLHUP | POLLERR);
}

void Connection::send(const std::string& strResponse)
{
    changeTo(State::Reading);
    m_strOutput.append(strResponse);
    flush();
}

void Connection::flush()
{
    const ssize_t cbSent =
        ::send(m_nSocket, m_strOutput.data(), m_strOutput.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (0 > cbSent && EAGAIN != errno && EINTR != errno) {
        m_blOver = true;
        return;
    }
    m_strOutput.erase(0, cbSent > 0 ? static_cast<size_t>(cbSent) : 0);
    if (!m_strOutput.empty()) {
        event_add(m_writable.get(), nullptr);
        return;
    }
    event_del(m_writable.get());
    if (!m_blEnded) {
        event_add(m_readable.get(), nullptr);
    }
    if (!manner.blKeepAlive) {
        finish();
    }
}

// Ends the sending side, and lets the client finish. To close at once could destroy the response on its way
// to a client that is still sending.
void Connection::finish()
{
    shutdown(m_nSocket, SHUT_WR);
    changeTo(State::Closing);
    strInput.clear();
    m_blOver = m_blOver || m_blEnded;
}

} // namespace gate
