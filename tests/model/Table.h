// The library's table, read without the library.

#ifndef TESTS_TABLE_H
#define TESTS_TABLE_H

#include <sqlite3.h>

#include <memory>

#include "ModelRow.h"

class Table {
public:
    explicit Table(sqlite3* pDb);

    // How the table differs from these rows in this order, or "".
    std::string differenceFrom(const std::vector<Row>& rows) const;

private:
    struct Closer {
        void operator()(sqlite3_stmt* pStatement) const { sqlite3_finalize(pStatement); }
    };

    std::unique_ptr<sqlite3_stmt, Closer> m_pSelect;
};

#endif
