#include "Console.h"

#include <bsd/readpassphrase.h>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <iostream>

#include "Change.h"
#include "Failure.h"

namespace {

FILE* g_pResult = stdout;

// The characters that the stream's reader can show. Only a terminal is known to have a limit.
tool::Charset charsetOf(FILE* pStream)
{
    return tool::isTerminal(pStream) ? tool::localeCharset() : tool::Charset::Utf8;
}

bool isAscii(const std::string& strText)
{
    return std::all_of(strText.begin(), strText.end(),
                       [](char c) { return 0 <= static_cast<signed char>(c); });
}

void writeResult(const std::string& strText)
{
    fwrite(strText.data(), 1, strText.size(), g_pResult);
}

} // namespace

namespace tool {

void completeStreams()
{
    for (const int nStream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        if (-1 == fcntl(nStream, F_GETFD)) {
            open("/dev/null", O_RDONLY | O_CLOEXEC); // takes the lowest number
        }
    }
    std::cin.exceptions(std::ios_base::badbit); // else lack of memory would go unnoticed and shorten lines
}

FILE* resultStream()
{
    return g_pResult;
}

void divertStdout(FILE* pStream)
{
    g_pResult = stdout;
    stdout = pStream;
}

void restoreStdout()
{
    stdout = g_pResult;
}

bool isTerminal(FILE* pStream)
{
    const int nError = errno; // flushResult() reports an earlier failure to write
    const bool blTerminal = isatty(fileno(pStream));
    errno = nError;
    return blTerminal;
}

size_t terminalWidth(FILE* pStream)
{
    if (!isTerminal(pStream)) {
        return SIZE_MAX;
    }
    struct winsize size = {};
    ioctl(fileno(pStream), TIOCGWINSZ, &size); // leaves zeros if the size is not known
    return size.ws_col ? size.ws_col : 80;
}

bool isColoured(FILE* pStream)
{
    const char* szNoColor = getenv("NO_COLOR");
    return isTerminal(pStream) && (!szNoColor || !szNoColor[0]);
}

void print(const std::string& strText)
{
    if (!isTerminal(g_pResult) || isAscii(strText)) {
        writeResult(strText);
    } else {
        writeResult(showableJson(strText, localeCharset()));
    }
}

std::string errorLine(const std::string& strText)
{
    return isTerminal(stderr) ? printable(strText, localeCharset()) : strText;
}

void complain(const std::string& strSentence)
{
    fprintf(stderr, "vemo-access-token: %s\n", printable(strSentence, charsetOf(stderr)).c_str());
}

void complainOfMemory()
{
    fputs("vemo-access-token: out of memory", stderr);
    fputs(hasChanged() ? "; the change was made\n" : "\n", stderr);
}

void flushResult()
{
    fflush(g_pResult);
    if (ferror(g_pResult)) { // now or before
        throw Failure(EXIT_STATUS_STORE, std::string("cannot write the result: ") + strerror(errno));
    }
}

std::string resultLine(const std::string& strText)
{
    return (isTerminal(g_pResult) ? printable(strText, localeCharset()) : strText) + "\n";
}

void printLine(const std::string& strText)
{
    writeResult(resultLine(strText));
}

std::vector<std::string> readSecrets(const std::string& strPrompt)
{
    std::vector<std::string> strLines;
    if (isTerminal(stdin)) {
        char szLine[4096];
        const bool blRead = readpassphrase(strPrompt.c_str(), szLine, sizeof(szLine), RPP_ECHO_OFF);
        if (blRead) {
            strLines.push_back(szLine);
        }
        explicit_bzero(szLine, sizeof(szLine));
    } else {
        for (std::string strLine; std::getline(std::cin, strLine);) {
            strLines.push_back(strLine);
        }
        if (ferror(stdin)) { // the last line may be cut off, and more lines may be missing
            throw Failure(EXIT_STATUS_USAGE, std::string("standard input: ") + strerror(errno));
        }
    }
    return strLines;
}

bool confirm(const std::string& strQuestion)
{
    fprintf(stderr, "%s [y/N] ", printable(strQuestion, charsetOf(stderr)).c_str());
    std::string strAnswer;
    if (!std::getline(std::cin, strAnswer)) {
        fputc('\n', stderr); // in place of the line feed of an answer
    }
    return 0 == strcasecmp(strAnswer.c_str(), "y") || 0 == strcasecmp(strAnswer.c_str(), "yes");
}

} // namespace tool
