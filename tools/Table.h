// Tables for people, drawn by libsmartcols.

#ifndef TOOLS_TABLE_H
#define TOOLS_TABLE_H

#include <libsmartcols/libsmartcols.h>

#include <memory>
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
    struct Deleter {
        void operator()(struct libscols_table* pTable) const { scols_unref_table(pTable); }
    };
    std::unique_ptr<struct libscols_table, Deleter> m_pTable;
};

} // namespace tool

#endif
