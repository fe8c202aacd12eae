// The type of one field in the type table.

#ifndef VEMO_ACCESS_TOKEN_FIELD_TYPE_H
#define VEMO_ACCESS_TOKEN_FIELD_TYPE_H

#include <json/value.h>

#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// Returns the field's type name, or null when tokenType() has no such field. The table owns it.
const Json::Value* fieldType(std::string_view strField);

} // namespace VEMO_ACCESS_TOKEN

#endif
