// How tokens are shown: as a table, CSV, JSON or a single field.

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
    bool blCsv = false; // with Form::Table: print CSV
    bool blNoHeader = false;
    bool blUtc = false;
    bool blEpoch = false;
    bool blShowIds = false;
    std::string strField;         // print only this field; "" for all
    std::vector<size_t> nColumns; // indexes of COLUMNS; empty for the usual columns
};

// Checks that a text is the name of a field, and returns it. Throws BadValue.
std::string parseField(const std::string& strText);

// Reads the name of a form. Throws BadValue, which lists szForms, the names that the command takes.
Layout::Form parseForm(const std::string& strText, const char* szForms);

// Adds -o to a command, or --no-header.
void addForm(Command& command, Layout& layout);
void addNoHeader(Command& command, Layout& layout);

// Adds the options that all commands share that show tokens: -o with CSV, --no-header, --columns, --field,
// --utc, --epoch.
void addTokenOptions(Command& command, Layout& layout);

// Prints tokens one after the other. Masks their ids unless the layout says otherwise.
class TokenPrinter {
public:
    explicit TokenPrinter(const Layout& layout);

    // Whether measure() must be called for all tokens before print(), because the columns of a table fit
    // their contents.
    bool measures() const;
    void measure(Json::Value& jToken);

    void print(Json::Value& jToken);

    // To be called after the last token.
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

// A token in full as JSON, with a line feed at the end.
std::string recordText(const Json::Value& jToken, Layout::Form form);

// Prints one token in full.
void printToken(const Json::Value& jToken, const Layout& layout);

} // namespace tool

#endif
