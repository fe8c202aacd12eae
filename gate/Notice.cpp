#include "Notice.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>

namespace gate {

void notify(const char* szState)
{
    const char* szPath = getenv("NOTIFY_SOCKET");
    struct sockaddr_un address = {};
    if (!szPath || strlen(szPath) >= sizeof(address.sun_path)) {
        return;
    }
    address.sun_family = AF_UNIX;
    strcpy(address.sun_path, szPath);
    const socklen_t cbAddress =
        static_cast<socklen_t>(offsetof(struct sockaddr_un, sun_path) + strlen(szPath));
    if ('@' == szPath[0]) {
        address.sun_path[0] = '\0'; // an abstract address
    }
    const int nSocket = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (0 <= nSocket) {
        sendto(nSocket, szState, strlen(szState), MSG_NOSIGNAL, reinterpret_cast<struct sockaddr*>(&address),
               cbAddress);
        close(nSocket);
    }
}

int64_t watchdogPeriod()
{
    const char* szMicroseconds = getenv("WATCHDOG_USEC");
    const char* szProcess = getenv("WATCHDOG_PID");
    if (!szMicroseconds || (szProcess && atoll(szProcess) != getpid())) {
        return 0;
    }
    return atoll(szMicroseconds) * 1000;
}

} // namespace gate
