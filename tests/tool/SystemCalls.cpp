#include "SystemCalls.h"

#include <fcntl.h>
#include <linux/filter.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <iterator>

namespace {

// Not among them: close, whose descriptor is gone whatever it answers, and the calls for locks.
const int CALLS[] = {
#ifdef __NR_open // older ones, which not every machine has
    __NR_open,     __NR_stat,     __NR_lstat,      __NR_access,    __NR_mkdir,
    __NR_unlink,   __NR_rename,   __NR_chmod,      __NR_chown,     __NR_link,
#endif
    __NR_openat,   __NR_read,     __NR_pread64,    __NR_write,     __NR_writev,
    __NR_pwrite64, __NR_fsync,    __NR_fdatasync,  __NR_ftruncate, __NR_lseek,
    __NR_fstat,    __NR_statx,    __NR_newfstatat, __NR_faccessat, __NR_mkdirat,
    __NR_linkat,   __NR_unlinkat, __NR_renameat2,  __NR_renameat,  __NR_fchmod,
    __NR_fchmodat, __NR_fchown,   __NR_fchownat,   __NR_getrandom, __NR_getdents64};

// A filter that has the kernel tell these calls, and carry out all others.
struct Filter {
    Filter()
    {
        add(BPF_LD | BPF_W | BPF_ABS, offsetof(struct seccomp_data, nr), 0);
        for (const int nCall : CALLS) {
            add(BPF_JMP | BPF_JEQ | BPF_K, static_cast<uint32_t>(nCall), 1); // over the next where it is not
            add(BPF_RET | BPF_K, SECCOMP_RET_USER_NOTIF, 0);
        }
        add(BPF_RET | BPF_K, SECCOMP_RET_ALLOW, 0);
    }
    void add(int nCode, uint32_t nOperand, uint8_t nOverIfNot)
    {
        rgInstructions[nInstructions++] = {static_cast<uint16_t>(nCode), 0, nOverIfNot, nOperand};
    }
    struct sock_filter rgInstructions[2 * std::size(CALLS) + 2];
    unsigned short nInstructions = 0;
};

// A message of one byte that can carry a descriptor.
struct Message {
    Message()
    {
        header.msg_iov = &part;
        header.msg_iovlen = 1;
        header.msg_control = rgControl;
        header.msg_controllen = sizeof(rgControl);
    }
    char cByte = 0;
    struct iovec part = {&cByte, 1};
    alignas(struct cmsghdr) char rgControl[CMSG_SPACE(sizeof(int))] = {};
    struct msghdr header = {};
};

void sendDescriptor(int nSocket, int nDescriptor)
{
    Message message;
    struct cmsghdr* pControl = CMSG_FIRSTHDR(&message.header);
    pControl->cmsg_level = SOL_SOCKET;
    pControl->cmsg_type = SCM_RIGHTS;
    pControl->cmsg_len = CMSG_LEN(sizeof(nDescriptor));
    memcpy(CMSG_DATA(pControl), &nDescriptor, sizeof(nDescriptor));
    sendmsg(nSocket, &message.header, 0);
}

// -1 when none comes.
int receiveDescriptor(int nSocket)
{
    Message message;
    int nDescriptor = -1;
    const ssize_t cbReceived = recvmsg(nSocket, &message.header, MSG_CMSG_CLOEXEC);
    const struct cmsghdr* pControl = 0 < cbReceived ? CMSG_FIRSTHDR(&message.header) : nullptr;
    if (pControl) {
        memcpy(&nDescriptor, CMSG_DATA(pControl), sizeof(nDescriptor));
    }
    return nDescriptor;
}

// Answers one call. The process can be gone or have got a signal meanwhile: there is nobody to answer then.
void answerOne(int nCalls, const Answer& answer)
{
    struct seccomp_notif call = {};
    if (0 != ioctl(nCalls, SECCOMP_IOCTL_NOTIF_RECV, &call)) {
        return;
    }
    const int nAnswer = answer(call.data);
    struct seccomp_notif_resp response = {};
    response.id = call.id;
    if (CARRY_OUT == nAnswer) {
        response.flags = SECCOMP_USER_NOTIF_FLAG_CONTINUE;
    } else {
        response.error = PRETEND == nAnswer ? 0 : -nAnswer;
    }
    ioctl(nCalls, SECCOMP_IOCTL_NOTIF_SEND, &response);
}

bool isOneOf(const struct seccomp_data& call, std::initializer_list<int> nCalls)
{
    return nCalls.end() != std::find(nCalls.begin(), nCalls.end(), call.nr);
}

} // namespace

bool letOtherAnswer(int nSocket)
{
    Filter filter;
    const struct sock_fprog program = {filter.nInstructions, filter.rgInstructions};
    prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0); // without which only root may
    const int nCalls = static_cast<int>(
        syscall(__NR_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_NEW_LISTENER, &program));
    if (0 > nCalls) {
        return false;
    }
    sendDescriptor(nSocket, nCalls);
    close(nCalls);
    return true;
}

bool answerCalls(int nSocket, const Answer& answer)
{
    struct pollfd calls = {receiveDescriptor(nSocket), POLLIN, 0};
    if (0 > calls.fd) {
        return false;
    }
    while (0 <= poll(&calls, 1, -1) && !(calls.revents & POLLHUP)) {
        answerOne(calls.fd, answer);
    }
    close(calls.fd);
    return true;
}

bool drawsRandomNumbers(const struct seccomp_data& call)
{
    return __NR_getrandom == call.nr;
}

bool isSync(const struct seccomp_data& call)
{
    return isOneOf(call, {__NR_fsync, __NR_fdatasync});
}

bool isWriteToStandardError(const struct seccomp_data& call)
{
    return isOneOf(call, {__NR_write, __NR_writev}) && STDERR_FILENO == call.args[0];
}

bool takesRoomOnDisk(const struct seccomp_data& call)
{
    const bool blCreates = __NR_openat == call.nr && (call.args[2] & O_CREAT);
#ifdef __NR_open
    const bool blCreatesByOlderCall = (__NR_open == call.nr && (call.args[1] & O_CREAT)) ||
                                      isOneOf(call, {__NR_mkdir, __NR_rename, __NR_link});
#else
    const bool blCreatesByOlderCall = false;
#endif
    return blCreates || blCreatesByOlderCall ||
           isOneOf(call, {__NR_write, __NR_writev, __NR_pwrite64, __NR_ftruncate, __NR_fsync, __NR_fdatasync,
                          __NR_mkdirat, __NR_linkat, __NR_renameat, __NR_renameat2});
}
