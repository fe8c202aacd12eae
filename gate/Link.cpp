#include "Link.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "Messages.h"

namespace gate {

const size_t MESSAGE_MAX = std::max(REQUEST_MAX, ANSWER_MAX);

// The buffer takes memory only for pages that messages have filled.
Link::Link(int nSocket) : m_nSocket(nSocket), m_rgBuffer(new char[AT_ONCE * MESSAGE_MAX]) {}

Link::~Link()
{
    close(m_nSocket);
}

bool Link::flush()
{
    while (!m_strWaiting.empty()) {
        struct mmsghdr rgMessage[AT_ONCE] = {};
        struct iovec rgText[AT_ONCE];
        const unsigned int nMessages = static_cast<unsigned int>(std::min(AT_ONCE, m_strWaiting.size()));
        for (unsigned int i = 0; i < nMessages; ++i) {
            rgText[i] = {m_strWaiting[i].data(), m_strWaiting[i].size()};
            rgMessage[i].msg_hdr.msg_iov = &rgText[i];
            rgMessage[i].msg_hdr.msg_iovlen = 1;
        }
        const int nSent = sendmmsg(m_nSocket, rgMessage, nMessages, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (0 > nSent) {
            return EAGAIN == errno || EINTR == errno || ENOBUFS == errno;
        }
        m_strWaiting.erase(m_strWaiting.begin(), m_strWaiting.begin() + nSent);
    }
    return true;
}

bool Link::receive(const std::function<void(std::string_view)>& take)
{
    struct mmsghdr rgMessage[AT_ONCE] = {};
    struct iovec rgText[AT_ONCE];
    for (size_t i = 0; i < AT_ONCE; ++i) {
        rgText[i] = {&m_rgBuffer[i * MESSAGE_MAX], MESSAGE_MAX};
        rgMessage[i].msg_hdr.msg_iov = &rgText[i];
        rgMessage[i].msg_hdr.msg_iovlen = 1;
    }
    const int nReceived = recvmmsg(m_nSocket, rgMessage, AT_ONCE, MSG_DONTWAIT, nullptr);
    if (0 > nReceived) {
        return EAGAIN == errno || EINTR == errno;
    }
    for (int i = 0; i < nReceived; ++i) {
        if (0 == rgMessage[i].msg_len) {
            return false; // the end: no message is empty
        }
        take({&m_rgBuffer[static_cast<size_t>(i) * MESSAGE_MAX], rgMessage[i].msg_len});
    }
    return true;
}

} // namespace gate
