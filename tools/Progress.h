// A progress bar on standard error, where that is a terminal.

#ifndef TOOLS_PROGRESS_H
#define TOOLS_PROGRESS_H

#include <atomic>
#include <cstddef>
#include <string>
#include <thread>

namespace tool {

// A thread of its own draws it: a terminal that was stopped holds up only that. The end of the object waits
// for the thread, so whoever works on the store makes it before the store.
class Progress {
public:
    Progress(const std::string& strTitle, size_t nTotal, bool blWanted = true);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    void step() { ++m_nDone; }

private:
    void draw() const;
    void drawAgain();

    const std::string m_strTitle;
    const size_t m_nTotal;
    const bool m_blShown;
    std::atomic<size_t> m_nDone{0};
    std::atomic<bool> m_blEnd{false};
    std::thread m_thread;
};

} // namespace tool

#endif
