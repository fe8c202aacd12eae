#include "Table.h"

#include <sys/ioctl.h>
#include <wchar.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "Console.h"
#include "Visible.h"

namespace {

const char* const SEPARATOR = "  ";
const char* const RED = "\033[31m";
const char* const NO_COLOUR = "\033[0m";

// The columns of the terminal that the result goes to. Elsewhere there is no end of them.
size_t terminalWidth()
{
    if (!tool::isTerminal(tool::resultStream())) {
        return SIZE_MAX;
    }
    struct winsize size = {};
    ioctl(fileno(tool::resultStream()), TIOCGWINSZ, &size); // it stays as it is where that is not known
    return size.ws_col ? size.ws_col : 80;
}

struct Piece {
    size_t cb;
    size_t nWidth; // the columns that it takes
};

// What of a printable text fits into so many columns.
Piece firstOf(std::string_view strText, size_t nColumns)
{
    Piece piece = {};
    while (piece.cb < strText.size()) {
        const std::string_view strRest = strText.substr(piece.cb);
        wchar_t cWide = L'\0';
        mbstate_t state = {};
        const size_t cb = mbrtowc(&cWide, strRest.data(), strRest.size(), &state);
        const size_t nWidth = static_cast<size_t>(std::max(wcwidth(cWide), 0)); // none for a mark on another
        if (piece.nWidth + nWidth > nColumns) {
            break;
        }
        piece.cb += std::min(cb, strRest.size()); // an error is a large number, but printable texts have none
        piece.nWidth += nWidth;
    }
    return piece;
}

} // namespace

namespace tool {

Table::Table(const std::vector<Column>& columns, bool blHeader) : m_columns(columns), m_blHeader(blHeader) {}

void Table::add(const std::vector<std::string>& strCells, bool blRed)
{
    if (m_blHeader && m_lines.empty()) {
        Line& titles = m_lines.emplace_back();
        for (const Column& column : m_columns) {
            titles.strCells.emplace_back(column.szTitle);
        }
    }
    Line& line = m_lines.emplace_back(Line{{}, blRed});
    for (const std::string& strCell : strCells) {
        line.strCells.push_back(printable(strCell, localeCharset()));
    }
}

// How wide each column is, so that a line fits. What cannot be broken is as wide as it has to be. The others
// have equal shares of the rest, but no less than their titles need; what one does not need is for those that
// need more.
std::vector<size_t> Table::widthsWithin(size_t nTerminal) const
{
    std::vector<size_t> nWidths;
    std::vector<size_t> nLong; // numbers of columns
    size_t nTaken = (m_columns.size() - 1) * strlen(SEPARATOR);
    for (size_t i = 0; i < m_columns.size(); ++i) {
        size_t nWidth = 0;
        for (const Line& line : m_lines) {
            nWidth = std::max(nWidth, firstOf(line.strCells[i], SIZE_MAX).nWidth);
        }
        nWidths.push_back(nWidth);
        if (Kind::Long == m_columns[i].kind) {
            nLong.push_back(i);
        } else {
            nTaken += nWidth;
        }
    }
    std::sort(nLong.begin(), nLong.end(), [&](size_t i, size_t j) { return nWidths[i] < nWidths[j]; });
    for (size_t n = 0; n < nLong.size(); ++n) {
        size_t& nWidth = nWidths[nLong[n]];
        const size_t nShare = (nTerminal - std::min(nTaken, nTerminal)) / (nLong.size() - n);
        nWidth = std::min(nWidth, std::max(nShare, strlen(m_columns[nLong[n]].szTitle)));
        nTaken += nWidth;
    }
    return nWidths;
}

std::string Table::text(size_t nTerminal, bool blColoured) const
{
    const std::vector<size_t> nWidths = widthsWithin(nTerminal);
    std::string strText;
    for (const Line& line : m_lines) {
        const bool blRed = blColoured && line.blRed;
        const auto isEmpty = [](std::string_view strRest) { return strRest.empty(); };
        std::vector<std::string_view> strRests(line.strCells.begin(), line.strCells.end());
        do {
            strText += blRed ? RED : "";
            for (size_t i = 0; i < strRests.size(); ++i) {
                const Piece piece = firstOf(strRests[i], nWidths[i]);
                const std::string strBlanks(nWidths[i] - piece.nWidth, ' ');
                const bool blLast = strRests.size() == i + 1;
                strText += Kind::Right == m_columns[i].kind ? strBlanks : "";
                strText += strRests[i].substr(0, piece.cb);
                strText += Kind::Right == m_columns[i].kind || blLast ? "" : strBlanks;
                strText += blLast ? "" : SEPARATOR;
                strRests[i].remove_prefix(piece.cb);
            }
            strText += blRed ? NO_COLOUR : "";
            strText += '\n';
        } while (!std::all_of(strRests.begin(), strRests.end(), isEmpty));
    }
    return strText;
}

void Table::print() const
{
    tool::print(text(terminalWidth(), isColoured(resultStream())));
}

} // namespace tool
