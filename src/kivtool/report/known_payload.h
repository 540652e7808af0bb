// Messages in one line, and those that are known to be payloads of events.
#pragma once

#include <google/protobuf/message.h>

#include <string>

#include "report.pb.h"

namespace kivd {

// The fields as protobuf text, each with a blank behind it.
[[nodiscard]] std::string one_line(const google::protobuf::Message& message);

// Whether events of that package and name hold a known message.
[[nodiscard]] bool is_of_known_kind(const kiv::Event& event);

// The payload as protobuf text in one line, "kernel.ProcessKill { pid: 7 }", with nothing in it
// that a terminal would act on. Empty when the event is not of a known kind or its payload cannot
// be decoded as that.
[[nodiscard]] std::string known_payload_text(const kiv::Event& event);

}  // namespace kivd
