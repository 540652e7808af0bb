// The one door to fork.
#pragma once

#include <sys/types.h>

#include <cstdint>

namespace kivd {

// The descriptor that children hold open beside 0 to 2: the daemon's lock, so that no new daemon
// starts while a child of an old one is still at work.
void set_inherited_descriptor(int fd);

// Raises the limit of open descriptors as far as it goes: each client takes one. Programs that we
// start get the original limit back.
void raise_descriptor_limit();

enum class child_kind : uint8_t {
    worker,   // keeps the flag-only stop handler, so that it ends its work
    program,  // calls exec_program; no signal reaches it before that has succeeded
};

// fork(), while no other thread is inside the log or the error facility, so the child may log and
// raise errors. It has lost every descriptor but 0 to 2 and the inherited one (close_range, Linux
// 5.9), so a client that hangs up is gone at once, whatever a child is doing. It has to end with
// _exit.
[[nodiscard]] pid_t fork_child(child_kind kind);

// In such a child: becomes the program `arguments` begins with, which starts with default signal
// dispositions, an empty mask and environment, and descriptors 0 to 2. Returns only when that
// failed, with errno set.
void exec_program(const char* const* arguments);

// Waits until the child `pid` has ended, if there is one, and forgets it (-1). The system reaps it.
void wait_for_child(pid_t& pid);

}  // namespace kivd
