#include "ToolRun.h"

#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <pwd.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include "Heap.h"
#include "SystemCalls.h"

// The tool's main function, which is compiled under this name.
int toolMain(int nArguments, char** rgArguments);

namespace {

// A file without a name, for what the tool writes.
class Capture {
public:
    Capture() : m_nFile(memfd_create("capture", MFD_CLOEXEC)) {}
    ~Capture() { close(m_nFile); }
    Capture(const Capture&) = delete;
    Capture& operator=(const Capture&) = delete;

    void become(int nStream) const { dup2(m_nFile, nStream); }
    std::string text() const
    {
        std::string strText(static_cast<size_t>(lseek(m_nFile, 0, SEEK_END)), '\0');
        const ssize_t cbRead = pread(m_nFile, strText.data(), strText.size(), 0);
        strText.resize(0 < cbRead ? static_cast<size_t>(cbRead) : 0);
        return strText;
    }

private:
    const int m_nFile;
};

// A number that parent and child share.
class SharedNumber {
public:
    SharedNumber()
        : m_pn(static_cast<int64_t*>(
              mmap(nullptr, sizeof(int64_t), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0)))
    {
    }
    ~SharedNumber() { munmap(m_pn, sizeof(int64_t)); }
    SharedNumber(const SharedNumber&) = delete;
    SharedNumber& operator=(const SharedNumber&) = delete;
    int64_t& operator*() const { return *m_pn; }

private:
    int64_t* const m_pn;
};

bool g_blTool = false;             // whether this process is the tool
const Fault* g_pWaiting = nullptr; // for the command to begin

void failMemory(const Fault& fault)
{
    g_pWaiting = nullptr;
    Heap::failFrom(fault.nFirst, fault.nLast);
}

// The child: it is the tool from here on.
[[noreturn]] void beTool(const std::vector<std::string>& strArguments, const Fault& fault, int nSocket,
                         int64_t& nAllocations)
{
    std::string strName = "vemo-access-token";
    std::vector<std::string> strTexts = strArguments;
    std::vector<char*> rgArguments = {strName.data()};
    for (std::string& strText : strTexts) {
        rgArguments.push_back(strText.data());
    }
    rgArguments.push_back(nullptr);
    if (fault.isOfMemory()) {
        getpwuid(0); // glibc does not bear a lack of memory when it does that first
    }
    if (0 != fault.nSignal) {
        signal(fault.nSignal, SIG_DFL); // which jobs in the background inherit as ignored
    }
    g_blTool = true;
    sqlite3_shutdown(); // for it to begin from nothing
    if (!letOtherAnswer(nSocket)) {
        _exit(EXIT_FAILURE);
    }
    if (Fault::Kind::Parsing == fault.kind) {
        failMemory(fault);
    } else if (Fault::Kind::Memory == fault.kind) {
        g_pWaiting = &fault;
    }
    const int nStatus = toolMain(static_cast<int>(rgArguments.size() - 1), rgArguments.data());
    nAllocations = Heap::allocations();
    exit(nStatus);
}

// What becomes of a call, and how many there have been.
class Injection {
public:
    Injection(const Fault& fault, pid_t pid) : m_fault(fault), m_pid(pid) {}
    int answer(const struct seccomp_data& call)
    {
        const int nUndisturbed = isSync(call) ? PRETEND : CARRY_OUT;
        if (isSync(call)) {
            m_strSynced.push_back(fileOf(call.args[0]));
        }
        if (!isMet(call)) {
            return nUndisturbed;
        }
        ++m_nCalls;
        if (m_nCalls < m_fault.nFirst || m_fault.nLast < m_nCalls) {
            return nUndisturbed;
        }
        if (Fault::Kind::Signal == m_fault.kind) {
            kill(m_pid, m_fault.nSignal);
            return nUndisturbed;
        }
        return Fault::Kind::Error == m_fault.kind ? EIO : ENOSPC;
    }
    int64_t calls() const { return m_nCalls; }
    std::vector<std::string> synced() const { return m_strSynced; }

private:
    // Sentences must come through. Random numbers are drawn until they suit, so that a run can have fewer
    // calls than the one that was counted; a signal in front of the last one must come all the same.
    bool isMet(const struct seccomp_data& call) const
    {
        return !m_fault.isOfMemory() && !isWriteToStandardError(call) &&
               (Fault::Kind::Signal != m_fault.kind || !drawsRandomNumbers(call)) &&
               (Fault::Kind::FullDisk != m_fault.kind || takesRoomOnDisk(call));
    }
    std::string fileOf(uint64_t nDescriptor) const
    {
        return std::filesystem::read_symlink("/proc/" + std::to_string(m_pid) + "/fd/" +
                                             std::to_string(nDescriptor));
    }

    const Fault m_fault;
    const pid_t m_pid;
    int64_t m_nCalls = 0;
    std::vector<std::string> m_strSynced;
};

int syncIfTool(long nCall, int nFile)
{
    return g_blTool ? static_cast<int>(syscall(nCall, nFile)) : 0;
}

} // namespace

// The test waits for no disk, but the syncs of the tool must come to be answered.
extern "C" int fsync(int nFile)
{
    return syncIfTool(__NR_fsync, nFile);
}

extern "C" int fdatasync(int nFile)
{
    return syncIfTool(__NR_fdatasync, nFile);
}

// As on a file system that has no files without a name, with VEMO_TEST_NO_TMPFILE.
extern "C" int openat(int nDirectory, const char* szPath, int nFlags, ...)
{
    if (g_blTool && O_TMPFILE == (nFlags & O_TMPFILE) && getenv("VEMO_TEST_NO_TMPFILE")) {
        errno = EOPNOTSUPP;
        return -1;
    }
    va_list arguments;
    va_start(arguments, nFlags);
    const mode_t nMode = va_arg(arguments, mode_t);
    va_end(arguments);
    static const auto next = reinterpret_cast<decltype(&::openat)>(dlsym(RTLD_NEXT, "openat"));
    return next(nDirectory, szPath, nFlags, nMode);
}

// The processes of the machine are others in each run.
extern "C" DIR* opendir(const char* szPath)
{
    static const auto next = reinterpret_cast<decltype(&::opendir)>(dlsym(RTLD_NEXT, "opendir"));
    if (g_blTool && 0 == strcmp(szPath, "/proc/")) {
        errno = ENOENT;
        return nullptr;
    }
    return next(szPath);
}

// Each command begins by asking who runs it. Stands in front of the redirection's.
extern "C" uid_t geteuid() noexcept
{
    static const auto next = reinterpret_cast<decltype(&::geteuid)>(dlsym(RTLD_NEXT, "geteuid"));
    const uid_t uid = next();
    if (g_pWaiting) {
        failMemory(*g_pWaiting);
    }
    return uid;
}

Ending runTool(const std::vector<std::string>& strArguments, const Fault& fault)
{
    const Capture output;
    const Capture error;
    const SharedNumber nAllocations;
    int rgSockets[2];
    socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, rgSockets);
    fflush(nullptr);
    const pid_t pid = fork();
    if (0 == pid) {
        dup2(open("/dev/null", O_RDONLY | O_CLOEXEC), STDIN_FILENO);
        output.become(STDOUT_FILENO);
        error.become(STDERR_FILENO);
        close(rgSockets[0]);
        beTool(strArguments, fault, rgSockets[1], *nAllocations);
    }
    close(rgSockets[1]);
    Injection injection(fault, pid);
    const bool blAnswered =
        answerCalls(rgSockets[0], [&](const struct seccomp_data& call) { return injection.answer(call); });
    close(rgSockets[0]);
    int nStatus = 0;
    waitpid(pid, &nStatus, 0);
    if (!blAnswered) {
        throw NoAnswers("the kernel does not let one process answer the system calls of another");
    }
    Ending ending;
    ending.nSignal = WIFSIGNALED(nStatus) ? WTERMSIG(nStatus) : 0;
    ending.nStatus = WIFEXITED(nStatus) ? WEXITSTATUS(nStatus) : 0;
    ending.strOutput = output.text();
    ending.strError = error.text();
    ending.strSynced = injection.synced();
    ending.nCalls = fault.isOfMemory() ? *nAllocations : injection.calls();
    return ending;
}
