// Messages of the system log, as the payload of events: which of them the diagnostics store keeps.
#pragma once

#include <span>

namespace kivd {

// Whether the payload is a kiv.system_logging.LogMessage about an application that crashed or
// stopped responding, or about a call that failed. One that cannot be decoded, has no tag or is
// nested more than 64 levels deep has been logged and raised: the decoder recurses at each level,
// so a small payload could overflow the stack.
[[nodiscard]] bool is_kept_log_message(std::span<const char> payload);

}  // namespace kivd
