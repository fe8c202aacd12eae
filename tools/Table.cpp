#include "Table.h"

#include <wchar.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "Console.h"
#include "Visible.h"

namespace {

const char* const SEPARATOR = "  ";
const size_t LEFT_OUT = SIZE_MAX; // the "width" of a column that is not shown
const size_t WORD_MAX = 40;       // columns; longer words are broken
const char* const RED = "\033[31m";
const char* const NO_COLOUR = "\033[0m";

size_t columnsOf(wchar_t cWide)
{
    return static_cast<size_t>(std::max(wcwidth(cWide), 0)); // 0 for a combining mark
}

// Calls use(character, size in bytes) for each character of a printable text, until use() returns false.
template <typename Use>
void eachOf(std::string_view strText, Use use)
{
    while (!strText.empty()) {
        wchar_t cWide = L'\0';
        mbstate_t state = {};
        // mbrtowc() returns large numbers for errors, but printable texts have none.
        const size_t cb = std::min(mbrtowc(&cWide, strText.data(), strText.size(), &state), strText.size());
        if (!use(cWide, cb)) {
            return;
        }
        strText.remove_prefix(cb);
    }
}

// The part of a text that is on one line.
struct Piece {
    size_t cbShown;
    size_t nWidth;  // the columns that it takes
    size_t cbTaken; // cbShown, with the blank at which the line breaks
};

// The words that fit into nColumns; if not even the first word fits, a part of it.
Piece firstOf(std::string_view strText, size_t nColumns)
{
    Piece fitting = {};
    Piece words = {};
    bool blWhole = true;
    eachOf(strText, [&](wchar_t cWide, size_t cb) {
        blWhole = fitting.nWidth + columnsOf(cWide) <= nColumns;
        if (!blWhole) {
            words = cWide == L' ' ? Piece{fitting.cbShown, fitting.nWidth, fitting.cbShown + cb} : words;
            return false;
        }
        fitting.cbShown += cb;
        fitting.cbTaken += cb;
        fitting.nWidth += columnsOf(cWide);
        if (cWide == L' ') {
            words = {fitting.cbShown - cb, fitting.nWidth - 1, fitting.cbTaken};
        } else if (cWide == L',') {
            words = fitting;
        }
        return true;
    });
    return blWhole || 0 == words.cbTaken ? fitting : words;
}

size_t widthOf(std::string_view strText)
{
    return firstOf(strText, SIZE_MAX).nWidth;
}

// The width of the longest word, in which a line does not break; WORD_MAX at most.
size_t longestWord(std::string_view strText)
{
    size_t nLongest = 0;
    size_t nWord = 0;
    eachOf(strText, [&](wchar_t cWide, size_t) {
        nWord += cWide == L' ' ? 0 : columnsOf(cWide);
        nLongest = std::max(nLongest, nWord);
        nWord = cWide == L' ' || cWide == L',' ? 0 : nWord;
        return true;
    });
    return std::min(nLongest, WORD_MAX);
}

std::vector<std::string> printableCells(const std::vector<std::string>& strCells)
{
    std::vector<std::string> strPrintable;
    for (const std::string& strCell : strCells) {
        strPrintable.push_back(tool::printable(strCell, tool::localeCharset()));
    }
    return strPrintable;
}

} // namespace

namespace tool {

Table::Table(const std::vector<Column>& columns, bool blHeader)
    : m_columns(columns), m_blHeader(blHeader), m_nWidths(columns.size())
{
    for (size_t i = 0; i < m_columns.size(); ++i) {
        m_nLeast.push_back(strlen(m_columns[i].szTitle));
        m_nWidths[i] = m_blHeader ? m_nLeast[i] : 0;
    }
}

void Table::measure(const std::vector<std::string>& strCells)
{
    for (size_t i = 0; i < m_columns.size(); ++i) {
        const std::string strCell = printable(strCells[i], localeCharset());
        m_nWidths[i] = std::max(m_nWidths[i], widthOf(strCell));
        m_nLeast[i] = std::max(m_nLeast[i], longestWord(strCell));
    }
}

void Table::add(const std::vector<std::string>& strCells, bool blRed)
{
    measure(strCells);
    m_lines.push_back({printableCells(strCells), blRed});
}

// The width of each column, so that a line fits into the terminal. Spare columns are left out if there is no
// room. Others that are not Long keep their width. Long columns get equal shares of the rest, but at least
// what their titles and words need. What one column does not need is shared by the others.
std::vector<size_t> Table::widthsWithin(size_t nTerminal) const
{
    std::vector<size_t> nWidths = m_nWidths;
    std::vector<size_t> nLong; // indexes of the Long columns
    size_t nTaken = 0;
    size_t nNeeded = 0;
    const auto least = [&](size_t i) {
        return strlen(SEPARATOR) +
               (Kind::Long == m_columns[i].kind ? std::min(m_nWidths[i], m_nLeast[i]) : m_nWidths[i]);
    };
    for (size_t i = 0; i < m_columns.size(); ++i) {
        nNeeded += least(i);
    }
    for (size_t i = m_columns.size(); 0 < i--;) {
        if (m_columns[i].blSpare && nNeeded > nTerminal && nNeeded - nTerminal > strlen(SEPARATOR)) {
            nNeeded -= least(i);
            nWidths[i] = LEFT_OUT;
        } else if (Kind::Long == m_columns[i].kind) {
            nLong.push_back(i);
            nTaken += strlen(SEPARATOR);
        } else {
            nTaken += nWidths[i] + strlen(SEPARATOR);
        }
    }
    nTaken -= strlen(SEPARATOR);
    std::sort(nLong.begin(), nLong.end(), [&](size_t i, size_t j) { return nWidths[i] < nWidths[j]; });
    for (size_t n = 0; n < nLong.size(); ++n) {
        size_t& nWidth = nWidths[nLong[n]];
        const size_t nShare = (nTerminal - std::min(nTaken, nTerminal)) / (nLong.size() - n);
        nWidth = std::min(nWidth, std::max(nShare, m_nLeast[nLong[n]]));
        nTaken += nWidth;
    }
    return nWidths;
}

std::string Table::titles(const std::vector<size_t>& nWidths) const
{
    Line line;
    for (const Column& column : m_columns) {
        line.strCells.emplace_back(column.szTitle);
    }
    return m_blHeader ? lineText(line, nWidths) : "";
}

std::string Table::lineText(const Line& line, const std::vector<size_t>& nWidths) const
{
    std::vector<std::string_view> strRests;
    size_t nLast = 0;
    for (size_t i = 0; i < nWidths.size(); ++i) {
        nLast = LEFT_OUT == nWidths[i] ? nLast : i;
        strRests.push_back(LEFT_OUT == nWidths[i] ? std::string_view() : line.strCells[i]);
    }
    const auto isEmpty = [](std::string_view strRest) { return strRest.empty(); };
    std::string strText;
    do {
        strText += line.blRed ? RED : "";
        for (size_t i = 0; i <= nLast; ++i) {
            if (LEFT_OUT == nWidths[i]) {
                continue;
            }
            // The title's width is the least, because any character fits into it.
            const Piece piece = firstOf(strRests[i], std::max(nWidths[i], strlen(m_columns[i].szTitle)));
            const std::string strBlanks(nWidths[i] - std::min(nWidths[i], piece.nWidth), ' ');
            strText += Kind::Right == m_columns[i].kind ? strBlanks : "";
            strText += strRests[i].substr(0, piece.cbShown);
            strText += Kind::Right == m_columns[i].kind || nLast == i ? "" : strBlanks;
            strText += nLast == i ? "" : SEPARATOR;
            strRests[i].remove_prefix(piece.cbTaken);
        }
        strText += line.blRed ? NO_COLOUR : "";
        strText += '\n';
    } while (!std::all_of(strRests.begin(), strRests.end(), isEmpty));
    return strText;
}

std::string Table::text(size_t nTerminal, bool blColoured) const
{
    if (m_lines.empty()) {
        return "";
    }
    const std::vector<size_t> nWidths = widthsWithin(nTerminal);
    std::string strText = titles(nWidths);
    for (const Line& line : m_lines) {
        strText += lineText({line.strCells, blColoured && line.blRed}, nWidths);
    }
    return strText;
}

void Table::print() const
{
    tool::print(text(terminalWidth(resultStream()), isColoured(resultStream())));
}

void Table::print(const std::vector<std::string>& strCells, bool blRed)
{
    if (m_nPrinted.empty()) {
        m_nPrinted = widthsWithin(terminalWidth(resultStream()));
        tool::print(titles(m_nPrinted));
    }
    tool::print(lineText({printableCells(strCells), blRed && isColoured(resultStream())}, m_nPrinted));
}

} // namespace tool
