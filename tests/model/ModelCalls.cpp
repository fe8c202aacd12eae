#include "ModelCalls.h"

#include <utility>

namespace {

// A member of jCall as an argument of a parameter of any of these types. A text is written back after the
// call.
class Argument {
public:
    explicit Argument(Json::Value& jMember) : m_jMember(jMember) {}
    ~Argument()
    {
        if (m_blText) {
            m_jMember = m_strText;
        }
    }
    Argument(const Argument&) = delete;
    Argument& operator=(const Argument&) = delete;

    operator Json::Value&() { return m_jMember; }
    operator std::string&()
    {
        m_strText = m_jMember.asString();
        m_blText = true;
        return m_strText;
    }
    operator char*() { return m_jMember.isNull() ? nullptr : static_cast<std::string&>(*this).data(); }
    operator const char*() { return m_jMember.isNull() ? nullptr : m_jMember.asCString(); }
    operator std::vector<std::string>&()
    {
        for (const Json::Value& jText : m_jMember) {
            m_strTexts.push_back(jText.asString());
        }
        return m_strTexts;
    }
    operator unsigned int&() { return m_nNumber = m_jMember.asUInt(); }
    operator size_t() { return m_jMember.asUInt(); }
    operator bool() { return m_jMember.asBool(); }

private:
    Json::Value& m_jMember;
    bool m_blText = false;
    std::string m_strText;
    std::vector<std::string> m_strTexts;
    unsigned int m_nNumber = 0;
};

template <typename Function, size_t... I>
int invoke(const Function& function, [[maybe_unused]] Json::Value& jCall, const Names& szArguments,
           std::index_sequence<I...>)
{
    return function(Argument(jCall[szArguments.at(I)])...);
}

// A call of that function, or of that member of a Library or a Model.
template <typename System, typename... Parameters>
Call<System> on(int (*function)(Parameters...))
{
    return [=](System&, Json::Value& jCall, const Names& szArguments) {
        return invoke(function, jCall, szArguments, std::index_sequence_for<Parameters...>());
    };
}
template <typename System, typename Part, typename... Parameters>
Call<System> on(int (Part::*member)(Parameters...))
{
    return [=](System& system, Json::Value& jCall, const Names& szArguments) {
        const auto function = [&](Parameters... parameters) { return (system.*member)(parameters...); };
        return invoke(function, jCall, szArguments, std::index_sequence_for<Parameters...>());
    };
}

// The model's part of an exported function that purges first.
template <typename Member>
Call<Model> purged(Member member)
{
    return [=](Model& model, Json::Value& jCall, const Names& szArguments) {
        model.cleanExpireToken(false);
        return on<Model>(member)(model, jCall, szArguments);
    };
}

// Rows of the table: those of an exported function; and what is called by the same name on both.
#define EXPORTED(name, nWeight, model, ...)                                                                  \
    {                                                                                                        \
        "exported " #name, nWeight, {__VA_ARGS__}, on<Library>(&VemoAccessToken##name), model                \
    }
#define BOTH(Part, name) on<Library>(&Part::name), on<Model>(&Model::name)

} // namespace

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> all = {
        EXPORTED(Create, 6, purged(&Model::tokenCreate), "uid", "function", "option", "made"),
        EXPORTED(CreateByTid, 6, purged(&Model::tokenCreateByTid), "uid", "function", "option", "fresh"),
        EXPORTED(Generate, 1, on<Model>(&Model::tokenGenerate), "made"),
        {"exported GrantEx",
         10,
         {"granted", "webapi", "method", "answer"},
         [](Library& library, Json::Value& jCall, const Names& szArguments) {
             return on<Library>(library.pGrantEx)(library, jCall, szArguments);
         },
         purged(&Model::tokenGrant)},
        EXPORTED(Grant, 10, purged(&Model::grant), "granted", "webapi", "method", "user", "size"),
        EXPORTED(DeleteByTid, 3, purged(&Model::tokenDeleteByTid), "tid"),
        EXPORTED(DeleteByBindSid, 1, on<Model>(&Model::deleteByBindSid), "sid_or_null"),
        EXPORTED(DeleteByFunction, 1, purged(&Model::tokenDeleteByFunction), "function"),

        {"checkJsonType", 5, {"record"}, BOTH(VEMO_ACCESS_TOKEN, checkJsonType)},
        {"fillDefaultValue", 5, {"record", "flag"}, BOTH(VEMO_ACCESS_TOKEN, fillDefaultValue)},
        {"checkPermission", 5, {"record", "webapi", "method"}, BOTH(VEMO_ACCESS_TOKEN, checkPermission)},

        {"tokenCreate", 30, {"uid", "function", "option", "made"}, BOTH(AccessTokenApi, tokenCreate)},
        {"tokenCreateByTid",
         60,
         {"uid", "function", "option", "fresh"},
         BOTH(AccessTokenApi, tokenCreateByTid)},
        {"tokenGrant", 50, {"granted", "webapi", "method", "answer"}, BOTH(AccessTokenApi, tokenGrant)},
        {"tokenCountDegrade", 10, {"record"}, BOTH(AccessTokenApi, tokenCountDegrade)},
        {"tokenUpdateByTid", 40, {"tid", "param"}, BOTH(AccessTokenApi, tokenUpdateByTid)},
        {"tokenSaveByOverwrite", 20, {"record"}, BOTH(AccessTokenApi, tokenSaveByOverwrite)},
        {"tokenDeleteByTid", 6, {"tid"}, BOTH(AccessTokenApi, tokenDeleteByTid)},
        {"tokenDeleteByBindSid", 2, {"sid"}, BOTH(AccessTokenApi, tokenDeleteByBindSid)},
        {"tokenDeleteByFunction", 1, {"function"}, BOTH(AccessTokenApi, tokenDeleteByFunction)},
        {"tokenDeleteByName", 4, {"text", "name"}, BOTH(AccessTokenApi, tokenDeleteByName)},
        {"tokenDeleteByArray", 4, {"texts", "name"}, BOTH(AccessTokenApi, tokenDeleteByArray)},
        {"tokenDeleteByTidArray", 6, {"texts"}, BOTH(AccessTokenApi, tokenDeleteByTidArray)},
        {"tokenDeleteAll", 1, {}, BOTH(AccessTokenApi, tokenDeleteAll)},
        {"cleanExpireToken", 4, {"flag"}, BOTH(AccessTokenApi, cleanExpireToken)},
        {"tokenList", 50, {"filter", "list"}, BOTH(AccessTokenApi, tokenList)},
        {"tokenGetByTid", 20, {"tid", "answer"}, BOTH(AccessTokenApi, tokenGetByTid)},
        {"tokenGetByTidArray", 15, {"texts", "list"}, BOTH(AccessTokenApi, tokenGetByTidArray)},
        {"VectorParamToJson", 3, {"texts", "name", "param"}, BOTH(AccessTokenApi, VectorParamToJson)},

        {"tokenGet of the store", 30, {"filter", "list"}, BOTH(AccessTokenDbApi, tokenGet)},
        {"tokenGetOne of the store", 15, {"name", "text", "answer"}, BOTH(AccessTokenDbApi, tokenGetOne)},
        {"tokenDelete of the store", 5, {"filter", "rare_flag"}, BOTH(AccessTokenDbApi, tokenDelete)},
        {"tokenSave of the store", 30, {"record", "flag"}, BOTH(AccessTokenDbApi, tokenSave)},
        {"cleanExpireToken of the store", 2, {"flag"}, BOTH(AccessTokenDbApi, cleanExpireToken)},
    };
    return all;
}
