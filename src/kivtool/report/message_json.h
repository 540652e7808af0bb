// Messages as JSON in protobuf's mapping: the field names of the schema, 64-bit numbers as strings,
// bytes in base64.
#pragma once

#include <google/protobuf/message.h>

#include "toolkit/json.h"

namespace kivd {

// The value of a field that is not repeated.
[[nodiscard]] json field_json(const google::protobuf::Message& message,
                              const google::protobuf::FieldDescriptor& field);

// Adds a member to `object` for each field that is set.
void add_fields(json& object, const google::protobuf::Message& message);

}  // namespace kivd
