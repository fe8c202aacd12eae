#include "Load.h"

#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

#include "Samples.h"

namespace {

typedef std::chrono::steady_clock Clock;

struct Client {
    int nSocket = -1;
    size_t nNext = 0; // the request
    std::string strReply;
    Clock::time_point sent;
};

[[noreturn]] void fail(const char* szWhat)
{
    throw std::runtime_error(std::string(szWhat) + ": " + strerror(errno));
}

void sendNext(Client& client, const Load& load)
{
    const std::string& strRequest = load.strRequests[client.nNext];
    client.nNext = (client.nNext + load.nClients) % load.strRequests.size();
    client.sent = Clock::now();
    if (static_cast<ssize_t>(strRequest.size()) !=
        send(client.nSocket, strRequest.data(), strRequest.size(), MSG_NOSIGNAL)) {
        fail("send");
    }
}

std::vector<Client> connectAll(const Load& load, int nEpoll)
{
    std::vector<Client> clients(load.nClients);
    for (size_t i = 0; i < clients.size(); ++i) {
        clients[i].nSocket = connectTo(load.strPath);
        clients[i].nNext = i % load.strRequests.size();
        struct epoll_event event = {};
        event.events = EPOLLIN;
        event.data.ptr = &clients[i];
        epoll_ctl(nEpoll, EPOLL_CTL_ADD, clients[i].nSocket, &event);
    }
    return clients;
}

// Receives bytes. Returns the reply once it is complete.
Reply takeReply(Client& client, const Load& load)
{
    char rgBytes[16384];
    const ssize_t cbBytes = recv(client.nSocket, rgBytes, sizeof(rgBytes), 0);
    if (0 >= cbBytes) {
        fail("recv");
    }
    client.strReply.append(rgBytes, static_cast<size_t>(cbBytes));
    const Reply reply = load.readReply(client.strReply);
    client.strReply.erase(0, reply.cbReply);
    return reply;
}

double seconds(Clock::duration duration)
{
    return std::chrono::duration<double>(duration).count();
}

} // namespace

int connectTo(const std::string& strPath)
{
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    strncpy(address.sun_path, strPath.c_str(), sizeof(address.sun_path) - 1);
    const int nSocket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (0 != connect(nSocket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address))) {
        close(nSocket);
        fail(strPath.c_str());
    }
    return nSocket;
}

Reply readHttpReply(std::string_view strBytes)
{
    const size_t nEnd = strBytes.find("\r\n\r\n");
    if (std::string_view::npos == nEnd) {
        return {};
    }
    const size_t nLength = strBytes.substr(0, nEnd).find("Content-Length: ");
    const size_t cbBody =
        std::string_view::npos == nLength ? 0 : strtoul(&strBytes[nLength + 16], nullptr, 10);
    if (strBytes.size() < nEnd + 4 + cbBody) {
        return {};
    }
    return {nEnd + 4 + cbBody, strBytes.substr(9, 3) == "200"};
}

Reply readRedisReply(std::string_view strBytes)
{
    size_t nPlace = 0;
    bool blArray = false;
    for (long nLeft = 1; nLeft > 0; --nLeft) {
        const size_t nEnd = strBytes.find("\r\n", nPlace);
        if (std::string_view::npos == nEnd) {
            return {};
        }
        const char cKind = strBytes[nPlace];
        const long nSize = strtol(&strBytes[nPlace + 1], nullptr, 10);
        nPlace = nEnd + 2;
        if ('-' == cKind) {
            throw std::runtime_error(std::string(strBytes));
        }
        if ('*' == cKind && nSize >= 0) {
            blArray = true;
            nLeft += nSize;
        } else if ('$' == cKind && nSize >= 0) {
            nPlace += static_cast<size_t>(nSize) + 2;
        }
    }
    return nPlace > strBytes.size() ? Reply{} : Reply{nPlace, blArray};
}

Loaded run(const Load& load)
{
    const int nEpoll = epoll_create1(EPOLL_CLOEXEC);
    std::vector<Client> clients = connectAll(load, nEpoll);
    Loaded loaded;
    Samples took;
    const Clock::time_point start = Clock::now();
    for (Client& client : clients) {
        sendNext(client, load);
    }
    for (size_t nWaiting = clients.size(); nWaiting;) {
        struct epoll_event rgEvent[64];
        const int nEvents = epoll_wait(nEpoll, rgEvent, 64, -1);
        for (int i = 0; i < nEvents; ++i) {
            Client& client = *static_cast<Client*>(rgEvent[i].data.ptr);
            const Reply reply = takeReply(client, load);
            if (!reply.cbReply) {
                continue;
            }
            const Clock::time_point now = Clock::now();
            took.add(seconds(now - client.sent));
            ++loaded.nReplies;
            loaded.nGranted += reply.blGranted;
            if (seconds(now - start) < load.dSeconds) {
                sendNext(client, load);
            } else {
                --nWaiting;
            }
        }
    }
    loaded.dSeconds = seconds(Clock::now() - start);
    for (const Client& client : clients) {
        close(client.nSocket);
    }
    close(nEpoll);
    loaded.dMedian = took.percentile(50);
    loaded.d99th = took.percentile(99);
    return loaded;
}
