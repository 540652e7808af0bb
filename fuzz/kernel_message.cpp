// What comes over netlink, to whose port any local user can send.
#include <linux/netlink.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>

#include "daemon/kernel/kernel_bridge.h"
#include "fuzz/harness.h"
#include "util/paths.h"

namespace kivd {
namespace {

struct bridge {
    daemon_socket daemon;
    unique_fd requests;  // what the daemon would get
    unique_fd netlink;
    unique_fd kernel;
};

void open_bridge(bridge& opened) {
    require(open_daemon_socket(opened.daemon) && open_netlink_socket(opened.netlink), "no sockets");
    strcpy(opened.daemon.address.sun_path, paths::datagram_socket);
    const auto* const address = reinterpret_cast<const sockaddr*>(&opened.daemon.address);
    opened.requests.reset(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    (void)unlink(paths::datagram_socket);
    require(bind(opened.requests.get(), address, sizeof opened.daemon.address) == 0, "no address");
    opened.kernel.reset(socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_USERSOCK));
}

bool send(const bridge& to, input_bytes message) {
    sockaddr_nl port = {};
    port.nl_family = AF_NETLINK;
    port.nl_pid = static_cast<uint32_t>(getpid());
    return sendto(to.kernel.get(), message.data(), message.size(), MSG_DONTWAIT,
                  reinterpret_cast<const sockaddr*>(&port), sizeof port) >= 0;
}

// Nothing but translated events and counters goes on to the daemon.
void check_passed_on(const bridge& from) {
    std::array<char, 70000> buffer;
    const ssize_t size = recv(from.requests.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (size < 0) return;
    std::string_view passed(buffer.data(), static_cast<size_t>(size));
    passed.remove_prefix(std::min(passed.find_first_not_of(' '), passed.size()));
    const std::string_view command = passed.substr(0, passed.find(' '));
    require(command == "EV" || command == "CI" || command == "CS", "a command is passed on");
}

}  // namespace
}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    static bridge opened;
    if (!opened.netlink.ok()) open_bridge(opened);
    suppress_errors();
    if (!send(opened, {data, size})) return -1;
    receive_kernel_message(opened.netlink.get(), opened.daemon);
    check_passed_on(opened);
    return 0;
}
