// Who sent a request, and what they may do.
#pragma once

#include "daemon/request/request.h"

namespace kivd {

// Whether the sender runs under the daemon's own user id or holds the permission for private
// requests. A sender without credentials does not.
[[nodiscard]] bool check_caller_permission(const request& r);

}  // namespace kivd
