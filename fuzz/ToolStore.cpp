#include "ToolStore.h"

#include <sqlite3.h>

#include <iostream>
#include <sstream>

#include "AccessTokenUtil.h"
#include "Console.h"
#include "Failure.h"
#include "Library.h"
#include "internal/AccessTokenDbApi.h"

namespace {

// The beginnings of ids, and fields that differ from their defaults.
const char* const TOKENS[] = {
    R"({"tid":"LiveToken","bind_sid":"sid","uid":0,"deadline":4102444800,"count":3,"function":"backup",)"
    R"("webapi_allow":{"Example.File":{"method":["get","list"]}},"extra":{"note":"\u001b[31m"}})",
    R"({"tid":"LastUseOf","uid":1000,"deadline":4102444800,"function":"share","webapi_allow":{"A":{}}})",
    R"({"tid":"Malformed","uid":-5,"deadline":9223372036854775807,"count":-1,"function":"share",)"
    R"("webapi_allow":{"A":{"method":[[]]},"B":[]}})",
    R"({"tid":"ExpiredIt","bind_sid":"sid","uid":77,"deadline":1,"count":0,"function":"old"})"};

void copy(sqlite3* pFrom, sqlite3* pTo)
{
    sqlite3_backup* pBackup = sqlite3_backup_init(pTo, "main", pFrom, "main");
    FUZZ_REQUIRE(pBackup && SQLITE_DONE == sqlite3_backup_step(pBackup, -1));
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_backup_finish(pBackup));
}

int isOk(void*, int, char** rgValue, char**)
{
    return 0 == std::string("ok").compare(rgValue[0]) ? 0 : 1;
}

} // namespace

namespace fuzz {

int runTool(tool::Commands& commands, std::vector<std::string> strArguments)
{
    std::vector<char*> rgArguments;
    for (std::string& strArgument : strArguments) {
        rgArguments.push_back(strArgument.data());
    }
    try {
        return commands.run(static_cast<int>(rgArguments.size()), rgArguments.data());
    } catch (const tool::Failure& failure) {
        tool::complain(failure.what());
        return failure.status();
    }
}

ToolStore::ToolStore() : m_pDb(openStore()), m_pFirst(nullptr)
{
    run("PRAGMA page_size = 1024");
    AccessTokenDbApi& db = store();
    for (const char* szToken : TOKENS) {
        Json::Value jToken = json(szToken);
        jToken["tid"] = tid(jToken["tid"].asString());
        jToken["create_time"] = 1;
        VEMO_ACCESS_TOKEN::fillDefaultValue(jToken, false);
        FUZZ_REQUIRE(0 == db.tokenCreate(jToken));
    }
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_open_v2(":memory:", &m_pFirst, SQLITE_OPEN_READWRITE, nullptr));
    copy(m_pDb, m_pFirst);
    m_strImage = image();
}

bool ToolStore::isChanged() const
{
    return image() != m_strImage;
}

Json::Value ToolStore::tokens() const
{
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(m_pDb, "PRAGMA integrity_check", isOk, nullptr, nullptr));
    return fuzz::tokens(store());
}

void ToolStore::restore()
{
    copy(m_pFirst, m_pDb);
    m_strImage = image();
}

void ToolStore::clear()
{
    run("DELETE FROM token");
}

std::string ToolStore::image() const
{
    sqlite3_int64 cbImage = 0;
    unsigned char* pImage = sqlite3_serialize(m_pDb, "main", &cbImage, 0);
    FUZZ_REQUIRE(pImage);
    const std::string strImage(reinterpret_cast<const char*>(pImage), static_cast<size_t>(cbImage));
    sqlite3_free(pImage);
    return strImage;
}

void ToolStore::run(const char* szSql) const
{
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(m_pDb, szSql, nullptr, nullptr, nullptr));
}

Input::Input(const std::string& strText)
    : m_pText(std::make_unique<std::stringbuf>(strText)), m_pBefore(std::cin.rdbuf(m_pText.get()))
{
}

Input::~Input()
{
    std::cin.rdbuf(m_pBefore);
}

} // namespace fuzz
