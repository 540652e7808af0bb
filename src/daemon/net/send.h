// Sending to clients.
#pragma once

#include <cstddef>

namespace kivd {

// Sends all `size` bytes; false, with errno set, when that fails. A client that does not read is
// waited for up to three seconds. Raises no signal.
[[nodiscard]] bool send_all(int fd, const char* bytes, size_t size);

// Sends the two bytes "OK" with a copy of `descriptor`, after the send delay. A failure has been
// logged and raised; a client that does not read is waited for up to one second.
void send_fd_message(int fd, int descriptor);

}  // namespace kivd
