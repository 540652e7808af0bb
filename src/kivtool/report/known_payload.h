// Messages on one line, and the payloads of events whose message is known.
#pragma once

#include <google/protobuf/message.h>

#include <string>

#include "report.pb.h"

namespace kivd {

// The fields as protobuf text, each followed by a blank.
[[nodiscard]] std::string one_line(const google::protobuf::Message& message);

// Whether the message of such events is known, judging by package and name.
[[nodiscard]] bool is_of_known_kind(const kiv::Event& event);

// The payload as protobuf text on one line, "kernel.ProcessKill { pid: 7 }", safe for a terminal.
// Empty when the message is not known or the payload cannot be decoded as one.
[[nodiscard]] std::string known_payload_text(const kiv::Event& event);

}  // namespace kivd
