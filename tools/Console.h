// Standard streams: results go to standard output, everything else to standard error. Questions are asked on
// a terminal.

#ifndef TOOLS_CONSOLE_H
#define TOOLS_CONSOLE_H

#include <cstdio>
#include <string>
#include <vector>

#include "Visible.h"

namespace tool {

// Opens each standard stream that is closed, so that no file that is opened later gets its number. Writing to
// such a stream fails.
void completeStreams();

// The stream for results: the standard output that the process was started with.
FILE* resultStream();

// Sends what other code prints to stdout to another stream, or ends that. Results still go to standard
// output.
void divertStdout(FILE* pStream);
void restoreStdout();

bool isTerminal(FILE* pStream);

// The columns of the terminal that a stream is; SIZE_MAX for a stream that is not a terminal.
size_t terminalWidth(FILE* pStream);

// Whether output to a stream may be coloured: it is a terminal, and NO_COLOR is unset or empty.
bool isColoured(FILE* pStream);

// Writes a text to the result. The text must be JSON, or hold visible characters only. What a terminal cannot
// show is escaped as in JSON. Takes no memory if the text is ASCII.
void print(const std::string& strText);

// The text as standard error shows it: made printable for a terminal.
std::string errorLine(const std::string& strText);

// Writes a line "vemo-access-token: ..." to standard error.
void complain(const std::string& strSentence);

// Writes the line "vemo-access-token: out of memory", and takes no memory for it.
void complainOfMemory();

// Writes out what is buffered. Fails if a part of the result could not be written, now or before.
void flushResult();

// A line of the result, made printable for a terminal. The second one writes it.
std::string resultLine(const std::string& strText);
void printLine(const std::string& strText);

// Reads the lines of standard input. On a terminal it asks for one line, which is not shown.
std::vector<std::string> readSecrets(const std::string& strPrompt);

// Asks a yes-or-no question. Standard input and standard error must be a terminal.
bool confirm(const std::string& strQuestion);

} // namespace tool

#endif
