// The operations that the test draws, each of which runs on the library and on the model.

#ifndef TESTS_MODEL_OPERATIONS_H
#define TESTS_MODEL_OPERATIONS_H

#include <functional>

#include "AccessTokenApi.h"
#include "Draws.h"
#include "Model.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

// The eight functions under the names that the model has for them.
struct LibraryFunctions {
    decltype(&VemoAccessTokenCreate) create = &VemoAccessTokenCreate;
    decltype(&VemoAccessTokenCreateByTid) createByTid = &VemoAccessTokenCreateByTid;
    decltype(&VemoAccessTokenGenerate) generate = &VemoAccessTokenGenerate;
    decltype(&VemoAccessTokenGrantEx) grantEx = &VemoAccessTokenGrantEx;
    decltype(&VemoAccessTokenGrant) grant = &VemoAccessTokenGrant;
    decltype(&VemoAccessTokenDeleteByTid) deleteByTid = &VemoAccessTokenDeleteByTid;
    decltype(&VemoAccessTokenDeleteByBindSid) deleteByBindSid = &VemoAccessTokenDeleteByBindSid;
    decltype(&VemoAccessTokenDeleteByFunction) deleteByFunction = &VemoAccessTokenDeleteByFunction;
};

struct Library {
    AccessTokenDbApi store;
    AccessTokenApi service;
    LibraryFunctions functions;
};

struct Operation {
    // run takes a Library or a Model, and the arguments.
    template <typename Run>
    Operation(const char* szOperation, size_t nTimes, Json::Value (*drawCall)(Draws&), Run run)
        : szName(szOperation), nWeight(nTimes), draw(drawCall), runOnLibrary(run), runOnModel(run)
    {
    }

    const char* szName;
    size_t nWeight;              // how often it is drawn, beside the others
    Json::Value (*draw)(Draws&); // its arguments, by their names
    // Return its result; the arguments are afterwards as the operation left them.
    std::function<int(Library&, Json::Value&)> runOnLibrary;
    std::function<int(Model&, Json::Value&)> runOnModel;
};

const std::vector<Operation>& operations();

#endif
