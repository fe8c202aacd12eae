#include "Console.h"

#include <bsd/readpassphrase.h>
#include <fcntl.h>
#include <locale.h>
#include <unistd.h>
#include <wctype.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <cwchar>
#include <iostream>

#include "AccessTokenUtil.h"
#include "Failure.h"
#include "Store.h"

namespace {

FILE* g_pResult = stdout;

const int BAR_WIDTH = 40;

locale_t utf8()
{
    static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
    return locale;
}

// The largest character that can be told: of ASCII where the machine has no UTF-8 locale, or no memory for
// it.
wchar_t largestCharacter()
{
    return utf8() ? 0x10ffff : 0x7f;
}

bool isPrintable(wchar_t cWide)
{
    return utf8() ? 0 != iswprint_l(static_cast<wint_t>(cWide), utf8()) : ' ' <= cWide && cWide <= '~';
}

// The text with \xNN for each byte of what is no UTF-8 or what does not pass.
template <typename Passes>
std::string escaped(const std::string& strText, Passes passes)
{
    const locale_t before = uselocale(utf8());
    std::string strOut;
    for (size_t i = 0; i < strText.size();) {
        wchar_t cWide = 0;
        mbstate_t state = {};
        const size_t cbRead = mbrtowc(&cWide, &strText[i], strText.size() - i, &state);
        // What is too large is an error's number, or none that UTF-8 goes to.
        const bool blValid = cbRead <= strText.size() - i && cWide <= largestCharacter();
        const size_t cbCharacter = blValid && cbRead ? cbRead : 1;
        if (blValid && passes(cWide)) {
            strOut.append(strText, i, cbCharacter);
        } else {
            for (size_t j = i; j < i + cbCharacter; ++j) {
                char szEscape[5];
                snprintf(szEscape, sizeof(szEscape), "\\x%02x", static_cast<unsigned char>(strText[j]));
                strOut += szEscape;
            }
        }
        i += cbCharacter;
    }
    uselocale(before);
    return strOut;
}

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
    std::cin.exceptions(std::ios_base::badbit); // it would hide that memory ran out, and cut lines short
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
        throw Failure(EXIT_STATUS_STORE, std::string("cannot write the result: ") + strerror(errno));
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

void complainOfMemory()
{
    fputs("vemo-access-token: out of memory", stderr);
    fputs(Store::hasChanged() ? "; the change was made\n" : "\n", stderr);
}

void flushResult()
{
    if (0 != fflush(g_pResult) || ferror(g_pResult)) {
        throw Failure(EXIT_STATUS_STORE, std::string("cannot write the result: ") + strerror(errno));
    }
}

std::string printable(const std::string& strText)
{
    return escaped(strText, isPrintable);
}

std::string validUtf8(const std::string& strText)
{
    return escaped(strText, [](wchar_t) { return true; });
}

void printLine(const std::string& strText)
{
    print((isTerminal(g_pResult) ? printable(strText) : strText) + "\n");
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
    if (!std::getline(std::cin, strAnswer)) {
        fputc('\n', stderr); // that an answer would have ended with
    }
    return 0 == strcasecmp(strAnswer.c_str(), "y") || 0 == strcasecmp(strAnswer.c_str(), "yes");
}

Progress::Progress(const std::string& strTitle, size_t nTotal, bool blWanted)
    : m_strTitle(strTitle), m_nTotal(nTotal), m_blShown(blWanted && isTerminal(stderr))
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
