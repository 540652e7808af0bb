// Reports as protobuf text and as JSON.
#pragma once

#include <ostream>
#include <string>

#include "report.pb.h"

namespace kivd {

// Protobuf's text format behind a comment line that names the file, so that the whole can be
// encoded again. Behind the fields of an event whose payload is a known message, a comment line
// shows that.
void print_text(std::ostream& out, const std::string& path, const kiv::Report& report);

// One JSON document with the field names of the schema, in protobuf's mapping: 64-bit numbers are
// strings, bytes are base64. In strings, bytes that are not UTF-8 become \xHH and a backslash
// becomes two, since a JSON string can't hold the bytes and two names must not become one.
void print_json(std::ostream& out, const kiv::Report& report);

}  // namespace kivd
