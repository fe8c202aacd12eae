#include "SortedIds.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cstring>
#include <new>

#include "Failure.h"
#include "Place.h"

namespace {

const size_t GROUP_MAX = 4000;

// 16 MB instead of 2: SQLite sorts parts of this size in memory, and merges them from the file.
const char* const SORT_IN = "PRAGMA cache_size = -16000";

// Opens a database that ends with its connection. Beyond some megabytes, SQLite puts it into a file.
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
        throw std::bad_alloc(); // it opens no file yet, so only memory can be missing
    }
    return pDb;
}

} // namespace

namespace tool {

SortedIds::SortedIds(bool blDescending) : m_pDb(opened(), sqlite3_close), m_blDescending(blDescending)
{
    run([this] {
        for (const char* szSql : {"PRAGMA journal_mode = OFF", SORT_IN, "BEGIN",
                                  "CREATE TABLE ids (key, place INTEGER, tid TEXT)"}) {
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

void SortedIds::add(const Id& id, const std::string& strKey, bool blNumber)
{
    run([&] {
        if (blNumber) {
            m_insert->bind(1, static_cast<int64_t>(strtoll(strKey.c_str(), nullptr, 10)));
        } else {
            m_insert->bind(1, strKey);
        }
        m_insert->bind(2, id.nRow).bind(3, id.strTid).step();
        m_insert->reset();
    });
}

void SortedIds::each(uint64_t nLimit, const std::function<void(const std::vector<Id>& ids)>& use)
{
    run([&] {
        // Has no LIMIT: with one, SQLite would insert all rows into a tree instead of sorting them.
        grant::Statement sorted(m_pDb.get(), m_blDescending
                                                 ? "SELECT tid, place FROM ids ORDER BY key DESC, place"
                                                 : "SELECT tid, place FROM ids ORDER BY key, place");
        std::vector<Id> ids;
        for (bool blMore = true; blMore;) {
            blMore = 0 != nLimit && sorted.step();
            if (blMore) {
                --nLimit;
                ids.push_back({sorted.text(0), sorted.number(1)});
            }
            if (!ids.empty() && (!blMore || ids.size() == GROUP_MAX)) {
                use(ids);
                ids.clear();
            }
        }
    });
}

} // namespace tool
