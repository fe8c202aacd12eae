#include "Table.h"

#include <sys/ioctl.h>

#include <cerrno>
#include <cstring>
#include <new>

#include "Console.h"
#include "Failure.h"

namespace {

void require(bool blDone)
{
    if (!blDone) {
        throw std::bad_alloc(); // the one thing that these calls can fail of
    }
}

// Only a terminal has a width to keep to.
int flagsOf(tool::Table::Kind kind, bool blTerminal)
{
    switch (kind) {
    case tool::Table::Kind::Long: return blTerminal ? SCOLS_FL_WRAP : 0;
    case tool::Table::Kind::Right: return SCOLS_FL_RIGHT;
    case tool::Table::Kind::Short: break;
    }
    return 0;
}

} // namespace

namespace tool {

Table::Table(const std::vector<Column>& columns, bool blHeader) : m_pTable(scols_new_table())
{
    require(nullptr != m_pTable);
    struct libscols_table* pTable = m_pTable.get();
    const bool blTerminal = isTerminal(resultStream());
    scols_table_set_stream(pTable, resultStream());
    scols_table_enable_noheadings(pTable, !blHeader);
    scols_table_enable_colors(pTable, isColoured(resultStream()));
    scols_table_set_column_separator(pTable, "  ");
    scols_table_enable_noencoding(pTable, true); // cells are printable
    // libsmartcols would look at standard output, which need not be where the result goes.
    scols_table_set_termforce(pTable, blTerminal ? SCOLS_TERMFORCE_ALWAYS : SCOLS_TERMFORCE_NEVER);
    struct winsize size = {};
    if (blTerminal && 0 == ioctl(fileno(resultStream()), TIOCGWINSZ, &size) && size.ws_col) {
        scols_table_set_termwidth(pTable, size.ws_col);
    }
    for (const Column& column : columns) {
        // Some versions of libsmartcols make room for titles that they do not print.
        const char* szTitle = blHeader ? column.szTitle : nullptr;
        require(nullptr != scols_table_new_column(pTable, szTitle, 0, flagsOf(column.kind, blTerminal)));
    }
}

void Table::add(const std::vector<std::string>& strCells, const char* szColour)
{
    struct libscols_line* pLine = scols_table_new_line(m_pTable.get(), nullptr);
    require(nullptr != pLine);
    for (size_t i = 0; i < strCells.size(); ++i) {
        require(0 == scols_line_set_data(pLine, i, printable(strCells[i], localeCharset()).c_str()));
    }
    require(!szColour || 0 == scols_line_set_color(pLine, szColour));
}

void Table::print() const
{
    errno = 0;
    const int nResult = scols_print_table(m_pTable.get());
    require(ENOMEM != errno); // it leaves cells empty then, and does not tell
    if (0 != nResult) {
        throw Failure(EXIT_STATUS_STORE, std::string("cannot print the table: ") + strerror(-nResult));
    }
}

} // namespace tool
