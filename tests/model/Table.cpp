#include "Table.h"

#include <stdexcept>
#include <string_view>

namespace {

// How the current row differs from the expected one, or "".
std::string columnDifference(sqlite3_stmt* pRow, const Row& row)
{
    for (size_t i = 0; i < FIELDS.size(); ++i) {
        const int nColumn = static_cast<int>(i);
        const int nType = Kind::Number == FIELDS[i].kind ? SQLITE_INTEGER : SQLITE_TEXT;
        const bool blType = nType == sqlite3_column_type(pRow, nColumn);
        const char* szText = reinterpret_cast<const char*>(sqlite3_column_text(pRow, nColumn));
        const std::string_view strText(szText ? szText : "",
                                       static_cast<size_t>(sqlite3_column_bytes(pRow, nColumn)));
        if (!blType || strText != row.columns[i]) {
            return std::string(FIELDS[i].szName) + " is " + (blType ? "" : "of another type, ") +
                   std::string(strText) + " instead of " + row.columns[i];
        }
    }
    return "";
}

} // namespace

Table::Table(sqlite3* pDb)
{
    std::string strSelect = "SELECT ";
    for (const Field& field : FIELDS) {
        strSelect.append(field.szName).append(",");
    }
    strSelect.back() = ' ';
    strSelect += "FROM token ORDER BY rowid";
    sqlite3_stmt* pSelect = nullptr;
    if (SQLITE_OK != sqlite3_prepare_v2(pDb, strSelect.c_str(), -1, &pSelect, nullptr)) {
        throw std::runtime_error(sqlite3_errmsg(pDb));
    }
    m_pSelect.reset(pSelect);
}

std::string Table::differenceFrom(const std::vector<Row>& rows) const
{
    std::string strDifference;
    size_t nRow = 0;
    int nStep = sqlite3_step(m_pSelect.get());
    for (; SQLITE_ROW == nStep && nRow < rows.size() && strDifference.empty(); ++nRow) {
        strDifference = columnDifference(m_pSelect.get(), rows[nRow]);
        if (!strDifference.empty()) {
            strDifference = "row " + std::to_string(nRow) + ": " + strDifference;
        }
        nStep = sqlite3_step(m_pSelect.get());
    }
    if (strDifference.empty() && (SQLITE_DONE != nStep || nRow != rows.size())) {
        strDifference = SQLITE_ROW == nStep    ? "more rows than " + std::to_string(rows.size())
                        : SQLITE_DONE == nStep ? "only " + std::to_string(nRow) + " rows"
                                               : sqlite3_errmsg(sqlite3_db_handle(m_pSelect.get()));
    }
    sqlite3_reset(m_pSelect.get());
    return strDifference;
}
