#include "Confinement.h"

#include "Server.h"

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <pwd.h>
#include <seccomp.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>

namespace {

// AddressSanitizer makes more system calls, so its builds have no filter.
#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define VEMO_GATE_SANITIZED
#endif
#endif
#ifdef VEMO_GATE_SANITIZED
const bool IS_SANITIZED = true;
#else
const bool IS_SANITIZED = false;
#endif

void require(bool blDone, const char* szWhat)
{
    if (!blDone) {
        throw std::system_error(errno, std::generic_category(), szWhat);
    }
}

// Makes an empty directory the root. It is removed, so it stays empty for ever.
void leaveFiles()
{
    char szDirectory[] = "/tmp/vemo-access-token-gate-XXXXXX";
    require(mkdtemp(szDirectory), szDirectory);
    const bool blEntered = 0 == chdir(szDirectory);
    require(0 == rmdir(szDirectory) && blEntered, szDirectory);
    require(0 == chroot("."), "chroot");
}

void dropBoundingSet()
{
    for (int nCapability = 0;
         1 == prctl(PR_CAPBSET_READ, nCapability) || 0 == prctl(PR_CAPBSET_READ, nCapability);
         ++nCapability) {
        require(0 == prctl(PR_CAPBSET_DROP, nCapability), "PR_CAPBSET_DROP");
    }
}

void become(const char* szUser)
{
    const struct passwd* pUser = getpwnam(szUser);
    if (!pUser || 0 == pUser->pw_uid) {
        throw std::runtime_error(std::string("there must be a user ") + szUser + ", and not root");
    }
    const uid_t uid = pUser->pw_uid;
    const gid_t gid = pUser->pw_gid;
    leaveFiles();
    dropBoundingSet();
    require(0 == setgroups(0, nullptr) && 0 == setresgid(gid, gid, gid) && 0 == setresuid(uid, uid, uid),
            szUser);
}

void limit(__rlimit_resource_t resource)
{
    const struct rlimit none = {0, 0};
    require(0 == setrlimit(resource, &none), "setrlimit");
}

void raiseDescriptors()
{
    struct rlimit descriptors = {};
    require(0 == getrlimit(RLIMIT_NOFILE, &descriptors), "getrlimit");
    descriptors.rlim_cur = descriptors.rlim_max;
    require(0 == setrlimit(RLIMIT_NOFILE, &descriptors), "setrlimit");
    if (descriptors.rlim_max < gate::DESCRIPTORS) {
        throw std::runtime_error("the limit of open files must be " + std::to_string(gate::DESCRIPTORS) +
                                 " or more");
    }
}

void filterSystemCalls()
{
    const int SERVING[] = {
        SCMP_SYS(accept4),      SCMP_SYS(brk),        SCMP_SYS(clock_gettime),
        SCMP_SYS(close),        SCMP_SYS(epoll_ctl),  SCMP_SYS(epoll_pwait),
        SCMP_SYS(epoll_wait),   SCMP_SYS(exit_group), SCMP_SYS(futex),
        SCMP_SYS(getpid),       SCMP_SYS(getrandom),  SCMP_SYS(getsockopt),
        SCMP_SYS(gettimeofday), SCMP_SYS(madvise),    SCMP_SYS(mremap),
        SCMP_SYS(munmap),       SCMP_SYS(poll),       SCMP_SYS(read),
        SCMP_SYS(recvfrom),     SCMP_SYS(recvmmsg),   SCMP_SYS(restart_syscall),
        SCMP_SYS(rt_sigreturn), SCMP_SYS(sendmmsg),   SCMP_SYS(sendto),
        SCMP_SYS(shutdown),     SCMP_SYS(write),
    };
    const std::unique_ptr<void, decltype(&seccomp_release)> pFilter(seccomp_init(SCMP_ACT_KILL_PROCESS),
                                                                    seccomp_release);
    require(pFilter != nullptr, "seccomp_init");
    for (const int nCall : SERVING) {
        errno = -seccomp_rule_add(pFilter.get(), SCMP_ACT_ALLOW, nCall, 0);
        require(0 == errno, "seccomp_rule_add");
    }
    // Memory is allowed, but not executable memory.
    const struct scmp_arg_cmp notExecutable = {2, SCMP_CMP_MASKED_EQ, PROT_EXEC, 0};
    errno = -seccomp_rule_add_array(pFilter.get(), SCMP_ACT_ALLOW, SCMP_SYS(mmap), 1, &notExecutable);
    require(0 == errno, "seccomp_rule_add");
    errno = -seccomp_load(pFilter.get());
    require(0 == errno, "seccomp_load");
}

} // namespace

namespace gate {

void confine(const char* szUser)
{
    const pid_t pidParent = getppid();
    if (0 == getuid()) {
        become(szUser);
    }
    require(0 == prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0), "PR_SET_NO_NEW_PRIVS");
    require(0 == prctl(PR_SET_DUMPABLE, 0, 0, 0, 0), "PR_SET_DUMPABLE");
    require(0 == prctl(PR_SET_PDEATHSIG, SIGKILL, 0, 0, 0), "PR_SET_PDEATHSIG"); // become() resets it
    if (getppid() != pidParent) {
        throw std::runtime_error("the parent has ended");
    }
    raiseDescriptors();
    limit(RLIMIT_FSIZE);
    limit(RLIMIT_NPROC);
    limit(RLIMIT_CORE);
    if (!IS_SANITIZED) {
        filterSystemCalls();
    }
}

} // namespace gate
