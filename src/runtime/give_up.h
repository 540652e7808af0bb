// Ending the process when it cannot start.
#pragma once

namespace kivd {

// Logs at ERROR under `tag` and exits with status 1.
[[gnu::format(printf, 2, 3), noreturn]] void give_up(const char* tag, const char* format, ...);

}  // namespace kivd
