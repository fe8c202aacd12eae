// The log lines that the library writes while a command runs.

#ifndef TOOLS_LOG_LINES_H
#define TOOLS_LOG_LINES_H

#include <cstddef>
#include <cstdio>

namespace tool {

// Keeps them while it lives and writes them in the end: on standard error, to a terminal printable, or to the
// system log. So no reader who does not read, of either, holds up the command in the middle of a change, and
// with it everybody else. To be made before the first result; a process has one at a time.
class LogLines {
public:
    explicit LogLines(bool blShown);
    ~LogLines();
    LogLines(const LogLines&) = delete;
    LogLines& operator=(const LogLines&) = delete;

private:
    const bool m_blShown;
    char* m_szLines = nullptr;
    size_t m_cbLines = 0;
    FILE* const m_pStream;
};

} // namespace tool

#endif
