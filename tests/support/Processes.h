// Processes that a test or a benchmark forks, and what they report.

#ifndef TESTS_PROCESSES_H
#define TESTS_PROCESSES_H

#include <sys/mman.h>
#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <new>
#include <type_traits>

// Zeroed memory that a process shares with those that it forks.
template <typename Element>
class SharedArray {
public:
    explicit SharedArray(size_t nElements)
        : m_cb(nElements * sizeof(Element)),
          m_pMemory(mmap(nullptr, m_cb, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0))
    {
        static_assert(std::is_trivially_destructible_v<Element>);
        if (MAP_FAILED == m_pMemory) {
            throw std::bad_alloc();
        }
    }
    ~SharedArray() { munmap(m_pMemory, m_cb); }
    SharedArray(const SharedArray&) = delete;
    SharedArray& operator=(const SharedArray&) = delete;

    Element& operator[](size_t nElement) { return static_cast<Element*>(m_pMemory)[nElement]; }

private:
    const size_t m_cb;
    void* const m_pMemory;
};

// Forks a process that runs body and ends with status 0, or with 1 if body throws. It is killed if its parent
// ends first.
pid_t startProcess(const std::function<void()>& body);

// Wait for a process to end. They return its wait status, and whether that is 0.
int statusOf(pid_t pid);
bool endsWell(pid_t pid);

// Runs body(0), body(1) and so on, each in a process of its own. All begin when the last process has started.
// Returns how many of them failed.
int runProcesses(int nProcesses, const std::function<void(int)>& body);

#endif
