// The library's table, read without the library.

#ifndef TESTS_TABLE_H
#define TESTS_TABLE_H

#include <sqlite3.h>

#include <stdexcept>

#include "ModelRow.h"

class Table {
public:
    explicit Table(sqlite3* pDb)
    {
        const char* const szSelect = "SELECT * FROM token ORDER BY rowid";
        if (SQLITE_OK != sqlite3_prepare_v2(pDb, szSelect, -1, &m_pSelect, nullptr)) {
            throw std::runtime_error(sqlite3_errmsg(pDb));
        }
    }
    ~Table() { sqlite3_finalize(m_pSelect); }
    Table(const Table&) = delete;
    Table& operator=(const Table&) = delete;

    // How the table differs from these rows in this order, or "".
    std::string differenceFrom(const std::vector<Row>& rows) const
    {
        std::string strExpected;
        for (const Row& row : rows) {
            for (const std::string& strColumn : row.columns) {
                strExpected.append(strColumn).append("\n");
            }
        }
        std::string strFound;
        while (SQLITE_ROW == sqlite3_step(m_pSelect)) {
            for (size_t i = 0; i < FIELDS.size(); ++i) {
                strFound.append(column(i)).append("\n");
            }
        }
        strFound += SQLITE_OK == sqlite3_reset(m_pSelect) ? "" : sqlite3_errmsg(sqlite3_db_handle(m_pSelect));
        return strFound == strExpected ? "" : "the table holds:\n" + strFound + "instead of:\n" + strExpected;
    }

private:
    std::string column(size_t nField) const
    {
        const int nColumn = static_cast<int>(nField);
        const int nType = Kind::Number == FIELDS[nField].kind ? SQLITE_INTEGER : SQLITE_TEXT;
        const bool blType = nType == sqlite3_column_type(m_pSelect, nColumn);
        const auto* szText = reinterpret_cast<const char*>(sqlite3_column_text(m_pSelect, nColumn));
        const auto cb = static_cast<size_t>(sqlite3_column_bytes(m_pSelect, nColumn));
        return (blType ? "" : "(of another type) ") + std::string(szText ? szText : "", cb);
    }

    sqlite3_stmt* m_pSelect = nullptr;
};

#endif
