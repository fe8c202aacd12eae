#include "internal/SqlText.h"

#include <cstdint>

namespace VEMO_ACCESS_TOKEN {

bool appendValue(Rendering rendering, const Json::Value& jValue, std::string& strSqlOut)
{
    const std::string strText = Rendering::Json == rendering ? toString(jValue) : jValue.asString();
    const SqliteText szSql(sqlite3_mprintf("%q", strText.c_str()));
    if (!szSql) {
        return false;
    }
    const char* szQuote = Rendering::Number == rendering ? "" : "'";
    strSqlOut.append(szQuote).append(szSql.get()).append(szQuote);
    return true;
}

void appendTail(std::string_view strKeyword, Json::Int64 nValue, std::string& strSqlOut)
{
    const uint32_t nPosition = static_cast<uint32_t>(nValue);
    if (nPosition < strKeyword.size()) {
        strSqlOut.append(strKeyword.substr(nPosition));
    }
}

} // namespace VEMO_ACCESS_TOKEN
