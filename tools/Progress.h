// A progress bar on standard error, where that is a terminal, with the rate and the time left.

#ifndef TOOLS_PROGRESS_H
#define TOOLS_PROGRESS_H

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <thread>

namespace tool {

const uint64_t MANY = 10000; // tokens: what reads or changes fewer is done before a bar could be read

// A thread of its own draws it: a terminal that was stopped holds up only that. The end of the object waits
// for the thread, so whoever works on the store makes it before the store.
class Progress {
public:
    // count: tells how many steps there are, and is only asked where a bar can be shown; it is where there
    // are at least nLeast.
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
