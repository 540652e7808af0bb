// Waiting for a client, for a bounded time.
#pragma once

#include <cstdint>

namespace kivd {

// Waits until `fd` is ready for `events` (POLLIN, POLLOUT), up to a moment of the monotonic clock.
// False when that moment has come, or when the daemon is to stop.
[[nodiscard]] bool wait_for_client(int fd, short events, int64_t deadline_ms);

// While it lives, a timer cuts short whatever blocks for more than a second. It does so only where
// the kernel cannot refuse descriptors that clients attach: closing those may block.
class stall_guard {
 public:
    stall_guard();
    ~stall_guard();
    stall_guard(const stall_guard&) = delete;
    stall_guard& operator=(const stall_guard&) = delete;
};

// Has the kernel refuse descriptors that clients attach (SO_PASSRIGHTS, Linux 6.16), or else
// switches the stall guards on: receives leave no room for descriptors, so the kernel drops them,
// but that can be made to block.
void refuse_descriptors(int fd);

}  // namespace kivd
