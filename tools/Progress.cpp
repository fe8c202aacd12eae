#include "Progress.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <system_error>

#include "Console.h"
#include "Signals.h"

namespace {

const size_t BAR_WIDTH = 40; // at most
const std::chrono::milliseconds DRAW_AGAIN_AFTER(50);

} // namespace

namespace tool {

Progress::Progress(const std::string& strTitle, const std::function<uint64_t()>& count, bool blWanted,
                   uint64_t nLeast)
    : m_strTitle(strTitle),
      m_blCounted(blWanted && isTerminal(stderr)),
      m_nTotal(m_blCounted ? count() : 0),
      m_blShown(m_blCounted && m_nTotal >= nLeast)
{
    if (!m_blShown) {
        return;
    }
    draw();
    const SignalPause pause; // the thread inherits it, so that signals go to the main thread, which cleans up
    try {
        m_thread = std::thread([this] { drawAgain(); });
    } catch (const std::system_error&) { // then the bar is drawn again only at the end
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
    const uint64_t nDone = std::min<uint64_t>(m_nDone, m_nTotal); // tokens can be added meanwhile
    const int nPercent = m_nTotal ? static_cast<int>(100 * nDone / m_nTotal) : 100;
    const std::string strPercent = std::to_string(nPercent);
    // The bar must stay on one line, or each drawing would begin a new one. Text in the last column would
    // also begin a new line.
    const size_t nWidth = terminalWidth(stderr) - 1;
    const size_t nTaken = m_strTitle.size() + strlen(" [] 100 %");
    const size_t nBar = std::min(BAR_WIDTH, nWidth - std::min(nWidth, nTaken));
    std::string strBar(nBar * static_cast<size_t>(nPercent) / 100, '#');
    strBar.resize(nBar, ' ');
    std::string strLine =
        m_strTitle + " [" + strBar + "] " + std::string(3 - strPercent.size(), ' ') + strPercent + " %";
    strLine.resize(std::min(strLine.size(), nWidth));
    const double dSeconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - m_start).count();
    if (dSeconds > 1 && nDone) {
        const double dRate = static_cast<double>(nDone) / dSeconds;
        const auto nLeft = static_cast<uint64_t>(static_cast<double>(m_nTotal - nDone) / dRate);
        const std::string strSpeed =
            ", " + std::to_string(static_cast<uint64_t>(dRate)) + "/s, " + std::to_string(nLeft) + " s left";
        strLine += strLine.size() + strSpeed.size() <= nWidth ? strSpeed : "";
        strLine += "\033[K"; // clears the rest of a longer line
    }
    fprintf(stderr, "\r%s", strLine.c_str());
}

} // namespace tool
