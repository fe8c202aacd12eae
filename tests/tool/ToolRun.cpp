#include "ToolRun.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <poll.h>
#include <pwd.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <map>
#include <thread>

#include "Heap.h"
#include "Interpose.h"
#include "Processes.h"

// The tool's main function under another name: the tests have one already.
#define main toolMain
#include "../../tools/main.cpp"
#undef main

namespace {

// The system calls on files, and whether each takes room on the disk. Without close, which closes the
// descriptor whatever it returns, and without the calls for locks.
const std::map<int, bool> CALLS_ON_FILES = {
#ifdef __NR_access // older ones, which not every machine has
    {__NR_access, false},    {__NR_chmod, false},      {__NR_chown, false},      {__NR_link, true},
    {__NR_mkdir, true},      {__NR_rename, true},      {__NR_unlink, false},
#endif
    {__NR_faccessat, false}, {__NR_fchmod, false},     {__NR_fchmodat, false},   {__NR_fchown, false},
    {__NR_fchownat, false},  {__NR_fdatasync, true},   {__NR_fstat, false},      {__NR_fsync, true},
    {__NR_ftruncate, true},  {__NR_getdents64, false}, {__NR_getrandom, false},  {__NR_linkat, true},
    {__NR_lseek, false},     {__NR_mkdirat, true},     {__NR_newfstatat, false}, {__NR_openat, false},
    {__NR_pread64, false},   {__NR_pwrite64, true},    {__NR_read, false},       {__NR_renameat, true},
    {__NR_renameat2, true},  {__NR_statx, false},      {__NR_unlinkat, false},   {__NR_write, true},
    {__NR_writev, true}};

bool takesRoom(const struct seccomp_data& call)
{
    return __NR_openat == call.nr ? 0 != (call.args[2] & O_CREAT) : CALLS_ON_FILES.at(call.nr);
}

// From now on, the calls on files of this thread, and of processes that it forks, wait for an answer. Returns
// the descriptor that reports them, or -1 if the kernel cannot do this.
int handOverCalls()
{
    std::vector<struct sock_filter> program = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(struct seccomp_data, nr))};
    for (const auto& [nCall, blTakesRoom] : CALLS_ON_FILES) {
        program.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, static_cast<uint32_t>(nCall), 0, 1));
        program.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_USER_NOTIF));
    }
    program.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW));
    const struct sock_fprog filter = {static_cast<unsigned short>(program.size()), program.data()};
    prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0); // otherwise only root may do this
    return static_cast<int>(
        syscall(__NR_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_NEW_LISTENER, &filter));
}

// Runs in the child, which becomes the tool.
[[noreturn]] void beTool(std::vector<std::string> strArguments, const Fault& fault, int64_t& nAllocations)
{
    strArguments.insert(strArguments.begin(), "vemo-access-token");
    std::vector<char*> rgArguments;
    for (std::string& strArgument : strArguments) {
        rgArguments.push_back(strArgument.data());
    }
    rgArguments.push_back(nullptr);
    if (0 != fault.nSignal) {
        signal(fault.nSignal, SIG_DFL); // which jobs in the background inherit as ignored
    }
    sqlite3_shutdown(); // so that it is initialised anew
    if (Fault::Kind::Memory == fault.kind) {
        g_allocations.nFirst = fault.nFirst;
        g_allocations.nLast = fault.nLast;
        g_allocations.blRunning = true;
    }
    const int nStatus = toolMain(static_cast<int>(rgArguments.size() - 1), rgArguments.data());
    nAllocations = g_allocations.nCalls;
    exit(nStatus);
}

// Whether the fault can happen to a call. Sentences must come through. Random numbers are drawn until they
// suit, so that a run can have fewer calls than the one that was counted; a signal in front of the last one
// must come all the same.
bool isMet(const struct seccomp_data& call, const Fault& fault)
{
    const bool blSentence =
        (__NR_write == call.nr || __NR_writev == call.nr) && STDERR_FILENO == call.args[0];
    return Fault::Kind::Memory != fault.kind && !blSentence &&
           (Fault::Kind::Signal != fault.kind || __NR_getrandom != call.nr) &&
           (Fault::Kind::FullDisk != fault.kind || takesRoom(call));
}

// The errno with which a call fails, or 0. Counts the calls to which the fault can happen.
int errorOf(const struct seccomp_notif& call, const Fault& fault, int64_t& nMet)
{
    if (__NR_openat == call.data.nr && O_TMPFILE == (call.data.args[2] & O_TMPFILE) &&
        getenv("VEMO_TEST_NO_TMPFILE")) {
        return EOPNOTSUPP;
    }
    if (!isMet(call.data, fault) || ++nMet < fault.nFirst || fault.nLast < nMet) {
        return 0;
    }
    if (Fault::Kind::Signal == fault.kind) {
        kill(static_cast<pid_t>(call.pid), fault.nSignal);
        return 0;
    }
    return Fault::Kind::Error == fault.kind ? EIO : ENOSPC;
}

// Answers until there are no more callers. Returns to how many calls the fault could happen.
int64_t answerCalls(int nCalls, const Fault& fault)
{
    int64_t nMet = 0;
    struct pollfd calls = {nCalls, POLLIN, 0};
    while (0 <= poll(&calls, 1, -1) && !(calls.revents & POLLHUP)) {
        struct seccomp_notif call = {};
        if (0 != ioctl(nCalls, SECCOMP_IOCTL_NOTIF_RECV, &call)) {
            continue; // it was killed meanwhile
        }
        const bool blSync = __NR_fsync == call.data.nr || __NR_fdatasync == call.data.nr;
        struct seccomp_notif_resp response = {};
        response.id = call.id;
        response.error = -errorOf(call, fault, nMet);
        // A sync succeeds without waiting for the disk.
        response.flags = blSync || response.error ? 0 : SECCOMP_USER_NOTIF_FLAG_CONTINUE;
        ioctl(nCalls, SECCOMP_IOCTL_NOTIF_SEND, &response);
    }
    return nMet;
}

// Closes a file without a name, and returns what was written to it.
std::string textOf(int nFile)
{
    std::string strText(static_cast<size_t>(lseek(nFile, 0, SEEK_END)), '\0');
    const ssize_t cbRead = pread(nFile, strText.data(), strText.size(), 0);
    strText.resize(0 < cbRead ? static_cast<size_t>(cbRead) : 0);
    close(nFile);
    return strText;
}

} // namespace

// Elsewhere in the tests a sync does nothing. The tool's must be a system call, to be answered.
extern "C" int fsync(int nFile)
{
    return static_cast<int>(syscall(__NR_fsync, nFile));
}

extern "C" int fdatasync(int nFile)
{
    return static_cast<int>(syscall(__NR_fdatasync, nFile));
}

// The other processes of the machine differ in each run.
extern "C" DIR* opendir(const char* szPath)
{
    if (0 == strcmp(szPath, "/proc/")) {
        errno = ENOENT;
        return nullptr;
    }
    return NEXT(opendir)(szPath);
}

bool canRunTool()
{
    int nCalls = -1;
    std::thread([&] { nCalls = handOverCalls(); }).join();
    return 0 == close(nCalls);
}

Ending runTool(const std::vector<std::string>& strArguments, const Fault& fault)
{
    SharedArray<int64_t> rgAllocations(1);
    const int nInput = open("/dev/null", O_RDONLY | O_CLOEXEC);
    const int nOutput = memfd_create("output", MFD_CLOEXEC);
    const int nError = memfd_create("error", MFD_CLOEXEC);
    int nCalls = -1;
    pid_t pid = -1;
    if (Fault::Kind::Memory == fault.kind) {
        getpwuid(0); // the first look-up of a process must not lack memory: glibc does not handle that
    }
    fflush(nullptr);
    // What the kernel does for a thread it does for what that forks, and not for this thread.
    std::thread([&] {
        nCalls = handOverCalls();
        pid = fork();
        if (0 == pid) {
            dup2(nInput, STDIN_FILENO);
            dup2(nOutput, STDOUT_FILENO);
            dup2(nError, STDERR_FILENO);
            close(nCalls);
            beTool(strArguments, fault, rgAllocations[0]);
        }
    }).join();
    close(nInput);
    const int64_t nMet = answerCalls(nCalls, fault);
    close(nCalls);
    const int nStatus = statusOf(pid);
    Ending ending;
    ending.nSignal = WIFSIGNALED(nStatus) ? WTERMSIG(nStatus) : 0;
    ending.nStatus = WIFEXITED(nStatus) ? WEXITSTATUS(nStatus) : 0;
    ending.strOutput = textOf(nOutput);
    ending.strError = textOf(nError);
    ending.nCalls = Fault::Kind::Memory == fault.kind ? rgAllocations[0] : nMet;
    return ending;
}
