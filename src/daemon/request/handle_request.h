// The dispatcher of all requests. Format and commands: docs/requests.md.
#pragma once

#include <sys/socket.h>

#include <span>

#include "daemon/request/request.h"

namespace kivd {

// Carries out the request in `packet`, which a NUL and room for 64 bytes of reply follow, and which
// is changed on the way. `fd` is the connection, or -1 for a datagram, whose `message` then carries
// its sender's credentials.
[[nodiscard]] answer handle_request(int fd, std::span<char> packet, const msghdr* message);

}  // namespace kivd
