#include "TokenStore.h"

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <numeric>
#include <set>
#include <sstream>
#include <stdexcept>

#include "AccessTokenDefine.h"
#include "Interpose.h"

namespace {

int insertLine(void* pLines, int nColumns, char** szValues, char**)
{
    std::string strLine;
    for (int i = 0; i < nColumns; ++i) {
        strLine.append(0 == i ? "" : "|").append(szValues[i] ? szValues[i] : "NULL");
    }
    static_cast<std::multiset<std::string>*>(pLines)->insert(strLine + "\n");
    return 0;
}

// The rows as sorted lines, or the error as "corrupt: ...".
std::string rowsOf(const Database& pDb, const std::string& strSql)
{
    std::multiset<std::string> lines;
    if (SQLITE_OK != sqlite3_exec(pDb.get(), strSql.c_str(), &insertLine, &lines, nullptr)) {
        return std::string("corrupt: ") + sqlite3_errmsg(pDb.get());
    }
    return std::accumulate(lines.begin(), lines.end(), std::string());
}

std::string contentsOf(const std::filesystem::path& path)
{
    std::ostringstream contents;
    contents << std::ifstream(path, std::ios::binary).rdbuf();
    return contents.str();
}

} // namespace

// No test needs files to survive a crash of the machine, so nothing is synced. Weak, because PowerCutTest
// defines its own.
extern "C" INTERPOSED __attribute__((weak)) int fsync(int)
{
    return 0;
}

extern "C" INTERPOSED __attribute__((weak)) int fdatasync(int)
{
    return 0;
}

std::string idOf(const std::string& strName)
{
    std::string strTid = "known-" + strName;
    strTid.resize(VEMO_ATOKEN_LENGTH_MIN, 'x');
    return strTid;
}

// In memory if possible: no test needs a disk.
TokenStore::TokenStore()
{
    const bool blMemory = 0 == access("/dev/shm", W_OK | X_OK);
    m_strDirectory =
        (blMemory ? "/dev/shm" : std::filesystem::temp_directory_path().string()) + "/vemo-faults-XXXXXX";
    if (!mkdtemp(m_strDirectory.data())) {
        throw std::runtime_error("cannot make a directory like " + m_strDirectory);
    }
    setenv("VEMO_REDIRECT_DIR", m_strDirectory.c_str(), 1);
}

TokenStore::~TokenStore()
{
    std::error_code ignored;
    std::filesystem::remove_all(m_strDirectory, ignored);
    std::filesystem::remove(m_strDirectory + ".lock", ignored); // the redirection makes it there
}

std::string TokenStore::path() const
{
    return m_strDirectory + "/" + DATABASE;
}

Files TokenStore::files() const
{
    Files files;
    for (const auto& entry : std::filesystem::directory_iterator(m_strDirectory)) {
        if (entry.path().extension() != ".db-shm") { // memory: made anew when the database is opened
            files[entry.path().filename()] = contentsOf(entry.path());
        }
    }
    return files;
}

void TokenStore::setFiles(const Files& files) const
{
    for (const auto& entry : std::filesystem::directory_iterator(m_strDirectory)) {
        std::filesystem::remove(entry.path());
    }
    for (const auto& [strName, strContents] : files) {
        std::ofstream(m_strDirectory + "/" + strName, std::ios::binary) << strContents;
    }
}

std::string TokenStore::state() const
{
    if (!std::filesystem::exists(path())) {
        return STATE_MISSING;
    }
    const Database pDb = open();
    const std::string strIntegrity = rowsOf(pDb, "PRAGMA integrity_check");
    if ("ok\n" != strIntegrity) {
        return 0 == strIntegrity.compare(0, 8, "corrupt:") ? strIntegrity : "corrupt: " + strIntegrity;
    }
    if (rowsOf(pDb, "SELECT name FROM sqlite_master WHERE type = 'table' AND name = 'token'").empty()) {
        return STATE_NO_TABLE;
    }
    return rowsOf(pDb, "SELECT CASE WHEN tid LIKE 'known-%' THEN rtrim(tid, 'x') ELSE 'new' END, "
                       "bind_sid, uid, CASE WHEN deadline < strftime('%s', 'now') THEN 'past' "
                       "WHEN deadline > 4000000000 THEN 'far' ELSE 'new' END, count, "
                       "CASE WHEN create_time > 1000000000 THEN 'new' ELSE 'past' END, "
                       "function, webapi_allow, extra FROM token");
}

std::string TokenStore::rows(const std::string& strSelect) const
{
    return rowsOf(open(), strSelect);
}

void TokenStore::run(const std::string& strSql) const
{
    ::run(open(), strSql);
}

Database TokenStore::open() const
{
    sqlite3* pDb = nullptr;
    const int nResult = sqlite3_open_v2(path().c_str(), &pDb, SQLITE_OPEN_READWRITE, "unix");
    Database database(pDb, &sqlite3_close);
    return SQLITE_OK == nResult ? std::move(database) : throw std::runtime_error("cannot open " + path());
}

void run(const Database& pDb, const std::string& strSql)
{
    if (SQLITE_OK != sqlite3_exec(pDb.get(), strSql.c_str(), nullptr, nullptr, nullptr)) {
        throw std::runtime_error(sqlite3_errmsg(pDb.get()));
    }
}
