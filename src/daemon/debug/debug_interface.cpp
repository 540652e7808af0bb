#include "daemon/debug/debug_interface.h"

#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

#include "daemon/loop/event_loop.h"
#include "format/record_format.h"
#include "platform/android_log.h"
#include "runtime/client_lines.h"
#include "runtime/give_up.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-kivddi";
constexpr uint16_t port = 2305;
constexpr int listen_backlog = 5;
constexpr int most_reads = 16;        // of what a client sends, at a time
constexpr size_t frame_size = 31196;  // of the largest request packet

void accept_debug_client(event_handler& handler);
void read_debug_client(event_handler& handler);

constinit event_handler listener = {accept_debug_client, -1};
constinit event_handler client = {read_debug_client, -1};

void close_handler(event_handler& handler) {
    if (handler.fd < 0) return;
    event_loop_remove(handler);
    (void)close(handler.fd);
    handler.fd = -1;
}

void close_client() { close_handler(client); }

// A new client takes the place of the one before.
void accept_debug_client(event_handler& handler) {
    const int fd = accept4(handler.fd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (fd < 0) {
        if (errno != EAGAIN) event_loop_pause(handler);
        return;
    }
    close_client();
    client.fd = fd;
    if (!event_loop_add(client)) close_client();
}

// One that keeps sending is only read now and then.
void read_debug_client(event_handler& handler) {
    std::array<char, 4096> unwanted;
    for (int reads = 0; reads < most_reads; ++reads) {
        const ssize_t size = recv(handler.fd, unwanted.data(), unwanted.size(), MSG_DONTWAIT);
        if (size < 0 && errno == EAGAIN) return;
        if (size <= 0) return close_client();
    }
    event_loop_pause(handler);
}

}  // namespace

void debug_start() {
    listener.fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (listener.fd < 0) give_up(tag, "Failed to create di-socket: %s", strerror(errno));
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    if (bind(listener.fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        give_up(tag, "Cannot bind to di-socket - port already used? %s", strerror(errno));
    }
    if (listen(listener.fd, listen_backlog) != 0 || !event_loop_add(listener)) {
        give_up(tag, "Failed to listen to di-socket: %s", strerror(errno));
    }
}

void debug_release() {
    close_client();
    close_handler(listener);
}

bool debug_has_client() { return client.fd >= 0; }

void debug_mirror_request(std::span<const char> packet) {
    if (!debug_has_client()) return;
    static constinit std::array<uint8_t, frame_size> frame = {};
    const size_t size = pack_debug_frame(frame, reinterpret_cast<const uint8_t*>(packet.data()),
                                         static_cast<uint32_t>(packet.size()));
    const ssize_t sent = send(client.fd, frame.data(), size, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (sent < 0) {
        if (take_line()) {
            __android_log_print(ANDROID_LOG_ERROR, tag, "Fail to send to socket: %s",
                                strerror(errno));
        }
        return;
    }
    // Without the rest of a frame it could not find the next one.
    if (static_cast<size_t>(sent) < size) close_client();
}

}  // namespace kivd
