// Processes that run beside the benchmark.

#ifndef VEMO_ACCESS_TOKEN_BENCH_PROCESS_H
#define VEMO_ACCESS_TOKEN_BENCH_PROCESS_H

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <stdexcept>

#include "AccessTokenApi.h"
#include "Processes.h"

// A process that runs until the object, or this process, ends.
class Process {
public:
    explicit Process(const std::function<void()>& body) : m_pid(startProcess(body)) {}
    ~Process()
    {
        kill(m_pid, SIGTERM);
        kill(m_pid, SIGCONT);
        statusOf(m_pid);
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

    pid_t pid() const { return m_pid; }

private:
    const pid_t m_pid;
};

// A process that holds a connection to the store in use, and is stopped. A connection of this process would
// not do: SQLite shares descriptors and locks within a process.
inline std::unique_ptr<Process> startBystander()
{
    auto pBystander = std::make_unique<Process>([] {
        AccessTokenApi api;
        if (0 == api.cleanExpireToken(false)) { // SQLite opens the journal with the first statement only
            raise(SIGSTOP);
        }
    });
    int nStatus = 0;
    if (pBystander->pid() != waitpid(pBystander->pid(), &nStatus, WUNTRACED) || !WIFSTOPPED(nStatus)) {
        throw std::runtime_error("the other process has no connection");
    }
    return pBystander;
}

#endif
