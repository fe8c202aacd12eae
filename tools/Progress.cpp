#include "Progress.h"

#include <chrono>
#include <cstdio>
#include <system_error>

#include "Console.h"
#include "Signals.h"

namespace {

const int BAR_WIDTH = 40;
const std::chrono::milliseconds DRAW_AGAIN_AFTER(50);

} // namespace

namespace tool {

Progress::Progress(const std::string& strTitle, size_t nTotal, bool blWanted)
    : m_strTitle(strTitle), m_nTotal(nTotal), m_blShown(blWanted && isTerminal(stderr))
{
    if (!m_blShown) {
        return;
    }
    draw();
    const SignalPause pause; // which the thread inherits: signals are for those who clean up
    try {
        m_thread = std::thread([this] { drawAgain(); });
    } catch (const std::system_error&) { // then it is drawn again in the end only
    }
}

Progress::~Progress()
{
    if (!m_blShown) {
        return;
    }
    m_blEnd = true;
    if (m_thread.joinable()) {
        m_thread.join();
    }
    draw();
    fputc('\n', stderr);
}

void Progress::drawAgain()
{
    while (!m_blEnd) {
        std::this_thread::sleep_for(DRAW_AGAIN_AFTER);
        draw();
    }
}

void Progress::draw() const
{
    const int nPercent = m_nTotal ? static_cast<int>(100 * m_nDone / m_nTotal) : 100;
    const int nFilled = BAR_WIDTH * nPercent / 100;
    fprintf(stderr, "\r%s [%s%s] %3d %%", m_strTitle.c_str(),
            std::string(static_cast<size_t>(nFilled), '#').c_str(),
            std::string(static_cast<size_t>(BAR_WIDTH - nFilled), ' ').c_str(), nPercent);
}

} // namespace tool
