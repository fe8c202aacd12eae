#include "Processes.h"

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <stdexcept>
#include <system_error>
#include <vector>

pid_t startProcess(const std::function<void()>& body)
{
    const pid_t pidParent = getpid();
    const pid_t pid = fork();
    if (0 > pid) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    if (0 < pid) {
        return pid;
    }
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    int nStatus = getppid() == pidParent ? 0 : 1;
    try { // the child must not go on with its parent's code, by a return or an exception
        if (0 == nStatus) {
            body();
        }
    } catch (...) {
        nStatus = 1;
    }
    _exit(nStatus);
}

int statusOf(pid_t pid)
{
    int nStatus = -1;
    return pid == waitpid(pid, &nStatus, 0) ? nStatus : -1;
}

bool endsWell(pid_t pid)
{
    return 0 == statusOf(pid);
}

int runProcesses(int nProcesses, const std::function<void(int)>& body)
{
    // It is at its end of file when the parent and every process have closed the writing end.
    int rgnGate[2];
    if (0 != pipe(rgnGate)) {
        throw std::system_error(errno, std::generic_category(), "pipe");
    }
    std::vector<pid_t> pids;
    for (int nProcess = 0; nProcess < nProcesses; ++nProcess) {
        pids.push_back(startProcess([&] {
            char cNone = 0;
            close(rgnGate[1]);
            if (0 != read(rgnGate[0], &cNone, 1)) {
                throw std::logic_error("the gate is not closed");
            }
            body(nProcess);
        }));
    }
    close(rgnGate[0]);
    close(rgnGate[1]);
    return static_cast<int>(
        std::count_if(pids.begin(), pids.end(), [](pid_t pid) { return !endsWell(pid); }));
}
