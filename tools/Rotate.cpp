// rotate: gives a token a new id.

#include <algorithm>
#include <ctime>
#include <memory>

#include "Arguments.h"
#include "ChangedTokens.h"
#include "Commands.h"
#include "Console.h"
#include "Handover.h"
#include "Store.h"

namespace {

struct Options {
    std::string strTid;
    std::optional<int64_t> nGrace;
};

struct Rotation {
    std::string strTid; // the new id
    Json::Value jBefore;
    bool blKept = false;                    // whether the old token stays until its grace ends
    Json::Value jChange{Json::objectValue}; // to the old token
};

// Makes the copy, and deletes the old token or shortens its life, without committing yet.
std::unique_ptr<tool::Store> prepare(const std::string& strName, const Options& options, Rotation& rotation)
{
    auto pStore = std::make_unique<tool::Store>(tool::Store::Access::Write);
    const std::optional<Json::Value> jToken = pStore->findByPrefix(strName);
    if (!jToken) {
        pStore->commit();
        throw tool::noSuchToken();
    }
    const std::string strOld = (*jToken)["tid"].asString();
    if (pStore->token(strOld)->blExpired) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "the token has expired",
                            "\"vemo-access-token update\" can give it time");
    }
    rotation.jBefore = *jToken;
    const int64_t nNow = time(nullptr);
    pStore->copy(strOld, rotation.strTid, nNow);
    if (options.nGrace) {
        rotation.blKept = true;
        const int64_t nEnd = nNow + *options.nGrace;
        if (nEnd < (*jToken)["deadline"].asInt64()) {
            rotation.jChange["deadline"] = Json::Int64{nEnd};
            pStore->update(strOld, rotation.jChange);
        }
    } else {
        pStore->removeTid(strOld);
    }
    return pStore;
}

// Undoes the rotation. Nobody knows the new id, so nobody has used its token. What calls have done to the old
// token meanwhile stays.
std::string undo(tool::Store& store, const Rotation& rotation)
{
    if (!store.find(rotation.strTid)) {
        return "";
    }
    const std::string strOld = rotation.jBefore["tid"].asString();
    const bool blThere = store.find(strOld).has_value();
    if (!rotation.blKept && !blThere) {
        store.copy(rotation.strTid, strOld, rotation.jBefore["create_time"].asInt64());
    }
    if (blThere && !rotation.jChange.empty()) {
        Json::Value jDeadline;
        jDeadline["deadline"] = rotation.jBefore["deadline"];
        store.update(strOld, jDeadline);
    }
    store.removeTid(rotation.strTid);
    return "the change was taken back";
}

int rotate(const Options& options)
{
    Rotation rotation;
    const std::string strName = tool::readTid("TID", options.strTid);
    rotation.strTid = tool::newTid();
    const std::string strLine = tool::resultLine(rotation.strTid);
    auto pStore = prepare(strName, options, rotation);
    tool::handOver(std::move(pStore), strLine,
                   [&rotation](tool::Store& store) { return undo(store, rotation); });
    if (!rotation.blKept) {
        tool::outlastRevoked(std::set<std::string>{rotation.jBefore["tid"].asString()});
    } else if (!rotation.jChange.empty()) {
        tool::outlastUpdated(rotation.jBefore, rotation.jChange);
    }
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addRotate(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("rotate", "give a token a fresh id, and print that",
                                    [pOptions] { return rotate(*pOptions); });
    addTid(command, pOptions->strTid);
    addParsed(command, "--grace", "DURATION", pOptions->nGrace, parseDuration,
              "how long the old id stays valid, at most");
    command.example("- <id >new-id");
    command.example("- --grace 1h <id >new-id");
}

} // namespace tool
