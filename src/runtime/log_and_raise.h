// Reporting a failure: into the log, and as a daemon error event.
#pragma once

namespace kivd {

// Logs at ERROR under `tag`, unless too many lines come from clients (runtime/client_lines.h), then
// raises "tag: text". Returns false, so that a failing function can
// end in `return log_and_raise(...)`. Keeps errno.
[[gnu::format(printf, 2, 3)]] bool log_and_raise(const char* tag, const char* format, ...);

}  // namespace kivd
