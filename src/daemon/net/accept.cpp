#include "daemon/net/accept.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <optional>
#include <utility>

#include "daemon/net/client_places.h"
#include "daemon/net/connection.h"
#include "daemon/net/connections.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr int64_t shortage_end_ms = 1000;  // it is over when nothing was short for so long

constinit int64_t last_short_ms = -shortage_end_ms;

void tell_shortage(int error) {
    const int64_t now_ms = monotonic_ms();
    const bool is_told = now_ms - std::exchange(last_short_ms, now_ms) < shortage_end_ms;
    if (!is_told) log_and_raise(tag, "Accept failed: %s.", strerror(error));
}

std::optional<uid_t> user_of(int fd) {
    ucred peer = {};
    socklen_t size = sizeof peer;
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return std::nullopt;
    return peer.uid;
}

// Left in the queue, clients would wake the loop again at once, for ever.
void leave_in_queue(event_handler& listener, int error) {
    tell_shortage(error);
    event_loop_pause(listener);
}

void accept_client(event_handler& listener, void (*callback)(event_handler&)) {
    if (!has_any_place()) return leave_in_queue(listener, EMFILE);
    unique_fd fd(accept4(listener.fd, nullptr, nullptr, SOCK_CLOEXEC));
    if (!fd.ok()) {
        if (errno == EAGAIN || errno == EINTR) return;  // it has hung up already
        return leave_in_queue(listener, errno);
    }
    const std::optional<uid_t> uid = user_of(fd.get());
    if (!uid) return;
    if (!has_place(*uid)) {
        tell_shortage(EMFILE);
        event_loop_tick(tend_connections);
    }
    // A byte out of band would wake the loop without being received.
    const int on = 1;
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_OOBINLINE, &on, sizeof on);
    add_connection(std::move(fd), callback, *uid);
}

}  // namespace

void accept_seq_client(event_handler& handler) { accept_client(handler, receive_seq_client); }

void accept_stream_client(event_handler& handler) { accept_client(handler, receive_stream_client); }

}  // namespace kivd
