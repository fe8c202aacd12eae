// The library's table, read without the library.

#ifndef TESTS_TABLE_H
#define TESTS_TABLE_H

#include <sqlite3.h>

#include "ModelRow.h"

class Table {
public:
    explicit Table(sqlite3* pDb) : m_pDb(pDb) {}

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
        const char* const szSelect = "SELECT * FROM token ORDER BY rowid";
        if (SQLITE_OK != sqlite3_exec(m_pDb, szSelect, &append, &strFound, nullptr)) {
            strFound += sqlite3_errmsg(m_pDb);
        }
        return strFound == strExpected ? "" : "the table holds:\n" + strFound + "instead of:\n" + strExpected;
    }

private:
    static int append(void* pText, int nColumns, char** szValues, char**)
    {
        for (int i = 0; i < nColumns; ++i) {
            static_cast<std::string*>(pText)->append(szValues[i] ? szValues[i] : "NULL").append("\n");
        }
        return 0;
    }

    sqlite3* const m_pDb;
};

#endif
