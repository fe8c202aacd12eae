// Holds the library's log lines while a command runs.

#ifndef TOOLS_LOG_LINES_H
#define TOOLS_LOG_LINES_H

#include <cstddef>
#include <cstdio>

namespace tool {

// Keeps the log lines in memory while it lives. Its destructor writes them to standard error, made printable
// for a terminal, or to the system log. So a reader that does not read them cannot stop the command in the
// middle of a change, and other programs with it. Make it before the first result is printed; a process has
// one at a time.
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
