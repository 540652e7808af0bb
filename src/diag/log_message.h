// Messages of the system log, as the payload of events: which of them the diagnostics store keeps.
#pragma once

#include <span>

namespace kivd {

// Whether the payload is a kiv.system_logging.LogMessage about an application that crashed or
// stopped responding, or about a call that failed. One that cannot be decoded (see
// format/protobuf_message.h) or has no tag has been logged and raised.
[[nodiscard]] bool is_kept_log_message(std::span<const char> payload);

}  // namespace kivd
