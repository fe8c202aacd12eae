// Tables for people, drawn by libsmartcols.

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
        const char* szTitle;
        Kind kind;
    };

    Table(const std::vector<Column>& columns, bool blHeader);

    // Adds a line, its texts made printable, in a colour of libsmartcols ("red", ...) or nullptr. Colours
    // show where the result is a coloured terminal.
    void add(const std::vector<std::string>& strCells, const char* szColour = nullptr);

    // Writes the table to the result.
    void print() const;

private:
    struct Line {
        std::vector<std::string> strCells;
        const char* szColour;
    };

    std::vector<size_t> widthsWithin(size_t nTerminal) const;

    const std::vector<Column> m_columns;
    const bool m_blHeader;
    std::vector<Line> m_lines;
};

} // namespace tool

#endif
