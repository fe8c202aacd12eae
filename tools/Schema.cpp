#include "Schema.h"

namespace tool {

std::string Schema::tableStatement()
{
    return text("SELECT sql FROM sqlite_schema WHERE type = 'table' AND name = 'token' COLLATE NOCASE");
}

bool Schema::hasColumn(const std::string& strName)
{
    return 0 !=
           number(sqlText("SELECT count(*) FROM pragma_table_xinfo('token') WHERE name = %Q COLLATE NOCASE",
                          strName.c_str()));
}

bool Schema::hasIndex(const std::string& strName)
{
    return 0 != number(sqlText("SELECT count(*) FROM sqlite_schema WHERE type = 'index' AND name = %Q",
                               strName.c_str()));
}

bool Schema::isIndexed(const std::string& strColumn)
{
    return 0 != number(sqlText("SELECT count(*) FROM pragma_index_list('token') AS list, "
                               "pragma_index_info(list.name) AS info WHERE info.seqno = 0 AND info.name = %Q",
                               strColumn.c_str()));
}

std::vector<std::string> Schema::triggers()
{
    return names(
        "SELECT name FROM sqlite_schema WHERE type = 'trigger' AND tbl_name = 'token' COLLATE NOCASE "
        "ORDER BY 1");
}

std::vector<std::string> Schema::oddIndexes()
{
    return names("SELECT name FROM pragma_index_list('token') AS list WHERE origin = 'c' AND (\"unique\" OR "
                 "partial OR EXISTS (SELECT 1 FROM pragma_index_info(list.name) WHERE cid < 0)) ORDER BY 1");
}

std::vector<std::string> Schema::names(const std::string& strQuery)
{
    std::vector<std::string> strNames;
    eachRow(strQuery, [&strNames](const Row& row) { strNames.push_back(row[0].value_or("")); });
    return strNames;
}

std::string Schema::encoding()
{
    return text("PRAGMA encoding");
}

std::string Schema::journal()
{
    return text("PRAGMA journal_mode");
}

Schema::Pages Schema::pages()
{
    return {number("PRAGMA freelist_count"), number("PRAGMA page_size")};
}

std::optional<std::string> Schema::damage(std::chrono::milliseconds longest)
{
    const std::string strCheck = "PRAGMA integrity_check";
    Rows rows;
    const std::optional<std::string> strErr =
        journal() == "wal" ? queryPartially(strCheck, rows) : queryWithin(longest, strCheck, rows);
    if (!strErr) {
        return std::nullopt;
    }
    std::string strReport;
    for (const Row& row : rows) {
        strReport += (strReport.empty() ? "" : "\n") + row[0].value_or("");
    }
    return strReport == "ok" ? "" : strReport.empty() ? *strErr : strReport;
}

void Schema::writeSame()
{
    query("PRAGMA user_version = " + text("PRAGMA user_version"));
}

} // namespace tool
