#include "StormProcesses.h"

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <stdexcept>
#include <system_error>
#include <vector>

namespace {

// Neither a return nor an exception may take a child to its parent's business.
[[noreturn]] void runAndExit(const std::function<void()>& body) noexcept
{
    int nStatus = 0;
    try {
        body();
    } catch (...) {
        nStatus = 1;
    }
    _exit(nStatus);
}

} // namespace

pid_t startProcess(const std::function<void()>& body)
{
    const pid_t pidParent = getpid();
    const pid_t pid = fork();
    if (0 == pid) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (getppid() != pidParent) {
            _exit(1);
        }
        runAndExit(body);
    }
    if (0 > pid) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    return pid;
}

bool endsWell(pid_t pid)
{
    int nStatus = -1;
    return pid == waitpid(pid, &nStatus, 0) && 0 == nStatus;
}

int runProcesses(int nProcesses, const std::function<void(int)>& body)
{
    // Its end of file comes when the parent and every process have closed the writing end.
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
