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
        Long,  // goes on in the next line where a terminal has no more room
        Right, // short, aligned to the right
    };
    struct Column {
        const char* szTitle; // ASCII; a long column is at least as wide, which any character must fit into
        Kind kind;
    };

    Table(const std::vector<Column>& columns, bool blHeader);

    // Adds a line, its texts made printable. A red one is so where there are colours.
    void add(const std::vector<std::string>& strCells, bool blRed = false);

    // The table for a terminal of so many columns; where it has no line, no titles either.
    std::string text(size_t nTerminal, bool blColoured) const;

    // Writes the table to the result.
    void print() const;

private:
    struct Line {
        std::vector<std::string> strCells;
        bool blRed;
    };

    std::vector<size_t> widthsWithin(size_t nTerminal) const;

    const std::vector<Column> m_columns;
    const bool m_blHeader;
    std::vector<Line> m_lines;
};

} // namespace tool

#endif
