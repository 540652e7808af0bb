// Sending to clients.
#pragma once

#include <sys/types.h>

#include <cstddef>

namespace kivd {

// Sends all `size` bytes; gives `size`, or -1 with errno set. A client that does not read is
// waited for up to three seconds. Raises no signal.
[[nodiscard]] ssize_t send_all(int fd, const char* bytes, size_t size);

// Sends the two bytes "OK" with a copy of `descriptor`, after the send delay. 1, or 0 on failure,
// which has been logged and raised; a client that does not read is waited for up to one second.
int send_fd_message(int fd, int descriptor);

}  // namespace kivd
