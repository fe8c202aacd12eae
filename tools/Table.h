// Tables for people.

#ifndef TOOLS_TABLE_H
#define TOOLS_TABLE_H

#include <cstddef>
#include <string>
#include <vector>

namespace tool {

class Table {
public:
    enum class Kind {
        Short, // is never broken
        Long,  // goes on in the next line where a terminal has no more room, and breaks between words
        Right, // short, aligned to the right
    };
    struct Column {
        const char* szTitle; // ASCII; a long column is at least as wide, which any character must fit into
        Kind kind;
        bool blSpare = false; // left out where a terminal has no room for all, the last one first
    };

    Table(const std::vector<Column>& columns, bool blHeader);

    // Adds a line, its texts made printable. A red one is so where there are colours.
    void add(const std::vector<std::string>& strCells, bool blRed = false);

    // The table for a terminal of so many columns; where it has no line, no titles either.
    std::string text(size_t nTerminal, bool blColoured) const;

    // Writes the table to the result.
    void print() const;

    // For a table of more lines than there is memory for: all are measured, and then each is written, the
    // titles ahead of the first. What has grown meanwhile goes on in the next line.
    void measure(const std::vector<std::string>& strCells);
    void print(const std::vector<std::string>& strCells, bool blRed);

private:
    struct Line {
        std::vector<std::string> strCells;
        bool blRed = false;
    };

    std::vector<size_t> widthsWithin(size_t nTerminal) const;
    std::string titles(const std::vector<size_t>& nWidths) const;
    std::string lineText(const Line& line, const std::vector<size_t>& nWidths) const;

    const std::vector<Column> m_columns;
    const bool m_blHeader;
    std::vector<size_t> m_nWidths; // that a column can use, and that it has to have
    std::vector<size_t> m_nLeast;
    std::vector<Line> m_lines;
    std::vector<size_t> m_nPrinted; // the widths, once a line was written
};

} // namespace tool

#endif
