#include "mutants.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>

namespace mutants {

int g_nActive = -1;
unsigned char* g_pReached = nullptr;

} // namespace mutants

namespace {

// Ahead of all that could reach a mutant. The plain system calls pass by the functions that the tests put in
// front of the system's, and nothing stays open. The mapping outlives forks and notes what a killed process
// did.
__attribute__((constructor(101))) void start()
{
    const char* szActive = getenv("VEMO_MUTANT");
    if (szActive) {
        mutants::g_nActive = atoi(szActive);
    }
    const char* szReached = getenv("VEMO_MUTANTS_REACHED");
    if (!szReached) {
        return;
    }
    const int fd = static_cast<int>(syscall(SYS_openat, AT_FDCWD, szReached, O_RDWR, 0));
    if (0 > fd) {
        abort();
    }
    const size_t cbReached = static_cast<size_t>(syscall(SYS_lseek, fd, 0, SEEK_END));
    void* pReached = mmap(nullptr, cbReached, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    if (MAP_FAILED != pReached) { // which a test can give too little memory for
        mutants::g_pReached = static_cast<unsigned char*>(pReached);
    }
    syscall(SYS_close, fd);
}

} // namespace
