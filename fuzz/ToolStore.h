// The tool under the fuzzer, and the store that it uses, with the same tokens before each run.

#ifndef FUZZ_TOOL_STORE_H
#define FUZZ_TOOL_STORE_H

#include <sqlite3.h>

#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "AccessTokenUtil.h"
#include "Commands.h"
#include "Console.h"
#include "Failure.h"
#include "Library.h"

namespace fuzz {

typedef std::vector<std::string> Texts;

// Runs the tool with these arguments; the first is the name of the program. Returns its exit status.
// Exceptions other than tool::Failure pass through, and end the fuzzing.
inline int runTool(tool::Commands& commands, Texts strArguments, const std::string& strInput)
{
    std::vector<char*> rgArguments;
    for (std::string& strArgument : strArguments) {
        rgArguments.push_back(strArgument.data());
    }
    std::stringbuf input(strInput);
    std::streambuf* const pBefore = std::cin.rdbuf(&input);
    int nStatus = tool::EXIT_STATUS_DONE;
    try {
        nStatus = commands.run(static_cast<int>(rgArguments.size()), rgArguments.data());
    } catch (const tool::Failure& failure) {
        tool::complain(failure.what());
        nStatus = failure.status();
    }
    std::cin.rdbuf(pBefore);
    return nStatus;
}

// The beginnings of ids, and fields that differ from their defaults.
const char* const TOKENS[] = {
    R"({"tid":"LiveToken","bind_sid":"sid","uid":0,"deadline":4102444800,"count":3,"function":"backup",)"
    R"("webapi_allow":{"Example.File":{"method":["get","list"]}},"extra":{"note":"\u001b[31m"}})",
    R"({"tid":"LastUseOf","uid":1000,"deadline":4102444800,"function":"share","webapi_allow":{"A":{}}})",
    R"({"tid":"Malformed","uid":-5,"deadline":9223372036854775807,"count":-1,"function":"share",)"
    R"("webapi_allow":{"A":{"method":[[]]},"B":[]}})",
    R"({"tid":"ExpiredIt","bind_sid":"sid","uid":77,"deadline":1,"count":0,"function":"old"})"};

inline void copy(sqlite3* pFrom, sqlite3* pTo)
{
    sqlite3_backup* pBackup = sqlite3_backup_init(pTo, "main", pFrom, "main");
    FUZZ_REQUIRE(pBackup && SQLITE_DONE == sqlite3_backup_step(pBackup, -1));
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_backup_finish(pBackup));
}

inline int isOk(void*, int, char** rgValue, char**)
{
    return 0 == std::string("ok").compare(rgValue[0]) ? 0 : 1;
}

class ToolStore {
public:
    ToolStore()
    {
        run("PRAGMA page_size = 1024");
        FUZZ_REQUIRE(0 == m_db.createTable());
        for (const char* szToken : TOKENS) {
            Json::Value jToken = json(szToken);
            jToken["tid"] = tid(jToken["tid"].asString());
            jToken["create_time"] = 1;
            VEMO_ACCESS_TOKEN::fillDefaultValue(jToken, false);
            FUZZ_REQUIRE(0 == m_db.tokenCreate(jToken));
        }
        FUZZ_REQUIRE(SQLITE_OK == sqlite3_open_v2(":memory:", &m_pFirst, SQLITE_OPEN_READWRITE, nullptr));
        copy(m_pDb, m_pFirst);
        m_strImage = image();
    }
    ToolStore(const ToolStore&) = delete;
    ToolStore& operator=(const ToolStore&) = delete;

    // Whether the database differs from its first state.
    bool isChanged() const { return image() != m_strImage; }

    // Its tokens. The database must be sound.
    Json::Value tokens()
    {
        FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(m_pDb, "PRAGMA integrity_check", isOk, nullptr, nullptr));
        return fuzz::tokens(m_db);
    }

    // Restores its first state.
    void restore()
    {
        copy(m_pFirst, m_pDb);
        m_strImage = image();
    }

    // Deletes all tokens.
    void clear() { run("DELETE FROM token"); }

private:
    std::string image() const
    {
        sqlite3_int64 cbImage = 0;
        unsigned char* pImage = sqlite3_serialize(m_pDb, "main", &cbImage, 0);
        FUZZ_REQUIRE(pImage);
        const std::string strImage(reinterpret_cast<const char*>(pImage), static_cast<size_t>(cbImage));
        sqlite3_free(pImage);
        return strImage;
    }

    void run(const char* szSql)
    {
        FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(m_pDb, szSql, nullptr, nullptr, nullptr));
    }

    sqlite3* const m_pDb = openStore(); // it keeps the database alive
    sqlite3* m_pFirst = nullptr;        // a copy
    std::string m_strImage;
    AccessTokenDbApi m_db;
};

} // namespace fuzz

#endif
