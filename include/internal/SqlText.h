// Values as parts of SQL statements.

#ifndef VEMO_ACCESS_TOKEN_SQL_TEXT_H
#define VEMO_ACCESS_TOKEN_SQL_TEXT_H

#include <json/value.h>
#include <sqlite3.h>

#include <memory>
#include <string>
#include <string_view>

#include "internal/JsonText.h"

namespace VEMO_ACCESS_TOKEN {

struct SqliteDeleter {
    void operator()(char* szText) const { sqlite3_free(szText); }
};

// Text that SQLite allocated.
typedef std::unique_ptr<char[], SqliteDeleter> SqliteText;

// How a field's value is written in SQL.
enum class Rendering { Text, Json, Number };

// Returns the rendering of fields of a type name.
constexpr Rendering renderingOf(std::string_view strType)
{
    if (strType == "string") {
        return Rendering::Text;
    }
    if (strType == "Json::Value" || strType == "Json::objectValue" || strType == "Json::arrayValue") {
        return Rendering::Json;
    }
    return Rendering::Number;
}

// A member as an argument of sqlite3_mprintf, and the directive that formats it. What get() returns is valid
// for as long as the object.
template <Rendering rendering>
class SqlArgument {
public:
    static constexpr const char* DIRECTIVE = Rendering::Number == rendering ? "%lld" : "%Q";
    explicit SqlArgument(const Json::Value& jMember)
        : m_jMember(jMember), m_strJson(Rendering::Json == rendering ? toString(jMember) : std::string())
    {
    }
    auto get() const
    {
        if constexpr (Rendering::Number == rendering) {
            return sqlite3_int64{m_jMember.asInt64()};
        } else {
            return Rendering::Json == rendering ? m_strJson.c_str() : m_jMember.asCString();
        }
    }

private:
    const Json::Value& m_jMember;
    const std::string m_strJson;
};

// Appends a value, escaped, and quoted unless it is rendered as a number. A number is not quoted whatever the
// type of the value, so a string becomes part of the statement. Returns false when memory runs out.
bool appendValue(Rendering rendering, const Json::Value& jValue, std::string& strSqlOut);

// Appends what "limit" and "offset" give: the keyword's text from the position nValue on, never the number
// itself. So 0 gives " LIMIT ", without a number, and a position past the end gives nothing. Callers depend
// on it.
void appendTail(std::string_view strKeyword, Json::Int64 nValue, std::string& strSqlOut);

} // namespace VEMO_ACCESS_TOKEN

#endif
