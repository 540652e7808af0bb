#include "daemon/net/client_sockets.h"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "daemon/loop/event_loop.h"
#include "daemon/net/accept.h"
#include "daemon/net/connections.h"
#include "daemon/net/datagrams.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/net/stall_guard.h"
#include "runtime/give_up.h"
#include "util/paths.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr mode_t socket_mode = 0622;
constexpr int listen_backlog = 5;

struct client_socket {
    int type;
    const char* name;
    event_handler handler;
};
constinit client_socket client_sockets[] = {
    {SOCK_DGRAM, paths::datagram_socket, {receive_dgram_client, -1}},
    {SOCK_SEQPACKET, paths::sequenced_packet_socket, {accept_seq_client, -1}},
    {SOCK_STREAM, paths::stream_socket, {accept_stream_client, -1}},
};

// Logs what failed with the system error, and ends the process.
[[noreturn]] void give_up_to(const char* what) {
    give_up(tag, "Failed to %s: %s", what, strerror(errno));
}

int create_socket(int type, const char* name) {
    // Non-blocking: no callback may wait for a client that is already gone.
    unique_fd fd(socket(AF_UNIX, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!fd.ok()) give_up_to("create AF_UNIX socket");
    refuse_descriptors(fd.get());
    if (type == SOCK_DGRAM) {  // before the first packet can arrive
        const int on = 1;
        // Else descriptors would take the room that is meant for credentials.
        if (setsockopt(fd.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on) != 0) {
            give_up_to("receive credentials");
        }
    }

    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    strncpy(address.sun_path, name, sizeof address.sun_path - 1);
    if (unlink(name) != 0 && errno != ENOENT) give_up_to("unlink socket");
    if (bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        give_up_to("bind to socket");
    }
    (void)chmod(name, socket_mode);
    if (type != SOCK_DGRAM && listen(fd.get(), listen_backlog) != 0) {
        give_up_to("listen to uds-socket");
    }
    return fd.release();
}

}  // namespace

void create_client_sockets() {
    if (!packet_buffers_init()) give_up_to("map packet buffers");
    for (client_socket& each : client_sockets) {
        each.handler.fd = create_socket(each.type, each.name);
        if (!event_loop_add(each.handler)) give_up_to("add socket to epoll");
    }
}

void finish_datagrams() {
    event_handler& datagrams = client_sockets[0].handler;
    // From now on sends fail, so what has been sent is not more than one queue holds.
    (void)shutdown(datagrams.fd, SHUT_RD);
    while (receive_datagrams(datagrams.fd)) {
    }
}

void remove_client_sockets() {
    for (const client_socket& each : client_sockets) (void)unlink(each.name);
    for (client_socket& each : client_sockets) {
        event_loop_remove(each.handler);
        (void)close(each.handler.fd);
        each.handler.fd = -1;
    }
    connections_release();
    packet_buffers_release();
}

}  // namespace kivd
