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
    // A column title that begins with '>' makes a column that is aligned to the right.
    Table(const std::vector<std::string>& strTitles, bool blHeader);

    // Adds a line, in a colour of libsmartcols ("red", ...) or nullptr. Colours show where the result
    // is a coloured terminal.
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
