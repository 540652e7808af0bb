// Faults in single system calls. A thread of this process is asked about each call that has to do
// with files (seccomp's notifications); it lets it through, fails it, or kills who makes it.
#pragma once

#include <climits>
#include <string>
#include <vector>

namespace kivd {

// A call goes by who makes it, its name, its path and how many of these its process has made:
// "daemon write private/events 3", "child rename private/flushed_data.compacted 1".
struct fault {
    std::string call;
    long result = 0;    // what the call gives; -EIO, or `killed`
    std::string later;  // also to those from then on: a regular expression, as "write .*"
};
inline constexpr long killed = LONG_MIN;  // the process, ahead of the call

// Once in a process: what this thread starts from now on is asked about. False when the kernel
// doesn't permit that.
[[nodiscard]] bool inject(fault wanted);
[[nodiscard]] bool was_injected();
void end_injection();
// All that were made up to the end, in their order; what several children do alike, once.
[[nodiscard]] const std::vector<std::string>& recorded_calls();

}  // namespace kivd
