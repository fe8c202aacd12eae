// The streams: results on standard output, everything else on standard error, and the questions that
// are asked on a terminal.

#ifndef TOOLS_CONSOLE_H
#define TOOLS_CONSOLE_H

#include <cstdio>
#include <string>
#include <vector>

#include "Visible.h"

namespace tool {

// Gives the process all three streams, so that no file that is opened later takes the place of one that
// was closed. Writing to a stream that was closed fails.
void completeStreams();

// Where results go: the standard output that the process was started with.
FILE* resultStream();

// Lets the library write its log lines, on standard error; to a terminal, printable. To be called before
// the first result.
void showLogLines();

bool isTerminal(FILE* pStream);

// Whether what goes to a stream may be coloured: a terminal, and no NO_COLOR in the environment.
bool isColoured(FILE* pStream);

// Writes to the result what holds nothing that cannot be seen, or is JSON. What a terminal cannot show of it
// is escaped as in JSON; it takes no memory to write ASCII.
void print(const std::string& strText);

// Writes a line "vemo-access-token: ..." to standard error.
void complain(const std::string& strSentence);

// Writes the one about memory, and takes none for that.
void complainOfMemory();

// Writes out what is still buffered. Fails when the result could not be written.
void flushResult();

// A line of the result: to a terminal, printable.
std::string resultLine(const std::string& strText);
void printLine(const std::string& strText);

// The lines of standard input; on a terminal one line, asked for and not shown.
std::vector<std::string> readSecrets(const std::string& strPrompt);

// Asks on the terminal. Fails where standard input or standard error is none.
bool confirm(const std::string& strQuestion);

// A progress bar on standard error, where that is a terminal.
class Progress {
public:
    Progress(const std::string& strTitle, size_t nTotal, bool blWanted = true);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    void step();

private:
    void draw() const;

    const std::string m_strTitle;
    const size_t m_nTotal;
    size_t m_nDone = 0;
    const bool m_blShown;
};

} // namespace tool

#endif
