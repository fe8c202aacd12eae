// A progress bar on standard error, if that is a terminal, with the rate and the time left.

#ifndef TOOLS_PROGRESS_H
#define TOOLS_PROGRESS_H

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <thread>

namespace tool {

const uint64_t MANY = 10000; // tokens; work on fewer is too short for a bar

// A thread draws the bar, so a stopped terminal stops only the thread. The destructor waits for the thread:
// make a Progress before the Store, so that it is destroyed after the store is closed.
class Progress {
public:
    // count() returns the number of steps. It is called only if a bar can be shown. The bar is shown from
    // nLeast steps on.
    Progress(const std::string& strTitle, const std::function<uint64_t()>& count, bool blWanted = true,
             uint64_t nLeast = 0);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    void step(uint64_t n = 1) { m_nDone += n; }

private:
    void draw() const;
    void drawAgain();

    const std::string m_strTitle;
    const bool m_blCounted;
    const uint64_t m_nTotal;
    const bool m_blShown;
    const std::chrono::steady_clock::time_point m_start = std::chrono::steady_clock::now();
    std::atomic<uint64_t> m_nDone{0};
    std::atomic<bool> m_blEnd{false};
    std::thread m_thread;
};

} // namespace tool

#endif
