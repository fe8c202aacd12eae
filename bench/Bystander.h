// Another process that holds a connection to the store in use, as long as the object or this process lives.
// A connection of this process would not do: SQLite shares descriptors and locks within a process.

#ifndef VEMO_ACCESS_TOKEN_BENCH_BYSTANDER_H
#define VEMO_ACCESS_TOKEN_BENCH_BYSTANDER_H

#include <signal.h>
#include <unistd.h>

#include <stdexcept>

#include "AccessTokenApi.h"
#include "Processes.h"

class Bystander {
public:
    Bystander()
    {
        int rgnEnd[2];
        char cByte = 0;
        if (0 != pipe(rgnEnd)) {
            throw std::runtime_error("no pipe");
        }
        m_pid = startProcess([&] {
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
    }
    ~Bystander()
    {
        kill(m_pid, SIGKILL);
        statusOf(m_pid);
    }
    Bystander(const Bystander&) = delete;
    Bystander& operator=(const Bystander&) = delete;

private:
    pid_t m_pid;
};

#endif
