// The fields of token records: their order, their types, and their members of one record.

#ifndef VEMO_ACCESS_TOKEN_FIELDS_H
#define VEMO_ACCESS_TOKEN_FIELDS_H

#include <json/value.h>

#include <array>
#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// The fields in the order of the field list, and their number.
enum Field {
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) FIELD_##name,
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
    FIELDS
};

// Returns the field's type name, or null when tokenType() has no such field. The table owns it.
const Json::Value* fieldType(std::string_view strField);

// Returns the members of an object, or of null, that are fields; null for a missing one. Finds them faster
// than findMember does, and throws Json::LogicError as it does.
typedef std::array<const Json::Value*, FIELDS> FieldMembers;
FieldMembers fieldMembers(const Json::Value& jObject);

// What a column of a row is decoded with. Null: still to be found.
struct Column {
    const Json::Value* pEntry; // in tokenType()
    Json::Value* pMember;      // of the record
};

// Adds all fields to an empty record, and finds the columns of a row, if these are the fields in their order.
// That is faster than one by one. Otherwise returns nulls.
typedef std::array<Column, FIELDS> Columns;
Columns addFields(Json::Value& jRecord, int n_column, char** column_name);

} // namespace VEMO_ACCESS_TOKEN

#endif
