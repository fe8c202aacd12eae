// How tokens are shown: as a table, as JSON or as single fields.

#ifndef TOOLS_LAYOUT_H
#define TOOLS_LAYOUT_H

#include <json/value.h>

#include <ctime>
#include <string>
#include <vector>

#include "Commands.h"
#include "Table.h"

namespace tool {

struct Layout {
    enum class Form { Table, Json, JsonLines };

    Form form = Form::Table;
    bool blCsv = false; // a table as CSV
    bool blNoHeader = false;
    bool blUtc = false;
    bool blEpoch = false;
    bool blShowIds = false;
    std::string strField;         // this one only; "" for all
    std::vector<size_t> nColumns; // of a table, as they are numbered here; empty for the usual ones
};

// The name of a field, if it is one. Throws BadValue.
std::string parseField(const std::string& strText);

// The form of a name. Throws BadValue, which lists the names that a command has.
Layout::Form parseForm(const std::string& strText, const char* szForms);

// Adds -o to a command, or --no-header.
void addForm(Command& command, Layout& layout);
void addNoHeader(Command& command, Layout& layout);

// Adds what commands that show tokens have besides: CSV, --field, --columns, --utc, --epoch.
void addTokenOptions(Command& command, Layout& layout);

// Prints tokens one after the other, their ids masked unless the layout shows them.
class TokenPrinter {
public:
    explicit TokenPrinter(const Layout& layout);

    // Whether all tokens must be measured first: a table is as wide as it needs to be.
    bool measures() const;
    void measure(Json::Value& jToken);

    void print(Json::Value& jToken);

    // To be called behind the last.
    void end();

private:
    void mask(Json::Value& jToken) const;
    std::vector<std::string> cellsOf(const Json::Value& jToken) const;
    void printCsv(const Json::Value& jToken);

    const Layout m_layout;
    const time_t m_nNow;
    std::vector<size_t> m_nColumns;
    Table m_table;
    bool m_blFirst = true;
};

// A token in full as JSON, with its end of line.
std::string recordText(const Json::Value& jToken, Layout::Form form);

// Prints one token in full.
void printToken(const Json::Value& jToken, const Layout& layout);

} // namespace tool

#endif
