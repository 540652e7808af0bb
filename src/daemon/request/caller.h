// Who sent a request, and what they may do.
#pragma once

#include <sys/types.h>

#include "daemon/request/request.h"

namespace kivd {

inline constexpr auto unknown_user = static_cast<uid_t>(-1);

// Whom the sender runs as; unknown_user without credentials.
[[nodiscard]] uid_t user_of(const request& r);

// Whether the sender runs under the daemon's own user id or holds the permission for private
// requests. A sender without credentials does not. A connection has the credentials of the moment
// when it was made. Users from outside a user namespace appear as 65534, so a daemon in one must
// not run as 65534 itself.
[[nodiscard]] bool check_caller_permission(const request& r);

}  // namespace kivd
