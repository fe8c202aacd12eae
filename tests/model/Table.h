// The library's table, read without the library.

#ifndef TESTS_TABLE_H
#define TESTS_TABLE_H

#include <sqlite3.h>

#include <stdexcept>
#include <string_view>

#include "ModelRow.h"

class Table {
public:
    explicit Table(sqlite3* pDb)
    {
        std::string strSelect = "SELECT ";
        for (const Field& field : FIELDS) {
            strSelect.append(field.szName).append(",");
        }
        strSelect.back() = ' ';
        strSelect += "FROM token ORDER BY rowid";
        if (SQLITE_OK != sqlite3_prepare_v2(pDb, strSelect.c_str(), -1, &m_pSelect, nullptr)) {
            throw std::runtime_error(sqlite3_errmsg(pDb));
        }
    }
    ~Table() { sqlite3_finalize(m_pSelect); }
    Table(const Table&) = delete;
    Table& operator=(const Table&) = delete;

    // How the table differs from these rows in this order, or "".
    std::string differenceFrom(const std::vector<Row>& rows) const
    {
        std::string strDifference;
        size_t nRow = 0;
        int nStep = sqlite3_step(m_pSelect);
        for (; SQLITE_ROW == nStep && nRow < rows.size() && strDifference.empty(); ++nRow) {
            strDifference = columnDifference(rows[nRow]);
            nStep = sqlite3_step(m_pSelect);
        }
        if (strDifference.empty() && (SQLITE_DONE != nStep || nRow != rows.size())) {
            strDifference = SQLITE_ROW == nStep    ? "more rows than " + std::to_string(rows.size())
                            : SQLITE_DONE == nStep ? "only " + std::to_string(nRow) + " rows"
                                                   : sqlite3_errmsg(sqlite3_db_handle(m_pSelect));
        }
        sqlite3_reset(m_pSelect);
        return strDifference;
    }

private:
    // How the current row differs from the expected one, or "".
    std::string columnDifference(const Row& row) const
    {
        for (size_t i = 0; i < FIELDS.size(); ++i) {
            const int nColumn = static_cast<int>(i);
            const int nType = Kind::Number == FIELDS[i].kind ? SQLITE_INTEGER : SQLITE_TEXT;
            const bool blType = nType == sqlite3_column_type(m_pSelect, nColumn);
            const char* szText = reinterpret_cast<const char*>(sqlite3_column_text(m_pSelect, nColumn));
            const std::string_view strText(szText ? szText : "",
                                           static_cast<size_t>(sqlite3_column_bytes(m_pSelect, nColumn)));
            if (!blType || strText != row.columns[i]) {
                return row.columns[0] + ": " + FIELDS[i].szName + " is " +
                       (blType ? "" : "of another type, ") + std::string(strText) + " instead of " +
                       row.columns[i];
            }
        }
        return "";
    }

    sqlite3_stmt* m_pSelect = nullptr;
};

#endif
