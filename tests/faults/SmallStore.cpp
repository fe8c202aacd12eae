#include "SmallStore.h"

#include <json/json.h>
#include <sqlite3.h>

#include <algorithm>

#include "AccessTokenApi.h"
#include "EnvironmentOutcome.h"
#include "ProcessState.h"
#include "internal/AccessTokenDbApi.h"

namespace {

void insert(const TokenStore& store, const std::string& strName, const std::string& strColumns)
{
    std::string strTid = "known-" + strName;
    strTid.resize(VEMO_ATOKEN_LENGTH_MIN, 'x');
    store.run("INSERT INTO token VALUES ('" + strTid + "'," + strColumns +
              R"(,'{"Example.Api":{"method":["get"]}}','{"note":"n"}'))");
}

int list(std::string& strListed)
{
    AccessTokenApi api;
    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    const int nResult = api.tokenList(jFilter, jTokens);
    strListed = jTokens.toStyledString();
    return 0 > nResult ? nResult : static_cast<int>(jTokens.size());
}

int run(const std::string& strName, std::string& strListed)
{
    if ("listing" == strName) {
        return list(strListed);
    }
    const char* szOperation = "grant" == strName      ? "grant of one use of three"
                              : "creation" == strName ? "creation under a given id"
                                                      : "deletion by id";
    return operationNamed(szOperation).run();
}

} // namespace

std::string makeSmallStore(const TokenStore& store, const std::string& strSettings)
{
    store.setFiles({{DATABASE, ""}});
    std::string strSql;
    AccessTokenDbApi().SqlExpandCreateTable(strSql);
    store.run("PRAGMA page_size = 512;" + strSettings + strSql);
    insert(store, "one", "'',0,4102444800,1,1,'VPN'");
    insert(store, "three", "'session',0,4102444800,3,1,'VPN'");
    insert(store, "expired", "'" + std::string(300, 'e') + "',0,1,5,1,'VPN'"); // over two pages
    return store.files().at(DATABASE);
}

Answer call(const std::string& strName)
{
    Log::clear();
    Answer answer = {-1, false, "", ""};
    try {
        answer.nResult = run(strName, answer.strListed);
        answer.strText = std::to_string(answer.nResult);
        if (0 > answer.nResult) {
            const std::string strLine = firstLine(Log::text());
            answer.strText +=
                ": " + strLine.substr(0, std::min(strLine.find(", err="), strLine.find(", jTokenParam=")));
        }
    } catch (const Json::Exception& exception) {
        answer.blThrown = true;
        answer.strText = std::string("throws: ") + exception.what();
    }
    return answer;
}

std::string valueOfThree(const TokenStore& store, const std::string& strExpression)
{
    sqlite3* pDb = nullptr;
    sqlite3_stmt* pStatement = nullptr;
    const std::string strSql = "SELECT " + strExpression + " FROM token WHERE tid LIKE 'known-three%'";
    sqlite3_open_v2(store.path().c_str(), &pDb, SQLITE_OPEN_READONLY, "unix");
    sqlite3_prepare_v2(pDb, strSql.c_str(), -1, &pStatement, nullptr);
    const bool blThere = SQLITE_ROW == sqlite3_step(pStatement);
    const std::string strValue =
        blThere ? reinterpret_cast<const char*>(sqlite3_column_text(pStatement, 0)) : "gone";
    sqlite3_finalize(pStatement);
    sqlite3_close(pDb);
    return strValue;
}
