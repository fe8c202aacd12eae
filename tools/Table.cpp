#include "Table.h"

#include <libsmartcols/libsmartcols.h>
#include <sys/ioctl.h>
#include <wchar.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <memory>
#include <new>
#include <string_view>

#include "Console.h"
#include "Failure.h"
#include "Visible.h"

namespace {

const char* const SEPARATOR = "  ";

void require(bool blDone)
{
    if (!blDone) {
        throw std::bad_alloc(); // the one thing that these calls can fail of
    }
}

// The columns of the terminal that the result goes to. Elsewhere there is no end of them.
size_t terminalWidth()
{
    if (!tool::isTerminal(tool::resultStream())) {
        return SIZE_MAX;
    }
    struct winsize size = {};
    const bool blKnown = 0 == ioctl(fileno(tool::resultStream()), TIOCGWINSZ, &size) && size.ws_col;
    return blKnown ? size.ws_col : 80;
}

struct Character {
    size_t cb;
    size_t nWidth; // the columns that it takes; none for a mark on another
};

// The first character of a printable text.
Character firstOf(std::string_view strText)
{
    wchar_t cWide = 0;
    mbstate_t state = {};
    const size_t cb = mbrtowc(&cWide, strText.data(), strText.size(), &state);
    if (cb > strText.size()) {
        return {1, 1}; // a byte that the locale makes nothing of
    }
    return {std::max<size_t>(cb, 1), static_cast<size_t>(std::max(wcwidth(cWide), 0))};
}

size_t widthOf(std::string_view strText)
{
    size_t nWidth = 0;
    while (!strText.empty()) {
        const Character character = firstOf(strText);
        nWidth += character.nWidth;
        strText.remove_prefix(character.cb);
    }
    return nWidth;
}

// The text in pieces of this width, the last one what is left of it.
std::vector<std::string> broken(std::string_view strText, size_t nWidth)
{
    std::vector<std::string> strPieces(1);
    size_t nUsed = 0;
    while (!strText.empty()) {
        const Character character = firstOf(strText);
        if (nUsed + character.nWidth > nWidth) {
            strPieces.emplace_back();
            nUsed = 0;
        }
        strPieces.back() += strText.substr(0, character.cb);
        nUsed += character.nWidth;
        strText.remove_prefix(character.cb);
    }
    return strPieces;
}

} // namespace

namespace tool {

Table::Table(const std::vector<Column>& columns, bool blHeader) : m_columns(columns), m_blHeader(blHeader) {}

void Table::add(const std::vector<std::string>& strCells, const char* szColour)
{
    Line line{{}, szColour};
    for (const std::string& strCell : strCells) {
        line.strCells.push_back(printable(strCell, localeCharset()));
    }
    m_lines.push_back(std::move(line));
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
        size_t nWidth = m_blHeader ? strlen(m_columns[i].szTitle) : 0;
        for (const Line& line : m_lines) {
            nWidth = std::max(nWidth, widthOf(line.strCells[i]));
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

void Table::print() const
{
    const std::unique_ptr<struct libscols_table, decltype(&scols_unref_table)> pOwner(scols_new_table(),
                                                                                      scols_unref_table);
    struct libscols_table* pTable = pOwner.get();
    require(nullptr != pTable);
    scols_table_set_stream(pTable, resultStream());
    scols_table_enable_noheadings(pTable, !m_blHeader);
    scols_table_enable_colors(pTable, isColoured(resultStream()));
    scols_table_set_column_separator(pTable, SEPARATOR);
    scols_table_enable_noencoding(pTable, true); // cells are printable
    // Some versions of libsmartcols repeat parts of what they break, and cut characters in two: cells are
    // broken here, and fit.
    scols_table_set_termforce(pTable, SCOLS_TERMFORCE_NEVER);
    for (const Column& column : m_columns) {
        // Some make room for titles that they do not print.
        const char* szTitle = m_blHeader ? column.szTitle : nullptr;
        const int nFlags = Kind::Right == column.kind ? SCOLS_FL_RIGHT : 0;
        require(nullptr != scols_table_new_column(pTable, szTitle, 0, nFlags));
    }
    const std::vector<size_t> nWidths = widthsWithin(terminalWidth());
    for (const Line& line : m_lines) {
        std::vector<std::vector<std::string>> strPieces;
        size_t nHeight = 0;
        for (size_t i = 0; i < line.strCells.size(); ++i) {
            strPieces.push_back(broken(line.strCells[i], nWidths[i]));
            nHeight = std::max(nHeight, strPieces.back().size());
        }
        for (size_t n = 0; n < nHeight; ++n) {
            struct libscols_line* pLine = scols_table_new_line(pTable, nullptr);
            require(nullptr != pLine);
            for (size_t i = 0; i < strPieces.size(); ++i) {
                const char* szPiece = n < strPieces[i].size() ? strPieces[i][n].c_str() : "";
                require(0 == scols_line_set_data(pLine, i, szPiece));
            }
            require(!line.szColour || 0 == scols_line_set_color(pLine, line.szColour));
        }
    }
    errno = 0;
    const int nResult = scols_print_table(pTable);
    require(ENOMEM != errno); // it leaves cells empty then, and does not tell
    if (0 != nResult) {
        throw Failure(EXIT_STATUS_STORE, std::string("cannot print the table: ") + strerror(-nResult));
    }
}

} // namespace tool
