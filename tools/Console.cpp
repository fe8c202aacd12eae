#include "Console.h"

#include <bsd/readpassphrase.h>
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iostream>

#include "AccessTokenUtil.h"
#include "Failure.h"

namespace {

FILE* g_pResult = stdout;

const int BAR_WIDTH = 40;

} // namespace

namespace tool {

void completeStreams()
{
    int nStream = 0;
    do {
        nStream = open("/dev/null", O_RDONLY | O_CLOEXEC);
    } while (0 <= nStream && nStream <= STDERR_FILENO);
    if (STDERR_FILENO < nStream) {
        close(nStream);
    }
}

FILE* resultStream()
{
    return g_pResult;
}

void showLogLines()
{
    const int nResult = dup(STDOUT_FILENO);
    g_pResult = 0 > nResult ? nullptr : fdopen(nResult, "w");
    if (!g_pResult || 0 > dup2(STDERR_FILENO, STDOUT_FILENO)) {
        g_pResult = stdout;
        throw Failure(EXIT_STATUS_STORE, std::string("--verbose: ") + strerror(errno));
    }
    setvbuf(stdout, nullptr, _IOLBF, BUFSIZ);
    VEMO_ACCESS_TOKEN::logToStdout(true);
}

bool isTerminal(FILE* pStream)
{
    return isatty(fileno(pStream));
}

bool isColoured(FILE* pStream)
{
    const char* szNoColor = getenv("NO_COLOR");
    return isTerminal(pStream) && (!szNoColor || !szNoColor[0]);
}

void print(const std::string& strText)
{
    fwrite(strText.data(), 1, strText.size(), g_pResult);
}

void complain(const std::string& strSentence)
{
    fprintf(stderr, "vemo-access-token: %s\n", printable(strSentence).c_str());
}

void flushResult()
{
    if (0 != fflush(g_pResult) || ferror(g_pResult)) {
        throw Failure(EXIT_STATUS_STORE, std::string("cannot write the result: ") + strerror(errno));
    }
}

std::string printable(const std::string& strText)
{
    std::string strOut;
    for (const char c : strText) {
        const unsigned char nByte = static_cast<unsigned char>(c);
        if (nByte < 0x20 || nByte == 0x7f) {
            char szEscape[5];
            snprintf(szEscape, sizeof(szEscape), "\\x%02x", nByte);
            strOut += szEscape;
        } else {
            strOut += c;
        }
    }
    return strOut;
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
    }
    return strLines;
}

bool confirm(const std::string& strQuestion)
{
    fprintf(stderr, "%s [y/N] ", printable(strQuestion).c_str());
    std::string strAnswer;
    std::getline(std::cin, strAnswer);
    return strAnswer == "y" || strAnswer == "yes";
}

Progress::Progress(const std::string& strTitle, size_t nTotal)
    : m_strTitle(strTitle), m_nTotal(nTotal), m_blShown(isTerminal(stderr))
{
    draw();
}

Progress::~Progress()
{
    if (m_blShown) {
        fputc('\n', stderr);
    }
}

void Progress::step()
{
    ++m_nDone;
    const size_t nStride = m_nTotal / 100 + 1;
    if (0 == m_nDone % nStride || m_nDone == m_nTotal) {
        draw();
    }
}

void Progress::draw() const
{
    if (!m_blShown) {
        return;
    }
    const int nPercent = m_nTotal ? static_cast<int>(100 * m_nDone / m_nTotal) : 100;
    const int nFilled = BAR_WIDTH * nPercent / 100;
    fprintf(stderr, "\r%s [%s%s] %3d %%", m_strTitle.c_str(),
            std::string(static_cast<size_t>(nFilled), '#').c_str(),
            std::string(static_cast<size_t>(BAR_WIDTH - nFilled), ' ').c_str(), nPercent);
    fflush(stderr);
}

} // namespace tool
