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

// How a column of a row is decoded. A null pointer means that it is not known yet.
struct Column {
    const Json::Value* pEntry; // in tokenType()
    Json::Value* pMember;      // of the record
};

// If the columns of a row are the fields in their order, adds all fields to the empty record and returns how
// the columns are decoded. This is faster than one by one. Otherwise returns null pointers.
typedef std::array<Column, FIELDS> Columns;
Columns addFields(Json::Value& jRecord, int n_column, char** column_name);

} // namespace VEMO_ACCESS_TOKEN

#endif
