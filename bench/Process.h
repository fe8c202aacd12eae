// Processes that run beside the benchmark.

#ifndef VEMO_ACCESS_TOKEN_BENCH_PROCESS_H
#define VEMO_ACCESS_TOKEN_BENCH_PROCESS_H

#include <signal.h>
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
        statusOf(m_pid);
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

    pid_t pid() const { return m_pid; }

private:
    const pid_t m_pid;
};

// A process that holds a connection to the store in use. A connection of this process would not do: SQLite
// shares descriptors and locks within a process.
inline std::unique_ptr<Process> startBystander()
{
    int rgnEnd[2];
    char cByte = 0;
    if (0 != pipe(rgnEnd)) {
        throw std::runtime_error("no pipe");
    }
    auto pBystander = std::make_unique<Process>([&] {
        AccessTokenApi api;
        // SQLite opens the journal with the first statement only.
        if (0 == api.cleanExpireToken(false) && 1 == write(rgnEnd[1], &cByte, 1)) {
            pause();
        }
    });
    close(rgnEnd[1]);
    const bool blConnected = 1 == read(rgnEnd[0], &cByte, 1);
    close(rgnEnd[0]);
    if (!blConnected) {
        throw std::runtime_error("the other process has no connection");
    }
    return pBystander;
}

#endif
