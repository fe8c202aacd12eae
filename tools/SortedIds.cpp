#include "SortedIds.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cstring>
#include <new>

#include "Failure.h"
#include "Place.h"

namespace {

const size_t GROUP_MAX = 1000;

// A database that ends with its connection. SQLite makes a file of it when it grows beyond some megabytes.
sqlite3* opened()
{
    static const std::string strDirectory = tool::databaseDirectory();
    const bool blFile = 0 == access(strDirectory.c_str(), W_OK);
    if (blFile && !sqlite3_temp_directory) {
        sqlite3_temp_directory = sqlite3_mprintf("%s", strDirectory.c_str());
    }
    sqlite3* pDb = nullptr;
    const int nFlags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE;
    if (SQLITE_OK != sqlite3_open_v2(blFile ? "" : ":memory:", &pDb, nFlags, nullptr)) {
        sqlite3_close(pDb);
        throw std::bad_alloc(); // no file is opened yet
    }
    return pDb;
}

} // namespace

namespace tool {

SortedIds::SortedIds(bool blDescending) : m_pDb(opened(), sqlite3_close), m_blDescending(blDescending)
{
    run([this] {
        for (const char* szSql :
             {"PRAGMA journal_mode = OFF", "BEGIN", "CREATE TABLE ids (key, equal INTEGER, tid TEXT)"}) {
            grant::Statement(m_pDb.get(), szSql).step();
        }
        m_insert.emplace(m_pDb.get(), "INSERT INTO ids VALUES (?1, ?2, ?3)");
    });
}

template <typename Run>
void SortedIds::run(Run run)
{
    try {
        run();
    } catch (const grant::Error& error) {
        throw Failure(EXIT_STATUS_STORE,
                      "the ids cannot be sorted in " + databaseDirectory() + ": " + error.what());
    }
}

void SortedIds::add(const std::string& strTid, const std::string& strKey, bool blNumber, int64_t nOfEquals)
{
    run([&] {
        if (blNumber) {
            m_insert->bind(1, static_cast<int64_t>(strtoll(strKey.c_str(), nullptr, 10)));
        } else {
            m_insert->bind(1, strKey);
        }
        m_insert->bind(2, nOfEquals).bind(3, strTid).step();
        m_insert->reset();
    });
}

void SortedIds::each(uint64_t nLimit, const std::function<void(const std::vector<std::string>& strTids)>& use)
{
    run([&] {
        grant::Statement ids(m_pDb.get(), m_blDescending
                                              ? "SELECT tid FROM ids ORDER BY key DESC, equal LIMIT ?1"
                                              : "SELECT tid FROM ids ORDER BY key, equal LIMIT ?1");
        ids.bind(1, static_cast<int64_t>(nLimit));
        std::vector<std::string> strTids;
        for (bool blMore = true; blMore;) {
            blMore = ids.step();
            if (blMore) {
                strTids.emplace_back(ids.text(0));
            }
            if (!strTids.empty() && (!blMore || strTids.size() == GROUP_MAX)) {
                use(strTids);
                strTids.clear();
            }
        }
    });
}

} // namespace tool
