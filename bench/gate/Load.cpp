#include "Load.h"

#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <stdexcept>

namespace {

typedef std::chrono::steady_clock Clock;

struct Client {
    int nSocket = -1;
    size_t nNext = 0; // the number of the next request
    std::string strReply;
    Clock::time_point sent;
};

[[noreturn]] void fail(const std::string& strWhat)
{
    throw std::runtime_error(strWhat + ": " + strerror(errno));
}

int connectTo(const std::string& strPath)
{
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    strncpy(address.sun_path, strPath.c_str(), sizeof(address.sun_path) - 1);
    const int nSocket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    for (int i = 0; i < 500; ++i, usleep(10000)) {
        if (0 == connect(nSocket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address))) {
            return nSocket;
        }
    }
    fail(strPath);
}

void sendNext(Client& client, const Load& load, size_t nClients)
{
    const std::string& strRequest = load.strRequests[client.nNext];
    client.nNext = (client.nNext + nClients) % load.strRequests.size();
    client.strReply.clear();
    client.sent = Clock::now();
    if (static_cast<ssize_t>(strRequest.size()) !=
        send(client.nSocket, strRequest.data(), strRequest.size(), MSG_NOSIGNAL)) {
        fail("send");
    }
}

// Receives bytes. Returns whether the reply is complete.
bool receive(Client& client, const Load& load)
{
    char rgBytes[16384];
    const ssize_t cbBytes = recv(client.nSocket, rgBytes, sizeof(rgBytes), 0);
    if (0 >= cbBytes) {
        fail("recv");
    }
    std::string& strReply = client.strReply.append(rgBytes, static_cast<size_t>(cbBytes));
    if (0 != strReply.compare(0, load.strBegin.size(), load.strBegin)) {
        throw std::runtime_error("not granted: " + strReply);
    }
    const size_t cbEnd = load.strEnd.size();
    return strReply.size() >= cbEnd && 0 == strReply.compare(strReply.size() - cbEnd, cbEnd, load.strEnd);
}

double secondsSince(Clock::time_point start)
{
    return std::chrono::duration<double>(Clock::now() - start).count();
}

} // namespace

Loaded run(const Load& load, size_t nClients, double dSeconds)
{
    const int nEpoll = epoll_create1(EPOLL_CLOEXEC);
    std::vector<Client> clients(nClients);
    for (size_t i = 0; i < nClients; ++i) {
        clients[i].nSocket = connectTo(load.strPath);
        clients[i].nNext = i % load.strRequests.size();
        struct epoll_event event = {};
        event.events = EPOLLIN;
        event.data.ptr = &clients[i];
        epoll_ctl(nEpoll, EPOLL_CTL_ADD, clients[i].nSocket, &event);
    }
    Loaded loaded;
    const Clock::time_point start = Clock::now();
    for (Client& client : clients) {
        sendNext(client, load, nClients);
    }
    for (size_t nWaiting = nClients; nWaiting;) {
        struct epoll_event rgEvent[64];
        const int nEvents = epoll_wait(nEpoll, rgEvent, 64, -1);
        for (int i = 0; i < nEvents; ++i) {
            Client& client = *static_cast<Client*>(rgEvent[i].data.ptr);
            if (!receive(client, load)) {
                continue;
            }
            loaded.took.add(secondsSince(client.sent) * 1e6);
            ++loaded.nReplies;
            if (secondsSince(start) < dSeconds) {
                sendNext(client, load, nClients);
            } else {
                --nWaiting;
            }
        }
    }
    loaded.dSeconds = secondsSince(start);
    for (const Client& client : clients) {
        close(client.nSocket);
    }
    close(nEpoll);
    return loaded;
}
