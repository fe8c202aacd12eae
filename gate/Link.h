// One end of the pair of sockets between the two processes of the gate. It never blocks.

#ifndef GATE_LINK_H
#define GATE_LINK_H

#include <deque>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

namespace gate {

class Link {
public:
    // Takes over a socket of type SOCK_SEQPACKET that does not block.
    explicit Link(int nSocket);
    ~Link();
    Link(const Link&) = delete;
    Link& operator=(const Link&) = delete;

    int descriptor() const { return m_nSocket; }

    // Queues a message for flush().
    void add(std::string strMessage) { m_strWaiting.push_back(std::move(strMessage)); }
    size_t waiting() const { return m_strWaiting.size(); }

    // Sends what the socket takes now; the rest stays queued. Returns false if the other end is closed.
    bool flush();

    // Calls take() with each message that has come, at most AT_ONCE of them. Returns false if the other end
    // is closed, after all that came before was passed on.
    bool receive(const std::function<void(std::string_view)>& take);

private:
    static constexpr size_t AT_ONCE = 64; // messages in one system call

    const int m_nSocket;
    std::deque<std::string> m_strWaiting;
    const std::unique_ptr<char[]> m_rgBuffer;
};

} // namespace gate

#endif
