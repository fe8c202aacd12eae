#include "Bystander.h"

#include <sys/socket.h>
#include <unistd.h>

#include <stdexcept>

#include "AccessTokenApi.h"
#include "Processes.h"

Bystander::Bystander()
{
    if (0 != socketpair(AF_UNIX, SOCK_STREAM, 0, m_rgnEnd)) {
        throw std::runtime_error("no pair of sockets");
    }
    char cByte = 0;
    m_pid = startProcess([&] {
        close(m_rgnEnd[0]);
        AccessTokenApi api;
        // SQLite opens the journal with the first statement only.
        if (0 == api.cleanExpireToken(false) && 1 == write(m_rgnEnd[1], &cByte, 1)) {
            [[maybe_unused]] const ssize_t nEndOfFile = read(m_rgnEnd[1], &cByte, 1);
        }
    });
    close(m_rgnEnd[1]);
    if (1 != read(m_rgnEnd[0], &cByte, 1)) {
        throw std::runtime_error("the other process has no connection");
    }
}

Bystander::~Bystander()
{
    close(m_rgnEnd[0]);
    endsWell(m_pid);
}
