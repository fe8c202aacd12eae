// Parts of statements.

#ifndef TOOLS_SQL_H
#define TOOLS_SQL_H

#include <optional>
#include <string>
#include <vector>

namespace tool {

// A row's columns as texts; nothing where it is NULL.
typedef std::vector<std::optional<std::string>> Row;
typedef std::vector<Row> Rows;

// The SQL that sqlite3_mprintf makes of a format: %Q quotes and escapes a text.
std::string sqlText(const char* szFormat, ...);

// The fields of a token, in their order.
std::vector<std::string> fieldNames();

// In a statement, an id as SQL has it, whatever it is; one that can be compared with "tid".
extern const char* const SQL_QUOTED_TID;

} // namespace tool

#endif
