// Helpers for SQL statements.

#ifndef TOOLS_SQL_H
#define TOOLS_SQL_H

#include <optional>
#include <string>
#include <vector>

namespace tool {

// The columns of a row as texts; nothing for NULL.
typedef std::vector<std::optional<std::string>> Row;
typedef std::vector<Row> Rows;

// Formats SQL as sqlite3_mprintf() does: %Q quotes and escapes a text.
std::string sqlText(const char* szFormat, ...);

// The names of a token's fields, in the order of the columns.
std::vector<std::string> fieldNames();

// An SQL expression for a row's id as an SQL literal, whatever type the id has. Other statements can compare
// "tid" with that literal.
extern const char* const SQL_QUOTED_TID;

} // namespace tool

#endif
