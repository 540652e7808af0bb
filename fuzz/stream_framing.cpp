// Framed requests over a stream: a client that sends the input in pieces, which are what stands
// between bars. The event loop is played here, and behind the last piece all time is over. So no
// input takes time.
#include "daemon/net/stream_framing.h"

#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <vector>

#include "daemon/loop/event_loop.h"
#include "daemon/net/accept.h"
#include "daemon/net/connections.h"
#include "daemon/net/packet_buffer.h"
#include "fuzz/harness.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char bar = '|';
constexpr std::string_view alive_request = "HD 2 IA";

constinit event_handler* connection = nullptr;  // the daemon's side
constinit int client_fd = -1;
std::string_view unsent;

void send_text(std::string_view text) {
    require(send(client_fd, text.data(), text.size(), MSG_NOSIGNAL) == std::ssize(text),
            "a client cannot send");
}

// False when all is sent.
bool send_next_piece() {
    unsent.remove_prefix(std::min(unsent.find_first_not_of(bar), unsent.size()));
    if (unsent.empty()) return false;
    const std::string_view piece = unsent.substr(0, unsent.find(bar));
    unsent.remove_prefix(piece.size());
    send_text(piece);
    return true;
}

// What the daemon has sent by now; it has room for the replies to one packet.
std::string_view receive_replies() {
    static constinit std::array<char, 256> replies = {};
    const ssize_t size = recv(client_fd, replies.data(), replies.size(), MSG_DONTWAIT);
    return {replies.data(), size > 0 ? static_cast<size_t>(size) : 0};
}

// As the loop does: calls the handler for as long as there is something to read.
void serve() {
    int unread = 0;
    while (connection != nullptr && ioctl(connection->fd, FIONREAD, &unread) == 0 && unread > 0) {
        (void)receive_replies();
        connection->callback(*connection);
    }
}

// The daemon's listening socket, which all inputs share.
struct listening_socket {
    unique_fd fd{socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)};
    sockaddr_un address = {AF_UNIX, {}};
    socklen_t address_size = sizeof address.sun_family;  // the system then finds a name

    listening_socket() {
        auto* const generic = reinterpret_cast<sockaddr*>(&address);
        const bool bound = bind(fd.get(), generic, address_size) == 0;
        address_size = sizeof address;
        require(
            bound && getsockname(fd.get(), generic, &address_size) == 0 && listen(fd.get(), 1) == 0,
            "no listening socket");
    }
};

unique_fd connect_client(const listening_socket& listening) {
    unique_fd client(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    require(connect(client.get(), reinterpret_cast<const sockaddr*>(&listening.address),
                    listening.address_size) == 0,
            "a client cannot connect");
    event_handler handler = {accept_stream_client, listening.fd.get()};
    handler.callback(handler);
    require(connection != nullptr, "a client is turned away");
    return client;
}

void check_header(input_bytes input) {
    std::vector<char> text(input.begin(), input.end());
    text.push_back('\0');
    const stream_header header = parse_stream_header(text.data());
    if (header.status != stream_header_status::ok) return;
    require(header.payload_size >= 1 && header.payload_size <= max_packet_size &&
                header.header_size <= strlen(text.data()) + 1,
            "a header is larger than what it was read from");
}

void check_connection(const listening_socket& listening, input_bytes input) {
    const unique_fd client = connect_client(listening);
    client_fd = client.get();
    unsent = {reinterpret_cast<const char*>(input.data()), input.size()};
    while (send_next_piece()) serve();
    require(!tend_connections(INT64_MAX), "a packet outlives its time");

    require(connection != nullptr, "a client is hung up on");
    (void)receive_replies();
    send_text(alive_request);
    serve();
    require(receive_replies() == "1", "a client has lost its connection's framing");
    connections_release();
    require(connection == nullptr, "a closed connection stays in the loop");

    const auto& next_buffer = get_packet_buffers().packets[1].bytes;
    require(std::all_of(next_buffer.begin(), next_buffer.end(), [](char c) { return c == '\0'; }),
            "a packet or reply has left its buffer");
}

}  // namespace

bool event_loop_add(event_handler& handler) {
    connection = &handler;
    return true;
}

void event_loop_remove(event_handler& /*handler*/) { connection = nullptr; }

void event_loop_await(event_handler& /*handler*/, readiness /*awaited*/) {}

void event_loop_pause(event_handler& /*handler*/) { require(false, "there is no room"); }

void event_loop_resume() {}

void event_loop_tick(tick_callback /*tick*/) {}

}  // namespace kivd

int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    using namespace kivd;
    static const listening_socket listening;
    static const bool mapped = packet_buffers_init();
    require(mapped, "no packet buffers");
    check_header({data, size});
    clear_files();
    const started_modules modules;
    check_connection(listening, {data, size});
    return 0;
}
