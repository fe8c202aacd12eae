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
        Short, // always on one line
        Long,  // on several lines, broken between words, if the terminal is too narrow
        Right, // like Short, aligned to the right
    };
    struct Column {
        const char* szTitle; // ASCII, at least as wide as any character
        Kind kind;
        bool blSpare = false; // left out if the terminal is too narrow, the last such column first
    };

    Table(const std::vector<Column>& columns, bool blHeader);

    // Adds a line; its texts are made printable. A red line is red only where colours are used.
    void add(const std::vector<std::string>& strCells, bool blRed = false);

    // The table for a terminal of nTerminal columns. A table without lines is "", without titles.
    std::string text(size_t nTerminal, bool blColoured) const;

    // Writes the table to the result.
    void print() const;

    // For a table that is too large for memory: first measure all lines, then print each. The first print()
    // prints the titles too. A text that has become longer in between continues on the next line.
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
    std::vector<size_t> m_nWidths; // of the columns, without line breaks
    std::vector<size_t> m_nLeast;  // of the columns, with line breaks between all words
    std::vector<Line> m_lines;
    std::vector<size_t> m_nPrinted; // the widths that print() uses, set by its first call
};

} // namespace tool

#endif
