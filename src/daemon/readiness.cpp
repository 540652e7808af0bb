#include "daemon/readiness.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "util/unique_fd.h"

namespace kivd {

void tell_service_manager(const char* state) {
    const char* const variable = getenv("NOTIFY_SOCKET");
    const std::string_view name = variable != nullptr ? variable : "";
    sockaddr_un address = {AF_UNIX, {}};
    if (name.size() < 2 || name.size() >= sizeof address.sun_path) return;
    name.copy(address.sun_path, name.size());
    if (name.front() == '@') address.sun_path[0] = '\0';
    const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size());
    const unique_fd fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!fd.ok()) return;
    (void)sendto(fd.get(), state, strlen(state), MSG_NOSIGNAL,
                 reinterpret_cast<const sockaddr*>(&address), size);
}

}  // namespace kivd
