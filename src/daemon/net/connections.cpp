#include "daemon/net/connections.h"

#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "daemon/loop/turn_away.h"
#include "daemon/net/delays.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/net/send.h"
#include "daemon/net/stream_framing.h"
#include "daemon/net/wait.h"
#include "daemon/request/handle_request.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr int64_t stream_packet_ms = 3000;  // for a whole packet, however it trickles in
constexpr int64_t receive_timeout_ms = 1000;
constexpr rlim_t reserved_descriptors = 16;  // for reports, saves and all else that opens files

struct connection : event_handler {
    connection* previous;
    connection* next;
};

constinit connection* connections = nullptr;  // owns them

bool add_connection(unique_fd fd, void (*callback)(event_handler&)) {
    auto* const added = static_cast<connection*>(malloc(sizeof(connection)));
    if (added == nullptr) return false;
    *added = {{callback, fd.get()}, nullptr, connections};
    if (!event_loop_add(*added)) {
        free(added);
        return false;
    }
    (void)fd.release();
    if (connections != nullptr) connections->previous = added;
    connections = added;
    return true;
}

// Leaves the loop before the close: a forked child may hold a copy of the descriptor, and the loop
// would go on reporting it.
void close_connection(event_handler& handler) {
    auto& closed = static_cast<connection&>(handler);
    const stall_guard guard;
    event_loop_remove(closed);
    (void)close(closed.fd);
    (closed.previous != nullptr ? closed.previous->next : connections) = closed.next;
    if (closed.next != nullptr) closed.next->previous = closed.previous;
    free(&closed);
}

// Whether the daemon keeps this descriptor for its own work.
bool is_reserved(int fd) {
    rlimit limit = {};
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return false;
    const rlim_t kept = std::min(reserved_descriptors, limit.rlim_cur / 4);
    return static_cast<rlim_t>(fd) >= limit.rlim_cur - kept;
}

void accept_client(int listening_fd, void (*callback)(event_handler&)) {
    unique_fd fd(accept4(listening_fd, nullptr, nullptr, SOCK_CLOEXEC));
    if (!fd.ok()) {
        if (errno == EAGAIN) return;  // it has hung up already
        log_and_raise(tag, "Accept failed: %s.", strerror(errno));
        return turn_away_client(listening_fd);
    }
    if (is_reserved(fd.get())) {
        log_and_raise(tag, "Accept failed: %s.", strerror(EMFILE));
        return;
    }
    set_socket_timeouts(fd.get());
    // A byte out of band would wake the loop without being received.
    const int on = 1;
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_OOBINLINE, &on, sizeof on);
    (void)add_connection(std::move(fd), callback);
}

ssize_t receive(int fd, char* bytes, size_t size) {
    wait_before_receive();
    const stall_guard guard;
    ssize_t n = 0;
    do {
        n = recv(fd, bytes, size, MSG_DONTWAIT);
    } while (n < 0 && errno == EINTR);
    return n;
}

// Receives the start of a packet, for both kinds of connection. Returns its size, or 0 when there
// is no packet; the connection may then be closed.
size_t receive_packet(event_handler& handler, char* buffer, const char* kind) {
    const ssize_t n = receive(handler.fd, buffer, receive_size);
    if (n < 0 && errno == EAGAIN) return 0;
    if (n < 0) {
        log_and_raise(tag, "recvfrom() error from client %d, %s", handler.fd, strerror(errno));
        return 0;
    }
    if (n == 0) {
        close_connection(handler);
        return 0;
    }
    const auto size = static_cast<size_t>(n);
    if (size > max_packet_size) {
        log_and_raise(tag, "Too large packet (%s) from client %d, dropping.", kind, handler.fd);
        return 0;
    }
    buffer[size] = '\0';
    return size;
}

void handle_packet(int fd, std::span<char> packet, const char* receiver) {
    packet.data()[packet.size()] = '\0';
    const answer given = handle_request(fd, packet, nullptr);
    if (given.descriptor.ok()) return send_fd_message(fd, given.descriptor.get());
    if (given.size == 0) return;
    wait_before_send();
    if (send_all(fd, packet.data(), given.size)) return;
    const int error = errno;
    log_and_raise(tag, "%s: failed to send to client %d, errno=%d (%s)", receiver, fd, error,
                  strerror(error));
}

void receive_seq_client(event_handler& handler) {
    char* const buffer = get_packet_buffers().packets.front().bytes.data();
    const size_t size = receive_packet(handler, buffer, "seq");
    if (size > 0) handle_packet(handler.fd, {buffer, size}, "receive_seq_client");
}

// Reads on until `buffer` holds at least `wanted` bytes. Returns how many it holds: fewer when the
// client stopped sending, more when more came at once.
size_t receive_rest(int fd, char* buffer, size_t size, size_t wanted) {
    int64_t deadline_ms = monotonic_ms() + stream_packet_ms;
    while (size < wanted && size < receive_size) {
        const int64_t gap_end_ms = monotonic_ms() + receive_timeout_ms;
        if (!wait_for_client(fd, POLLIN, std::min(deadline_ms, gap_end_ms))) break;
        const ssize_t n = receive(fd, buffer + size, receive_size - size);
        if (n <= 0) break;
        size += static_cast<size_t>(n);
        deadline_ms += get_receive_delay();  // not the client's time
    }
    return size;
}

void receive_stream_client(event_handler& handler) {
    char* const buffer = get_packet_buffers().packets.front().bytes.data();
    const size_t first_size = receive_packet(handler, buffer, "stream");
    if (first_size == 0) return;

    const int fd = handler.fd;
    const stream_header header = parse_stream_header(buffer);
    switch (header.status) {
        case stream_header_status::ok:
            break;
        case stream_header_status::not_a_header:
            log_and_raise(tag, "Invalid packet for stream from client %d, dropping.", fd);
            return;
        case stream_header_status::no_length:
            log_and_raise(tag, "No length marked by client %d", fd);
            return;
        case stream_header_status::bad_length:
            log_and_raise(tag, "Incorrect size of packet from client %d, dropping.", fd);
            return;
    }
    const size_t wanted = header.header_size + header.payload_size;
    const size_t size = receive_rest(fd, buffer, first_size, wanted);
    if (size < wanted) {
        log_and_raise(tag, "Client %d disconnected, no data from peer", fd);
    }
    if (size != wanted) {
        log_and_raise(tag, "Incomplete packet for stream from client %d, dropping.", fd);
        return;
    }
    handle_packet(fd, {buffer + header.header_size, header.payload_size}, "receive_stream_client");
}

}  // namespace

void accept_seq_client(event_handler& handler) { accept_client(handler.fd, receive_seq_client); }

void accept_stream_client(event_handler& handler) {
    accept_client(handler.fd, receive_stream_client);
}

void set_socket_timeouts(int fd) {
    const timeval timeout = {receive_timeout_ms / 1000, 0};
    if (setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout) == 0 &&
        setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout) == 0) {
        return;
    }
    const int error = errno;
    log_and_raise(tag, "%s: failed to set socket timeouts, errno=%d (%s)", "set_socket_timeouts",
                  error, strerror(error));
}

void connections_release() {
    while (connections != nullptr) close_connection(*connections);
}

}  // namespace kivd
