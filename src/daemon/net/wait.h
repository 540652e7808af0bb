// Waiting for a client, for a bounded time.
#pragma once

#include <cstdint>

namespace kivd {

// Waits until `fd` is ready for `events` (POLLIN, POLLOUT), up to a moment of the monotonic clock.
// False when that has come, or when the daemon is to stop.
[[nodiscard]] bool wait_for_client(int fd, short events, int64_t deadline_ms);

// While it lives, a timer cuts short whatever blocks for more than a second. It does so only where
// the kernel cannot refuse descriptors that clients attach: letting go of those may block.
class stall_guard {
 public:
    stall_guard();
    ~stall_guard();
    stall_guard(const stall_guard&) = delete;
    stall_guard& operator=(const stall_guard&) = delete;
};

// Refuses descriptors on the socket, or else switches the stall guards on.
void refuse_descriptors(int fd);

}  // namespace kivd
