// What the type table says of one field.

#ifndef VEMO_ACCESS_TOKEN_FIELD_TYPE_H
#define VEMO_ACCESS_TOKEN_FIELD_TYPE_H

#include <json/value.h>

#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// The field's type name, or null when tokenType() has no such field. It belongs to the table.
const Json::Value* fieldType(std::string_view strField);

} // namespace VEMO_ACCESS_TOKEN

#endif
