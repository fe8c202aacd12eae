#include "Bystander.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "AccessTokenApi.h"

Bystander::Bystander()
{
    if (0 != socketpair(AF_UNIX, SOCK_STREAM, 0, m_rgnEnd) || 0 > (m_pid = fork())) {
        perror("bystander");
        exit(1);
    }
    if (0 == m_pid) {
        close(m_rgnEnd[0]);
        holdAndExit(m_rgnEnd[1]);
    }
    close(m_rgnEnd[1]);
    char cReady = 0;
    if (1 != read(m_rgnEnd[0], &cReady, 1)) {
        fprintf(stderr, "the other process has no connection\n");
        exit(1);
    }
}

Bystander::~Bystander()
{
    close(m_rgnEnd[0]);
    waitpid(m_pid, nullptr, 0);
}

// Neither return, exit() nor an exception may take the process to its parent's business, which includes the
// removal of the store.
void Bystander::holdAndExit(int nEnd) noexcept
{
    AccessTokenApi api;
    char cByte = 0;
    // SQLite opens the journal with the first statement only.
    if (0 == api.cleanExpireToken(false) && 1 == write(nEnd, &cByte, 1)) {
        [[maybe_unused]] const ssize_t nEndOfFile = read(nEnd, &cByte, 1);
    }
    _exit(0);
}
