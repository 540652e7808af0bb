// The dispatcher of all requests. Format and commands: docs/requests.md.
#pragma once

#include <sys/socket.h>

#include <span>

#include "daemon/request/request.h"

namespace kivd {

// Carries out the request in `packet`, which a NUL and room for 64 bytes of reply follow, and which
// is changed on the way.
[[nodiscard]] answer handle_request(const request_sender& sender, std::span<char> packet);

}  // namespace kivd
