// The gate as a test runs it, on a store of the test's own: both of its programs, and their clients.

#ifndef TESTS_RUNNING_GATE_H
#define TESTS_RUNNING_GATE_H

#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <stdexcept>
#include <string>

// A connection of a client to the gate.
class GateClient {
public:
    static constexpr const char* REFUSED = "no connection";

    explicit GateClient(const std::string& strSocket) : m_strSocket(strSocket) {}
    ~GateClient() { close(); }
    GateClient(const GateClient&) = delete;
    GateClient& operator=(const GateClient&) = delete;

    // The status that answers a call: "200" and so on; "" where the connection ended without an answer, and
    // REFUSED where there was none to be had.
    std::string call(const std::string& strTid, const std::string& strTarget)
    {
        if (0 > m_nSocket && !open()) {
            return REFUSED;
        }
        const std::string strRequest =
            "GET " + strTarget + " HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer " + strTid + "\r\n\r\n";
        const ssize_t cbSent = send(m_nSocket, strRequest.data(), strRequest.size(), MSG_NOSIGNAL);
        char rgBytes[4096];
        // A short body comes with its head.
        const bool blSent = static_cast<ssize_t>(strRequest.size()) == cbSent;
        const ssize_t cbBytes = blSent ? recv(m_nSocket, rgBytes, sizeof(rgBytes), 0) : 0;
        const std::string strAnswer(rgBytes, 0 < cbBytes ? static_cast<size_t>(cbBytes) : 0);
        if (strAnswer.empty() || std::string::npos != strAnswer.find("Connection: close")) {
            close();
        }
        return strAnswer.empty() ? "" : strAnswer.substr(9, 3);
    }

    void close()
    {
        if (0 <= m_nSocket) {
            ::close(m_nSocket);
            m_nSocket = -1;
        }
    }

private:
    bool open()
    {
        struct sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        strncpy(address.sun_path, m_strSocket.c_str(), sizeof(address.sun_path) - 1);
        m_nSocket = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        if (0 != connect(m_nSocket, reinterpret_cast<struct sockaddr*>(&address), sizeof(address))) {
            close();
        }
        return 0 <= m_nSocket;
    }

    const std::string m_strSocket;
    int m_nSocket = -1;
};

class RunningGate {
public:
    // Starts it, and waits until it serves.
    explicit RunningGate(const std::string& strSocket)
    {
        prctl(PR_SET_CHILD_SUBREAPER, 1); // to know of the end of both
        m_pid = fork();
        if (0 == m_pid) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            execl(VEMO_TEST_GATE, VEMO_TEST_GATE, "--socket", strSocket.c_str(), "--user", "nobody", nullptr);
            _exit(127);
        }
        const std::string strPid = std::to_string(m_pid);
        for (int i = 0; i < 1000; ++i, usleep(10000)) {
            std::ifstream("/proc/" + strPid + "/task/" + strPid + "/children") >> m_pidChild;
            if (m_pidChild && GateClient(strSocket).call("nobody's", "/grant/Example.Api") == "403") {
                return;
            }
        }
        throw std::runtime_error("the gate does not serve");
    }
    // Kills what is left of it.
    ~RunningGate()
    {
        if (m_pid) {
            kill(m_pid, SIGKILL);
            wait();
        }
    }
    RunningGate(const RunningGate&) = delete;
    RunningGate& operator=(const RunningGate&) = delete;

    pid_t parent() const { return m_pid; }
    pid_t child() const { return m_pidChild; } // the process that reads HTTP

    // Asks it to stop; the status of waitpid().
    int stop()
    {
        kill(m_pid, SIGTERM);
        return wait();
    }

    // Waits until both processes have ended.
    int wait()
    {
        int nStatus = 0;
        waitpid(m_pid, &nStatus, 0);
        m_pid = 0;
        waitpid(m_pidChild, nullptr, 0); // if the parent has not
        return nStatus;
    }

private:
    pid_t m_pid = 0;
    pid_t m_pidChild = 0;
};

#endif
