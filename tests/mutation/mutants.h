// Included before each mutated source file: what the mutated places call. At most one mutant is active, the
// one whose number is in the environment variable VEMO_MUTANT. If VEMO_MUTANTS_REACHED names a file, each
// place also notes there which of its mutants would have made a difference: the byte of that number
// becomes 1.

#ifndef TESTS_MUTATION_MUTANTS_H
#define TESTS_MUTATION_MUTANTS_H

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>
#include <optional>
#include <utility>

namespace mutants {

// The library has these, and the program that uses it has its own.
inline int g_nActive = -1;
inline unsigned char* g_pReached = nullptr;

// Runs before any mutant can be reached. The plain system calls bypass the functions by which the tests
// replace the system's, and nothing stays open. The mapping stays in forked processes and also notes what a
// killed process did.
__attribute__((constructor(101))) static void start()
{
    const char* szActive = getenv("VEMO_MUTANT");
    if (szActive) {
        g_nActive = atoi(szActive);
    }
    const char* szReached = getenv("VEMO_MUTANTS_REACHED");
    if (!szReached || g_pReached) {
        return;
    }
    const int fd = static_cast<int>(syscall(SYS_openat, AT_FDCWD, szReached, O_RDWR, 0));
    if (0 > fd) {
        abort();
    }
    const size_t cbReached = static_cast<size_t>(syscall(SYS_lseek, fd, 0, SEEK_END));
    void* pReached = mmap(nullptr, cbReached, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    if (MAP_FAILED != pReached) { // a test may leave too little memory for it
        g_pReached = static_cast<unsigned char*>(pReached);
    }
    syscall(SYS_close, fd);
}

inline bool isActive(int nMutant)
{
    if (g_pReached) {
        g_pReached[nMutant] = 1;
    }
    return g_nActive == nMutant;
}

} // namespace mutants

// A value, or what this mutant puts in its place. What the compiler evaluates stays as it is.
template <typename Value, typename Other>
constexpr Value mutant(int nMutant, Value value, Other other)
{
    const Value mutated = static_cast<Value>(other);
    const bool blSame = mutated == value || __builtin_is_constant_evaluated();
    return blSame || !mutants::isActive(nMutant) ? value : mutated;
}

// A variable that acts by its life alone.
template <int N_MUTANT, typename Guard>
class mutant_guard {
public:
    template <typename... Arguments>
    explicit mutant_guard(Arguments&&... arguments)
    {
        if (mutant(N_MUTANT, true, false)) {
            m_guard.emplace(std::forward<Arguments>(arguments)...);
        }
    }

private:
    std::optional<Guard> m_guard;
};

#endif
