#include "Sockets.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <stdexcept>
#include <system_error>

namespace {

const int FIRST_HANDED_OVER = 3;
const int BACKLOG = 1024;

[[noreturn]] void fail(const std::string& strPath)
{
    throw std::system_error(errno, std::generic_category(), strPath);
}

std::string variable(const char* szName)
{
    const char* szValue = getenv(szName);
    const std::string strValue = szValue ? szValue : "";
    unsetenv(szName);
    return strValue;
}

} // namespace

namespace gate {

Sockets handedOver()
{
    const std::string strProcess = variable("LISTEN_PID");
    const std::string strNumber = variable("LISTEN_FDS");
    std::istringstream names(variable("LISTEN_FDNAMES"));
    Sockets sockets;
    if (strProcess != std::to_string(getpid())) {
        return sockets;
    }
    if (strNumber != "1" && strNumber != "2") {
        throw std::runtime_error(
            "one socket is needed for calls, and one at most for the status; there are " + strNumber);
    }
    for (int nSocket = FIRST_HANDED_OVER; nSocket < FIRST_HANDED_OVER + atoi(strNumber.c_str()); ++nSocket) {
        std::string strName;
        std::getline(names, strName, ':');
        int& nPlace = strName == "status" || 0 <= sockets.nCalls ? sockets.nStatus : sockets.nCalls;
        nPlace = nSocket;
        int nListens = 0;
        socklen_t cbListens = sizeof(nListens);
        if (0 != getsockopt(nSocket, SOL_SOCKET, SO_ACCEPTCONN, &nListens, &cbListens) || !nListens) {
            throw std::runtime_error("a descriptor that was handed over is not a listening socket");
        }
        fcntl(nSocket, F_SETFD, FD_CLOEXEC);
        fcntl(nSocket, F_SETFL, O_NONBLOCK);
    }
    if (0 > sockets.nCalls) {
        throw std::runtime_error("no socket for calls was handed over");
    }
    return sockets;
}

int listenAt(const std::string& strPath, const char* szGroup)
{
    const std::string strNew = strPath + ".new";
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    if (strNew.size() >= sizeof(address.sun_path)) {
        errno = ENAMETOOLONG;
        fail(strPath);
    }
    memcpy(address.sun_path, strNew.data(), strNew.size());
    const int nSocket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (0 > nSocket) {
        fail(strPath);
    }
    unlink(strNew.c_str());
    const mode_t mask = umask(0177);
    const int nBound = bind(nSocket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address));
    umask(mask);
    if (0 != nBound || 0 != listen(nSocket, BACKLOG)) {
        fail(strPath);
    }
    const struct group* pGroup = getgrnam(szGroup);
    if (pGroup && (0 != chown(strNew.c_str(), static_cast<uid_t>(-1), pGroup->gr_gid) ||
                   0 != chmod(strNew.c_str(), 0660))) {
        fail(strPath);
    }
    if (0 != rename(strNew.c_str(), strPath.c_str())) {
        fail(strPath);
    }
    return nSocket;
}

} // namespace gate
