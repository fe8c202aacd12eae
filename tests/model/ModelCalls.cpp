#include "ModelCalls.h"

#include <tuple>
#include <utility>

namespace {

// A member of jCall as an argument of the parameter's type. Strings are written back after the call.
template <typename Parameter>
struct Argument;

template <>
struct Argument<Json::Value&> {
    explicit Argument(Json::Value& jMember) : value(jMember) {}
    Json::Value& value;
};

template <>
struct Argument<std::string&> {
    explicit Argument(Json::Value& jMember) : value(jMember.asString()), j(jMember) {}
    ~Argument() { j = value; }
    Argument(const Argument&) = delete;
    Argument& operator=(const Argument&) = delete;
    std::string value;
    Json::Value& j;
};

// A buffer for a text, or null.
template <>
struct Argument<char*> {
    explicit Argument(Json::Value& jMember)
        : text(jMember), value(jMember.isNull() ? nullptr : text.value.data())
    {
    }
    Argument<std::string&> text;
    char* value;
};

template <>
struct Argument<const char*> {
    explicit Argument(Json::Value& jMember) : value(jMember.isNull() ? nullptr : jMember.asCString()) {}
    const char* value;
};

template <>
struct Argument<std::vector<std::string>&> {
    explicit Argument(Json::Value& jMember)
    {
        for (const Json::Value& jText : jMember) {
            value.push_back(jText.asString());
        }
    }
    std::vector<std::string> value;
};

template <>
struct Argument<unsigned int&> {
    explicit Argument(Json::Value& jMember) : value(jMember.asUInt()) {}
    unsigned int value;
};

template <>
struct Argument<size_t> : Argument<unsigned int&> {
    using Argument<unsigned int&>::Argument;
};

template <>
struct Argument<bool> {
    explicit Argument(Json::Value& jMember) : value(jMember.asBool()) {}
    bool value;
};

template <typename... Parameters>
struct Types {
};

template <typename Part, typename... Parameters>
Types<Parameters...> parametersOf(int (Part::*)(Parameters...));
template <typename Part, typename... Parameters>
Types<Parameters...> parametersOf(int (*Part::*)(Parameters...));

template <typename Part, typename Member, typename... Parameters, size_t... I>
int invoke(Part& part, Member member, Json::Value& jCall, const Names& szArguments, Types<Parameters...>,
           std::index_sequence<I...>)
{
    if (sizeof...(Parameters) != szArguments.size()) {
        throw std::logic_error("another number of arguments");
    }
    [[maybe_unused]] std::tuple<Argument<Parameters>...> arguments(jCall[szArguments[I]]...);
    return (part.*member)(std::get<I>(arguments).value...);
}

template <typename Part, typename Member, typename... Parameters>
int invoke(Part& part, Member member, Json::Value& jCall, const Names& szArguments,
           Types<Parameters...> types)
{
    return invoke(part, member, jCall, szArguments, types, std::index_sequence_for<Parameters...>());
}

// A call of that member of that part of a Library or a Model.
template <typename System, typename Part, typename Member>
Call<System> on(Part System::*part, Member member)
{
    return [=](System& system, Json::Value& jCall, const Names& szArguments) {
        return invoke(system.*part, member, jCall, szArguments, decltype(parametersOf(member))());
    };
}

#define ON_BOTH(part, name)                                                                                  \
    on(&Library::part, &decltype(Library::part)::name), on(&Model::part, &decltype(Model::part)::name)

} // namespace

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> all = {
        {"VemoAccessTokenCreate", 6, {"uid", "function", "option", "made"}, ON_BOTH(functions, create)},
        {"VemoAccessTokenCreateByTid",
         6,
         {"uid", "function", "option", "fresh"},
         ON_BOTH(functions, createByTid)},
        {"VemoAccessTokenGenerate", 1, {"made"}, ON_BOTH(functions, generate)},
        {"VemoAccessTokenGrantEx",
         10,
         {"granted", "webapi", "method", "answer"},
         ON_BOTH(functions, grantEx)},
        {"VemoAccessTokenGrant",
         10,
         {"granted", "webapi", "method", "user", "size"},
         ON_BOTH(functions, grant)},
        {"VemoAccessTokenDeleteByTid", 3, {"tid"}, ON_BOTH(functions, deleteByTid)},
        {"VemoAccessTokenDeleteByBindSid", 1, {"sid_or_null"}, ON_BOTH(functions, deleteByBindSid)},
        {"VemoAccessTokenDeleteByFunction", 1, {"function"}, ON_BOTH(functions, deleteByFunction)},

        {"checkJsonType", 5, {"record"}, ON_BOTH(rules, checkJsonType)},
        {"fillDefaultValue", 5, {"record", "flag"}, ON_BOTH(rules, fillDefaultValue)},
        {"checkPermission", 5, {"record", "webapi", "method"}, ON_BOTH(rules, checkPermission)},

        {"tokenCreate", 30, {"uid", "function", "option", "made"}, ON_BOTH(service, tokenCreate)},
        {"tokenCreateByTid", 60, {"uid", "function", "option", "fresh"}, ON_BOTH(service, tokenCreateByTid)},
        {"tokenGrant", 50, {"granted", "webapi", "method", "answer"}, ON_BOTH(service, tokenGrant)},
        {"tokenCountDegrade", 10, {"record"}, ON_BOTH(service, tokenCountDegrade)},
        {"tokenUpdateByTid", 40, {"tid", "param"}, ON_BOTH(service, tokenUpdateByTid)},
        {"tokenSaveByOverwrite", 20, {"record"}, ON_BOTH(service, tokenSaveByOverwrite)},
        {"tokenDeleteByTid", 6, {"tid"}, ON_BOTH(service, tokenDeleteByTid)},
        {"tokenDeleteByBindSid", 2, {"sid"}, ON_BOTH(service, tokenDeleteByBindSid)},
        {"tokenDeleteByFunction", 1, {"function"}, ON_BOTH(service, tokenDeleteByFunction)},
        {"tokenDeleteByName", 4, {"text", "name"}, ON_BOTH(service, tokenDeleteByName)},
        {"tokenDeleteByArray", 4, {"texts", "name"}, ON_BOTH(service, tokenDeleteByArray)},
        {"tokenDeleteByTidArray", 6, {"texts"}, ON_BOTH(service, tokenDeleteByTidArray)},
        {"tokenDeleteAll", 1, {}, ON_BOTH(service, tokenDeleteAll)},
        {"cleanExpireToken", 4, {"flag"}, ON_BOTH(service, cleanExpireToken)},
        {"tokenList", 50, {"filter", "list"}, ON_BOTH(service, tokenList)},
        {"tokenGetByTid", 20, {"tid", "answer"}, ON_BOTH(service, tokenGetByTid)},
        {"tokenGetByTidArray", 15, {"texts", "list"}, ON_BOTH(service, tokenGetByTidArray)},
        {"VectorParamToJson", 3, {"texts", "name", "param"}, ON_BOTH(service, VectorParamToJson)},

        {"tokenGet of the store", 30, {"filter", "list"}, ON_BOTH(store, tokenGet)},
        {"tokenGetOne of the store", 15, {"name", "text", "answer"}, ON_BOTH(store, tokenGetOne)},
        {"tokenDelete of the store", 5, {"filter", "rare_flag"}, ON_BOTH(store, tokenDelete)},
        {"tokenSave of the store", 30, {"record", "flag"}, ON_BOTH(store, tokenSave)},
        {"cleanExpireToken of the store", 2, {"flag"}, ON_BOTH(store, cleanExpireToken)},
    };
    return all;
}
