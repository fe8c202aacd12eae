#include "internal/Fields.h"

#include <map>

#include "AccessTokenUtil.h"
#include "internal/JsonAccess.h"

using namespace VEMO_ACCESS_TOKEN;

namespace {

// Returns the fields in the order in which an object keeps its members. Never destroyed, like the blank
// record, because exit handlers may still use the library.
const std::map<std::string_view, Field>& fieldsByName()
{
    static const auto& fields = *new std::map<std::string_view, Field>{
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) {#name, FIELD_##name},
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
    };
    return fields;
}

// Returns a record with all fields, which are null. Its copies point to the names in the library, which is
// therefore never unloaded.
Json::Value blankRecord()
{
    Json::Value jRecord(Json::objectValue);
    for (const auto& [strName, field] : fieldsByName()) {
        jRecord[Json::StaticString(strName.data())] = Json::Value();
    }
    return jRecord;
}

} // namespace

namespace VEMO_ACCESS_TOKEN {

const Json::Value* fieldType(std::string_view strField)
{
    const Json::Value* pEntry = findMember(tokenType(), strField);
    return pEntry ? &(*pEntry)[0U] : nullptr;
}

FieldMembers fieldMembers(const Json::Value& jObject)
{
    FieldMembers rgMember;
    if (!jObject.isObject()) {
        findMember(jObject, ""); // throws unless it is null
    }
    auto it = jObject.begin();
    const auto end = jObject.end();
    for (const auto& [strName, field] : fieldsByName()) {
        rgMember[field] = findNext(it, end, strName);
    }
    return rgMember;
}

Columns addFields(Json::Value& jRecord, int n_column, char** column_name)
{
    if (FIELDS != n_column) {
        return {};
    }
    static const Json::Value& jBlank = *new Json::Value(blankRecord());
    Columns rgColumn;
    const auto rgEntry = fieldMembers(tokenType());
    Json::Value jNew = jBlank;
    auto it = jNew.begin();
    for (const auto& [strName, field] : fieldsByName()) {
        if (!column_name[field] || strName != column_name[field]) {
            return {};
        }
        rgColumn[field] = {rgEntry[field], &*it++};
    }
    jRecord.swap(jNew);
    return rgColumn;
}

} // namespace VEMO_ACCESS_TOKEN
