// Messages as JSON in protobuf's mapping: the field names of the schema, 64-bit numbers as strings,
// bytes in base64. In strings, bytes that are not UTF-8 become \xHH and a backslash becomes two,
// since a JSON string can't hold the bytes and two names must not become one.
#pragma once

#include <google/protobuf/message.h>

#include <string>
#include <string_view>

namespace kivd {

// All of these append to `to`.

void append_json_string(std::string& to, std::string_view text);

// `"name":value` for each field that is set, with commas between them.
void append_json_fields(std::string& to, const google::protobuf::Message& message);

// The value of a field that is no list.
void append_json_value(std::string& to, const google::protobuf::Message& message,
                       const google::protobuf::FieldDescriptor& field);

}  // namespace kivd
