#include "Child.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>

namespace {

const int AWAY = 16; // above the numbers that the child expects

[[noreturn]] void fail(const char* szWhat)
{
    throw std::system_error(errno, std::generic_category(), szWhat);
}

// Turns the new process into the child. The process has one thread, so it may call any function after fork().
[[noreturn]] void become(const gate::Child& child, std::array<int, 3> rgDescriptor)
{
    for (int& nDescriptor : rgDescriptor) {
        nDescriptor = 0 > nDescriptor ? open("/dev/null", O_RDWR) : nDescriptor;
        nDescriptor = fcntl(nDescriptor, F_DUPFD, AWAY);
    }
    for (int i = 0; i < 3; ++i) {
        dup2(rgDescriptor[static_cast<size_t>(i)], gate::CHILD_LINK + i);
    }
    close_range(gate::CHILD_STATUS + 1, ~0U, 0);
    const int nNull = open("/dev/null", O_RDWR);
    dup2(nNull, STDIN_FILENO);
    dup2(nNull, STDOUT_FILENO);
    close(nNull);
    // A signal such as that of Ctrl-C reaches both processes. The child ignores it, also after execve(): the
    // parent tells it when to stop.
    signal(SIGINT, SIG_IGN);
    signal(SIGTERM, SIG_IGN);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    const char* const rgArgument[] = {child.strProgram.c_str(), child.strUser.c_str(),
                                      child.strOnceHeader.c_str(), nullptr};
    const char* const rgVariable[] = {nullptr};
    execve(rgArgument[0], const_cast<char* const*>(rgArgument), const_cast<char* const*>(rgVariable));
    _exit(127);
}

} // namespace

namespace gate {

int start(const Child& child, const Sockets& sockets)
{
    int rgEnd[2];
    if (0 != access(child.strProgram.c_str(), X_OK)) {
        fail(child.strProgram.c_str());
    }
    if (0 != socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, rgEnd)) {
        fail("socketpair");
    }
    const pid_t pid = fork();
    if (0 > pid) {
        fail("fork");
    }
    if (0 == pid) {
        become(child, {rgEnd[1], sockets.nCalls, sockets.nStatus});
    }
    close(rgEnd[1]);
    close(sockets.nCalls);
    if (0 <= sockets.nStatus) {
        close(sockets.nStatus);
    }
    return rgEnd[0];
}

} // namespace gate
