#include <cstring>
#include <stdexcept>

#include "ModelCalls.h"
#include "gate/Batch.h"
#include "gate/Store.h"
#include "internal/JsonText.h"

namespace {

// The library replaces the row, which moves it to the end of the table; the gate updates it in place.
void moveToTheEnd(const std::string& strTid)
{
    AccessTokenDbApi db;
    db.initDb();
    grant::Statement move(db.m_pDb,
                          "UPDATE token SET rowid = (SELECT max(rowid) + 1 FROM token) WHERE tid = ?1");
    move.bind(1, strTid).step();
}

// The answer, and the gate's counters.
std::pair<gate::Reply, gate::Figures> call(const gate::Request& request)
{
    static gate::Store& store = *new gate::Store;
    static const std::function<gate::Owners::Owner(uid_t)> fOwner = [](uid_t) {
        return gate::Owners::Owner{gate::Owners::State::Known, "anybody"};
    };
    if (!store.begin()) {
        throw std::runtime_error("somebody holds the database");
    }
    gate::Batch batch(store.tokens(), fOwner);
    const gate::Reply answer = batch.call(request).value();
    batch.save();
    if (!store.commit()) {
        throw std::runtime_error("somebody reads the database");
    }
    return {answer, batch.figures()};
}

} // namespace

int grantAtTheGate(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jToken)
{
    gate::Request request;
    request.strTid = strTid;
    request.strApi = szWebapiName ? szWebapiName : "";
    request.strMethod = szWebapiMethod ? szWebapiMethod : "";
    request.blRecord = true;
    const auto askLibrary = [&] {
        return VemoAccessTokenGrantEx(strTid, szWebapiName, szWebapiMethod, jToken);
    };
    if (strlen(strTid.c_str()) != strTid.size() || strTid.empty() || request.strApi.empty()) {
        return askLibrary(); // a message cannot hold such a call
    }
    const auto [answer, figures] = call(request);
    if (figures[gate::REFUSED_OWNER] || figures[gate::REFUSED_LARGE]) {
        return askLibrary();
    }
    if (figures[gate::REFUSED_MALFORMED]) {
        const int nResult = askLibrary(); // the library refuses the call too, perhaps by an exception
        return 0 > nResult ? nResult : throw std::runtime_error("the gate alone finds it malformed");
    }
    // The gate purges from time to time, the library at each call.
    AccessTokenDbApi().cleanExpireToken(false);
    if (gate::Outcome::Granted != answer.outcome) {
        return -1;
    }
    jToken = Json::Value();
    VEMO_ACCESS_TOKEN::fromString(answer.strRecord, jToken);
    jToken["tid"] = std::string(strTid.c_str());
    if (jToken["count"].asInt64() >= 0) {
        moveToTheEnd(strTid);
    }
    return 0;
}
