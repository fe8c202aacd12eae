#include "LogLines.h"

#include <syslog.h>

#include <cstdio>
#include <new>
#include <sstream>
#include <string>

#include "AccessTokenUtil.h"
#include "Console.h"

namespace {

std::string g_strLines;

// The write function of the stream of log lines.
ssize_t keep(void*, const char* szText, size_t cbText)
{
    try {
        g_strLines.append(szText, cbText);
    } catch (const std::bad_alloc&) {
        return -1; // the caller is a C function
    }
    return static_cast<ssize_t>(cbText);
}

FILE* openLog()
{
    cookie_io_functions_t functions = {};
    functions.write = keep;
    FILE* const pLog = fopencookie(nullptr, "w", functions);
    if (!pLog) {
        throw std::bad_alloc();
    }
    setvbuf(pLog, nullptr, _IOLBF, BUFSIZ);
    return pLog;
}

} // namespace

namespace tool {

LogLines::LogLines(bool blShown) : m_blShown(blShown)
{
    static FILE* const pLog = openLog();
    divertStdout(pLog);
    VEMO_ACCESS_TOKEN::logToStdout(true);
}

LogLines::~LogLines()
{
    try {
        std::istringstream lines(g_strLines);
        g_strLines.clear();
        for (std::string strLine; std::getline(lines, strLine);) {
            if (m_blShown) {
                fprintf(stderr, "%s\n", errorLine(strLine).c_str());
            } else if (!strLine.empty()) {
                syslog(LOG_ERR, "%s\n", strLine.c_str());
            }
        }
    } catch (const std::bad_alloc&) {
        g_strLines.clear(); // what else is to be told of that, the command does
    }
}

} // namespace tool
