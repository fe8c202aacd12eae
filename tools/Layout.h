// How tokens are shown: as a table, as JSON or as single fields.

#ifndef TOOLS_LAYOUT_H
#define TOOLS_LAYOUT_H

#include <json/value.h>

#include <optional>
#include <string>

#include "Commands.h"

namespace tool {

struct Layout {
    enum class Form { Table, Json, JsonLines };

    Form form = Form::Table;
    bool blNoHeader = false;
    bool blUtc = false;
    bool blEpoch = false;
    bool blShowIds = false;
    std::string strField; // this one only; "" for all
};

// The name of a field, if it is one. Throws BadValue.
std::string parseField(const std::string& strText);

// Adds -o to a command; the second, --no-header too.
void addForm(Command& command, Layout& layout);
void addFormOptions(Command& command, Layout& layout);

// Adds what commands that show tokens have besides: --field, --utc, --epoch.
void addTokenOptions(Command& command, Layout& layout);

// Prints a list of tokens, their ids masked unless the layout shows them.
void printTokens(Json::Value& jTokens, const Layout& layout);

// Prints one token in full.
void printToken(const Json::Value& jToken, const Layout& layout);

} // namespace tool

#endif
