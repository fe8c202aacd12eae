#include "Operations.h"

#include <iterator>

namespace {

const size_t USER_SIZE = 16;

typedef std::vector<Operation> Operations;
typedef std::vector<std::string> Texts;

// An argument that is a string: taken from the call, and put back as it is afterwards.
struct Text {
    explicit Text(Json::Value& jArgument) : str(jArgument.asString()), m_jArgument(jArgument) {}
    ~Text() { m_jArgument = str; }
    Text(const Text&) = delete;
    Text& operator=(const Text&) = delete;
    std::string str;

private:
    Json::Value& m_jArgument;
};

const char* textOrNull(const Json::Value& jArgument)
{
    return jArgument.isNull() ? nullptr : jArgument.asCString();
}

Texts textsOf(const Json::Value& jArgument)
{
    Texts strTexts;
    for (const Json::Value& jText : jArgument) {
        strTexts.push_back(jText.asString());
    }
    return strTexts;
}

// Arguments of the operations, by their names. Some serve several operations, which take what they need.

Json::Value drawNothing(Draws&)
{
    return Json::Value(Json::objectValue);
}

Json::Value drawNewTid(Draws&)
{
    Json::Value jCall;
    jCall["tid"] = "untouched";
    return jCall;
}

Json::Value drawTid(Draws& draws)
{
    Json::Value jCall;
    jCall["tid"] = draws.tid();
    jCall["out"] = "untouched";
    return jCall;
}

Json::Value drawSession(Draws& draws)
{
    Json::Value jCall;
    jCall["sid"] = draws.session();
    return jCall;
}

Json::Value drawSessionOrNull(Draws& draws)
{
    return draws.oneIn(20) ? Json::Value(Json::objectValue) : drawSession(draws);
}

Json::Value drawPurpose(Draws& draws)
{
    Json::Value jCall;
    jCall["function"] = draws.purpose();
    return jCall;
}

Json::Value drawCreation(Draws& draws)
{
    Json::Value jCall = drawNewTid(draws);
    jCall["uid"] = draws.uid();
    jCall["function"] = draws.purpose();
    jCall["option"] = draws.option();
    return jCall;
}

Json::Value drawCreationByTid(Draws& draws)
{
    Json::Value jCall = drawCreation(draws);
    jCall["tid"] = draws.newTid();
    return jCall;
}

Json::Value drawGrant(Draws& draws)
{
    Json::Value jCall = draws.grant();
    jCall["token"] = "untouched";
    return jCall;
}

Json::Value drawGrantWithUser(Draws& draws)
{
    const Json::UInt rgSize[] = {0, 1, 4, 5, USER_SIZE, USER_SIZE, USER_SIZE, USER_SIZE};
    Json::Value jCall = drawGrant(draws);
    jCall["size"] = rgSize[draws.below(std::size(rgSize))];
    jCall["user"] = draws.oneIn(8) ? Json::Value() : Json::Value(std::string(USER_SIZE, '?'));
    return jCall;
}

Json::Value drawRecord(Draws& draws)
{
    Json::Value jCall;
    jCall["token"] = draws.record();
    jCall["create"] = draws.oneIn(2);
    return jCall;
}

Json::Value drawUpdate(Draws& draws)
{
    Json::Value jCall = drawTid(draws);
    jCall["param"] = draws.param();
    return jCall;
}

Json::Value drawFilter(Draws& draws)
{
    Json::Value jCall;
    jCall["filter"] = draws.filter();
    jCall["out"] = draws.out();
    jCall["all"] = draws.oneIn(8);
    return jCall;
}

Json::Value drawTexts(Draws& draws)
{
    Json::Value jCall;
    jCall["name"] = draws.name();
    jCall["values"] = draws.texts();
    jCall["out"] = draws.out();
    return jCall;
}

Json::Value drawTextsForFilter(Draws& draws)
{
    Json::Value jCall = drawTexts(draws);
    jCall["out"] = draws.param();
    return jCall;
}

Json::Value drawText(Draws& draws)
{
    Json::Value jCall = drawTexts(draws);
    jCall["value"] = draws.oneIn(5) ? "1" : jCall["values"].get(0U, "-1");
    return jCall;
}

Json::Value drawFlag(Draws& draws)
{
    Json::Value jCall;
    jCall["log"] = draws.oneIn(2);
    return jCall;
}

template <typename Create>
int runCreation(Json::Value& jCall, Create create)
{
    unsigned int uid = jCall["uid"].asUInt();
    Text function(jCall["function"]);
    Text tid(jCall["tid"]);
    return create(uid, function.str, jCall["option"], tid.str);
}

template <typename Grant>
int runGrant(Json::Value& jCall, Grant grant)
{
    Text tid(jCall["tid"]);
    return grant(tid.str, textOrNull(jCall["webapi"]), textOrNull(jCall["method"]));
}

// An operation with one string for an argument.
template <typename Use>
int runText(Json::Value& jArgument, Use use)
{
    Text text(jArgument);
    return use(text.str);
}

Operations functionOperations()
{
    return {
        {"VemoAccessTokenCreate", 6, &drawCreation,
         [](auto& system, Json::Value& jCall) {
             return runCreation(jCall, [&](auto&... args) { return system.functions.create(args...); });
         }},
        {"VemoAccessTokenCreateByTid", 6, &drawCreationByTid,
         [](auto& system, Json::Value& jCall) {
             return runCreation(jCall, [&](auto&... args) { return system.functions.createByTid(args...); });
         }},
        {"VemoAccessTokenGenerate", 1, &drawNewTid,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["tid"], [&](std::string& str) { return system.functions.generate(str); });
         }},
        {"VemoAccessTokenGrantEx", 10, &drawGrant,
         [](auto& system, Json::Value& jCall) {
             return runGrant(
                 jCall, [&](auto&&... args) { return system.functions.grantEx(args..., jCall["token"]); });
         }},
        {"VemoAccessTokenGrant", 10, &drawGrantWithUser,
         [](auto& system, Json::Value& jCall) {
             const bool blNoUser = jCall["user"].isNull();
             Text user(jCall["user"]);
             return runGrant(jCall, [&](auto&&... args) {
                 return system.functions.grant(args..., blNoUser ? nullptr : user.str.data(),
                                               jCall["size"].asUInt());
             });
         }},
        {"VemoAccessTokenDeleteByTid", 3, &drawTid,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["tid"],
                            [&](std::string& str) { return system.functions.deleteByTid(str); });
         }},
        {"VemoAccessTokenDeleteByBindSid", 1, &drawSessionOrNull,
         [](auto& system, Json::Value& jCall) {
             return system.functions.deleteByBindSid(textOrNull(jCall["sid"]));
         }},
        {"VemoAccessTokenDeleteByFunction", 1, &drawPurpose,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["function"],
                            [&](std::string& str) { return system.functions.deleteByFunction(str); });
         }},
    };
}

Operations serviceChanges()
{
    return {
        {"tokenCreate", 30, &drawCreation,
         [](auto& system, Json::Value& jCall) {
             return runCreation(jCall, [&](auto&... args) { return system.service.tokenCreate(args...); });
         }},
        {"tokenCreateByTid", 60, &drawCreationByTid,
         [](auto& system, Json::Value& jCall) {
             return runCreation(jCall,
                                [&](auto&... args) { return system.service.tokenCreateByTid(args...); });
         }},
        {"tokenGrant", 50, &drawGrant,
         [](auto& system, Json::Value& jCall) {
             return runGrant(
                 jCall, [&](auto&&... args) { return system.service.tokenGrant(args..., jCall["token"]); });
         }},
        {"tokenCountDegrade", 10, &drawRecord,
         [](auto& system, Json::Value& jCall) { return system.service.tokenCountDegrade(jCall["token"]); }},
        {"tokenUpdateByTid", 40, &drawUpdate,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["tid"], [&](std::string& str) {
                 return system.service.tokenUpdateByTid(str, jCall["param"]);
             });
         }},
        {"tokenSaveByOverwrite", 20, &drawRecord,
         [](auto& system, Json::Value& jCall) {
             return system.service.tokenSaveByOverwrite(jCall["token"]);
         }},
    };
}

Operations serviceDeletions()
{
    return {
        {"tokenDeleteByTid", 6, &drawTid,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["tid"],
                            [&](std::string& str) { return system.service.tokenDeleteByTid(str); });
         }},
        {"tokenDeleteByBindSid", 2, &drawSession,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["sid"],
                            [&](std::string& str) { return system.service.tokenDeleteByBindSid(str); });
         }},
        {"tokenDeleteByFunction", 1, &drawPurpose,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["function"],
                            [&](std::string& str) { return system.service.tokenDeleteByFunction(str); });
         }},
        {"tokenDeleteByName", 4, &drawText,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["value"], [&](std::string& str) {
                 return system.service.tokenDeleteByName(str, textOrNull(jCall["name"]));
             });
         }},
        {"tokenDeleteByArray", 4, &drawTexts,
         [](auto& system, Json::Value& jCall) {
             Texts strValues = textsOf(jCall["values"]);
             return system.service.tokenDeleteByArray(strValues, textOrNull(jCall["name"]));
         }},
        {"tokenDeleteByTidArray", 6, &drawTexts,
         [](auto& system, Json::Value& jCall) {
             Texts strTids = textsOf(jCall["values"]);
             return system.service.tokenDeleteByTidArray(strTids);
         }},
        {"tokenDeleteAll", 1, &drawNothing,
         [](auto& system, Json::Value&) { return system.service.tokenDeleteAll(); }},
        {"cleanExpireToken", 4, &drawFlag,
         [](auto& system, Json::Value& jCall) {
             return system.service.cleanExpireToken(jCall["log"].asBool());
         }},
    };
}

Operations serviceLookups()
{
    return {
        {"tokenList", 50, &drawFilter,
         [](auto& system, Json::Value& jCall) {
             return system.service.tokenList(jCall["filter"], jCall["out"]);
         }},
        {"tokenGetByTid", 20, &drawTid,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["tid"], [&](std::string& str) {
                 return system.service.tokenGetByTid(str, jCall["out"]);
             });
         }},
        {"tokenGetByTidArray", 15, &drawTexts,
         [](auto& system, Json::Value& jCall) {
             Texts strTids = textsOf(jCall["values"]);
             return system.service.tokenGetByTidArray(strTids, jCall["out"]);
         }},
        {"VectorParamToJson", 3, &drawTextsForFilter,
         [](auto& system, Json::Value& jCall) {
             Texts strValues = textsOf(jCall["values"]);
             return system.service.VectorParamToJson(strValues, textOrNull(jCall["name"]), jCall["out"]);
         }},
    };
}

Operations storeOperations()
{
    return {
        {"tokenGet of the store", 30, &drawFilter,
         [](auto& system, Json::Value& jCall) {
             return system.store.tokenGet(jCall["filter"], jCall["out"]);
         }},
        {"tokenGetOne of the store", 15, &drawText,
         [](auto& system, Json::Value& jCall) {
             return runText(jCall["value"], [&](std::string& str) {
                 return system.store.tokenGetOne(textOrNull(jCall["name"]), str, jCall["out"]);
             });
         }},
        {"tokenDelete of the store", 5, &drawFilter,
         [](auto& system, Json::Value& jCall) {
             return system.store.tokenDelete(jCall["filter"], jCall["all"].asBool());
         }},
        {"tokenSave of the store", 30, &drawRecord,
         [](auto& system, Json::Value& jCall) {
             return system.store.tokenSave(jCall["token"], jCall["create"].asBool());
         }},
        {"cleanExpireToken of the store", 2, &drawFlag,
         [](auto& system, Json::Value& jCall) {
             return system.store.cleanExpireToken(jCall["log"].asBool());
         }},
    };
}

} // namespace

const Operations& operations()
{
    static const Operations all = [] {
        Operations joined;
        for (const auto pPart :
             {&functionOperations, &serviceChanges, &serviceDeletions, &serviceLookups, &storeOperations}) {
            const Operations part = pPart();
            joined.insert(joined.end(), part.begin(), part.end());
        }
        return joined;
    }();
    return all;
}
