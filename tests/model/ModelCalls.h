// The operations. Each can run on the library and on the model.

#ifndef TESTS_MODEL_CALLS_H
#define TESTS_MODEL_CALLS_H

#include <functional>
#include <string>
#include <vector>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "Model.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

// What the gate does instead of VemoAccessTokenGrantEx. Calls that the gate refuses on purpose go to the
// library.
int grantAtTheGate(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jToken);

struct Library : AccessTokenDbApi, AccessTokenApi {
    int (*pGrantEx)(std::string&, const char*, const char*, Json::Value&) = &VemoAccessTokenGrantEx;
};

// The outcome of an operation.
struct Outcome {
    int nResult = 0;
    std::string strThrown; // instead of a result
    Json::Value jCall;     // the arguments as they are afterwards

    bool operator==(const Outcome& other) const
    {
        return strThrown == other.strThrown && nResult == other.nResult && jCall == other.jCall;
    }
};

// Calls a function of the library, or of a Model. The arguments are the members of jCall with these names.
typedef std::vector<const char*> Names;
template <typename System>
using Call = std::function<int(System& system, Json::Value& jCall, const Names& szArguments)>;

struct Operation {
    Outcome run(Library& library, const Json::Value& jCall) const { return run(callLibrary, library, jCall); }
    Outcome run(Model& model, const Json::Value& jCall) const { return run(callModel, model, jCall); }

    const char* szName;
    size_t nWeight;    // how often it is drawn, compared with the others
    Names szArguments; // as Draws names them
    Call<Library> callLibrary;
    Call<Model> callModel;

private:
    template <typename System>
    Outcome run(const Call<System>& call, System& system, const Json::Value& jCall) const
    {
        Outcome outcome;
        outcome.jCall = jCall;
        try {
            outcome.nResult = call(system, outcome.jCall, szArguments);
        } catch (const Json::LogicError&) {
            outcome.strThrown = "Json::LogicError"; // its text is not part of the interface
        } catch (const std::exception& exception) {
            outcome.strThrown = exception.what();
        }
        return outcome;
    }
};

const std::vector<Operation>& operations();

#endif
