// The process that reads HTTP, for connections.py, which moves its clock and chooses its
// clients' users.
// Arguments: the descriptors of the link to the other process, of the sockets for calls and for the status,
// and of memory that holds how far the clock is ahead, in ns.

#include "gate/http/Server.h"

#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>

#include "gate/Clock.h"

namespace {

const std::atomic<int64_t>* g_pLater = nullptr;

} // namespace

extern "C" int clock_gettime(clockid_t clock, struct timespec* pTime) noexcept
{
    const int nResult = static_cast<int>(syscall(SYS_clock_gettime, clock, pTime));
    if (g_pLater && CLOCK_REALTIME != clock) {
        const int64_t nTime = pTime->tv_sec * gate::SECOND + pTime->tv_nsec + *g_pLater;
        *pTime = {nTime / gate::SECOND, nTime % gate::SECOND};
    }
    return nResult;
}

// A client's user is the number at the end of the client's address.
extern "C" int getsockopt(int nSocket, int nLevel, int nOption, void* pValue, socklen_t* pcbValue) noexcept
{
    const long nResult = syscall(SYS_getsockopt, nSocket, nLevel, nOption, pValue, pcbValue);
    if (SO_PEERCRED == nOption) {
        struct sockaddr_un address = {};
        socklen_t cbAddress = sizeof(address);
        getpeername(nSocket, reinterpret_cast<struct sockaddr*>(&address), &cbAddress);
        const char* const szUser = strrchr(&address.sun_path[1], ' ');
        static_cast<struct ucred*>(pValue)->uid = static_cast<uid_t>(atoi(szUser));
    }
    return static_cast<int>(nResult);
}

int main(int, char** rgArguments)
{
    g_pLater = static_cast<std::atomic<int64_t>*>(
        mmap(nullptr, sizeof(*g_pLater), PROT_READ, MAP_SHARED, atoi(rgArguments[4]), 0));
    gate::Server(atoi(rgArguments[1]), atoi(rgArguments[2]), atoi(rgArguments[3]), "x-once").run();
}
