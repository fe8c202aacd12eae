#include "RunningGate.h"

#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <stdexcept>

namespace {

const int TRIES = 1000; // of 10 ms each

} // namespace

RunningGate::RunningGate(const TokenStore& store)
{
    const std::string strSocket = path(store);
    prctl(PR_SET_CHILD_SUBREAPER, 1); // to know of the end of both
    m_pid = fork();
    if (0 == m_pid) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        execl(VEMO_TEST_GATE, VEMO_TEST_GATE, "--socket", strSocket.c_str(), "--user", "nobody", nullptr);
        _exit(127);
    }
    const std::string strChildren =
        "/proc/" + std::to_string(m_pid) + "/task/" + std::to_string(m_pid) + "/children";
    for (int i = 0; i < TRIES; ++i, usleep(10000)) {
        std::ifstream(strChildren) >> m_pidChild;
        if (m_pidChild && GateClient(store).call("nobody's", "/grant/Example.Api") == "403") {
            return;
        }
    }
    throw std::runtime_error("the gate does not serve");
}

RunningGate::~RunningGate()
{
    if (m_pid) {
        kill(m_pid, SIGKILL);
        wait();
    }
}

int RunningGate::stop()
{
    kill(m_pid, SIGTERM);
    return wait();
}

int RunningGate::wait()
{
    int nStatus = 0;
    waitpid(m_pid, &nStatus, 0);
    m_pid = 0;
    waitpid(m_pidChild, nullptr, 0); // if the parent has not
    return nStatus;
}

bool GateClient::open()
{
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    strncpy(address.sun_path, m_strPath.c_str(), sizeof(address.sun_path) - 1);
    m_nSocket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (0 == connect(m_nSocket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address))) {
        return true;
    }
    close();
    return false;
}

void GateClient::close()
{
    if (0 <= m_nSocket) {
        ::close(m_nSocket);
        m_nSocket = -1;
    }
}

std::string GateClient::call(const std::string& strTid, const std::string& strTarget)
{
    if (0 > m_nSocket && !open()) {
        return REFUSED;
    }
    const std::string strRequest =
        "GET " + strTarget + " HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer " + strTid + "\r\n\r\n";
    std::string strAnswer;
    if (static_cast<ssize_t>(strRequest.size()) ==
        send(m_nSocket, strRequest.data(), strRequest.size(), MSG_NOSIGNAL)) {
        char rgBytes[4096];
        // A short body comes with its head.
        const ssize_t cbBytes = recv(m_nSocket, rgBytes, sizeof(rgBytes), 0);
        strAnswer.assign(rgBytes, cbBytes > 0 ? static_cast<size_t>(cbBytes) : 0);
    }
    if (strAnswer.empty() || std::string::npos != strAnswer.find("Connection: close")) {
        close();
    }
    return strAnswer.empty() ? "" : strAnswer.substr(9, 3);
}
