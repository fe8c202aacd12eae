#include "Sql.h"

#include <sqlite3.h>

#include <cstdarg>
#include <memory>
#include <new>

#include "internal/AccessTokenDbApi.h"

namespace tool {

std::string sqlText(const char* szFormat, ...)
{
    va_list args;
    va_start(args, szFormat);
    const std::unique_ptr<char, decltype(&sqlite3_free)> szText(sqlite3_vmprintf(szFormat, args),
                                                                &sqlite3_free);
    va_end(args);
    if (!szText) {
        throw std::bad_alloc();
    }
    return szText.get();
}

const char* const SQL_QUOTED_TID = "iif(typeof(tid) = 'text' AND instr(tid, char(0)), "
                                   "'CAST(x''' || hex(tid) || ''' AS TEXT)', quote(tid))";

std::vector<std::string> fieldNames()
{
    std::string strList;
    AccessTokenDbApi().SqlExpandMemberName(strList);
    std::vector<std::string> strNames;
    size_t nStart = 0;
    for (size_t nEnd = strList.find(','); nEnd != std::string::npos; nEnd = strList.find(',', nStart)) {
        strNames.push_back(strList.substr(nStart, nEnd - nStart));
        nStart = nEnd + 1;
    }
    strNames.push_back(strList.substr(nStart));
    return strNames;
}

} // namespace tool
