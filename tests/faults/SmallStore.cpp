#include "SmallStore.h"

#include <json/json.h>

#include <algorithm>

#include "Operations.h"
#include "ProcessState.h"

std::string makeSmallStore(const TokenStore& store, const std::string& strSettings)
{
    makeTable(store, "PRAGMA page_size = 512;" + strSettings);
    insertToken(store, "one", "'',0,4102444800,1,1,'VPN'");
    insertToken(store, "three", "'session',0,4102444800,3,1,'VPN'");
    insertToken(store, "expired", "'" + std::string(300, 'e') + "',0,1,5,1,'VPN'"); // over two pages
    return store.files().at(DATABASE);
}

std::string call(const std::string& strOperation)
{
    Log::clear();
    try {
        const int nResult = operationNamed(strOperation).run();
        const std::string strLine = Log::firstLine();
        const size_t nDetails = std::min(strLine.find(", err="), strLine.find(", jTokenParam="));
        return std::to_string(nResult) + (0 > nResult ? ": " + strLine.substr(0, nDetails) : "");
    } catch (const Json::Exception& exception) {
        return std::string("throws: ") + exception.what();
    }
}
