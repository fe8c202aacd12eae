#include "LogLines.h"

#include <syslog.h>

#include <cstdlib>
#include <memory>
#include <new>
#include <sstream>
#include <string>

#include "AccessTokenUtil.h"
#include "Console.h"

namespace tool {

LogLines::LogLines(bool blShown) : m_blShown(blShown), m_pStream(open_memstream(&m_szLines, &m_cbLines))
{
    if (!m_pStream) {
        throw std::bad_alloc();
    }
    divertStdout(m_pStream);
    VEMO_ACCESS_TOKEN::logToStdout(true);
}

LogLines::~LogLines()
{
    restoreStdout();
    fclose(m_pStream);
    const std::unique_ptr<char, decltype(&free)> pOwner(m_szLines, free);
    try {
        std::istringstream lines(m_szLines ? m_szLines : ""); // null if memory ran out
        for (std::string strLine; std::getline(lines, strLine);) {
            if (m_blShown) {
                fprintf(stderr, "%s\n", errorLine(strLine).c_str());
            } else if (!strLine.empty()) {
                syslog(LOG_ERR, "%s\n", strLine.c_str());
            }
        }
    } catch (const std::bad_alloc&) {
        // The command itself reports lack of memory.
    }
}

} // namespace tool
