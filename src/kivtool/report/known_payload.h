// Payloads of events whose messages are known here.
#pragma once

#include <string>

#include "report.pb.h"

namespace kivd {

// Whether events of that package and name hold a known message.
[[nodiscard]] bool is_of_known_kind(const kiv::Event& event);

// The payload as protobuf text in one line, "kernel.ProcessKill { pid: 7 }", with nothing in it
// that a terminal would act on. Empty when the event is not of a known kind or its payload cannot
// be decoded as that.
[[nodiscard]] std::string known_payload_text(const kiv::Event& event);

}  // namespace kivd
