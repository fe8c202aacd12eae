#include "ModelCalls.h"

#include <utility>

namespace {

// A member of jCall as an argument of a parameter of any of these types. A text is written back behind the
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

template <typename Part, typename... Parameters>
std::index_sequence_for<Parameters...> indexes(int (Part::*)(Parameters...));
template <typename Part, typename... Parameters>
std::index_sequence_for<Parameters...> indexes(int (*Part::*)(Parameters...));

template <typename Part, typename Member, size_t... I>
int invoke(Part& part, Member member, [[maybe_unused]] Json::Value& jCall, const Names& szArguments,
           std::index_sequence<I...>)
{
    if (sizeof...(I) != szArguments.size()) {
        throw std::logic_error("another number of arguments");
    }
    return (part.*member)(Argument(jCall[szArguments[I]])...);
}

// A call of that member of that part of a Library or a Model.
template <typename System, typename Part, typename Member>
Call<System> on(Part System::*part, Member member)
{
    return [=](System& system, Json::Value& jCall, const Names& szArguments) {
        return invoke(system.*part, member, jCall, szArguments, decltype(indexes(member))());
    };
}

#define BOTH(part, name)                                                                                     \
    on(&Library::part, &decltype(Library::part)::name), on(&Model::part, &decltype(Model::part)::name)

} // namespace

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> all = {
        {"exported Create", 6, {"uid", "function", "option", "made"}, BOTH(functions, create)},
        {"exported CreateByTid", 6, {"uid", "function", "option", "fresh"}, BOTH(functions, createByTid)},
        {"exported Generate", 1, {"made"}, BOTH(functions, generate)},
        {"exported GrantEx", 10, {"granted", "webapi", "method", "answer"}, BOTH(functions, grantEx)},
        {"exported Grant", 10, {"granted", "webapi", "method", "user", "size"}, BOTH(functions, grant)},
        {"exported DeleteByTid", 3, {"tid"}, BOTH(functions, deleteByTid)},
        {"exported DeleteByBindSid", 1, {"sid_or_null"}, BOTH(functions, deleteByBindSid)},
        {"exported DeleteByFunction", 1, {"function"}, BOTH(functions, deleteByFunction)},

        {"checkJsonType", 5, {"record"}, BOTH(rules, checkJsonType)},
        {"fillDefaultValue", 5, {"record", "flag"}, BOTH(rules, fillDefaultValue)},
        {"checkPermission", 5, {"record", "webapi", "method"}, BOTH(rules, checkPermission)},

        {"tokenCreate", 30, {"uid", "function", "option", "made"}, BOTH(service, tokenCreate)},
        {"tokenCreateByTid", 60, {"uid", "function", "option", "fresh"}, BOTH(service, tokenCreateByTid)},
        {"tokenGrant", 50, {"granted", "webapi", "method", "answer"}, BOTH(service, tokenGrant)},
        {"tokenCountDegrade", 10, {"record"}, BOTH(service, tokenCountDegrade)},
        {"tokenUpdateByTid", 40, {"tid", "param"}, BOTH(service, tokenUpdateByTid)},
        {"tokenSaveByOverwrite", 20, {"record"}, BOTH(service, tokenSaveByOverwrite)},
        {"tokenDeleteByTid", 6, {"tid"}, BOTH(service, tokenDeleteByTid)},
        {"tokenDeleteByBindSid", 2, {"sid"}, BOTH(service, tokenDeleteByBindSid)},
        {"tokenDeleteByFunction", 1, {"function"}, BOTH(service, tokenDeleteByFunction)},
        {"tokenDeleteByName", 4, {"text", "name"}, BOTH(service, tokenDeleteByName)},
        {"tokenDeleteByArray", 4, {"texts", "name"}, BOTH(service, tokenDeleteByArray)},
        {"tokenDeleteByTidArray", 6, {"texts"}, BOTH(service, tokenDeleteByTidArray)},
        {"tokenDeleteAll", 1, {}, BOTH(service, tokenDeleteAll)},
        {"cleanExpireToken", 4, {"flag"}, BOTH(service, cleanExpireToken)},
        {"tokenList", 50, {"filter", "list"}, BOTH(service, tokenList)},
        {"tokenGetByTid", 20, {"tid", "answer"}, BOTH(service, tokenGetByTid)},
        {"tokenGetByTidArray", 15, {"texts", "list"}, BOTH(service, tokenGetByTidArray)},
        {"VectorParamToJson", 3, {"texts", "name", "param"}, BOTH(service, VectorParamToJson)},

        {"tokenGet of the store", 30, {"filter", "list"}, BOTH(store, tokenGet)},
        {"tokenGetOne of the store", 15, {"name", "text", "answer"}, BOTH(store, tokenGetOne)},
        {"tokenDelete of the store", 5, {"filter", "rare_flag"}, BOTH(store, tokenDelete)},
        {"tokenSave of the store", 30, {"record", "flag"}, BOTH(store, tokenSave)},
        {"cleanExpireToken of the store", 2, {"flag"}, BOTH(store, cleanExpireToken)},
    };
    return all;
}
