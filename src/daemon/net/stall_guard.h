// Bounding what a client's attached descriptors may cost.
#pragma once

namespace kivd {

// While it lives, a timer cuts short whatever blocks for more than a second. It does so only where
// the kernel cannot refuse descriptors that clients attach: letting go of those may block.
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
