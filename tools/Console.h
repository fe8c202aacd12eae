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

// Lets what others print to stdout go to another stream, or no longer. Results go where they did.
void divertStdout(FILE* pStream);
void restoreStdout();

bool isTerminal(FILE* pStream);

// The columns of the terminal that a stream goes to. Elsewhere there is no end of them.
size_t terminalWidth(FILE* pStream);

// Whether what goes to a stream may be coloured: a terminal, and no NO_COLOR in the environment.
bool isColoured(FILE* pStream);

// Writes to the result what holds nothing that cannot be seen, or is JSON. What a terminal cannot show of it
// is escaped as in JSON; it takes no memory to write ASCII.
void print(const std::string& strText);

// What standard error shows of a text: to a terminal, printable.
std::string errorLine(const std::string& strText);

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

// Asks on the terminal, which standard input and standard error must be.
bool confirm(const std::string& strQuestion);

} // namespace tool

#endif
