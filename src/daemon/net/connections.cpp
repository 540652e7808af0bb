#include "daemon/net/connections.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <new>
#include <span>
#include <utility>

#include "daemon/net/answering.h"
#include "daemon/net/connection.h"
#include "daemon/net/delays.h"
#include "daemon/net/stall_guard.h"
#include "daemon/request/handle_request.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr int64_t packet_ms = 3000;     // for a whole stream packet, however it trickles in
constexpr int64_t gap_ms = 1000;        // between two of its pieces
constexpr size_t most_unfinished = 64;  // packets, for which there is memory

constinit size_t unfinished = 0;

ssize_t receive(int fd, char* bytes, size_t size) {
    wait_before_receive();
    const stall_guard guard;
    ssize_t n = 0;
    do {
        n = recv(fd, bytes, size, MSG_DONTWAIT);
    } while (n < 0 && errno == EINTR);
    return n;
}

// The first receive of a packet, with what both kinds of connection make of its failures. Gives the
// size, or 0 when there is no packet; the connection may then be closed.
size_t receive_packet(connection& from, char* buffer, const char* kind) {
    const ssize_t n = receive(from.fd, buffer, receive_size);
    if (n < 0 && errno == EAGAIN) return 0;
    if (n < 0) {
        log_and_raise(tag, "recvfrom() error from client %d, %s", from.fd, strerror(errno));
        return 0;
    }
    if (n == 0) {
        close_connection(from);
        return 0;
    }
    const auto size = static_cast<size_t>(n);
    if (size > max_packet_size) {
        log_and_raise(tag, "Too large packet (%s) from client %d, dropping.", kind, from.fd);
        return 0;
    }
    buffer[size] = '\0';
    return size;
}

void handle_packet(connection& from, std::span<char> packet, const char* receiver) {
    packet.data()[packet.size()] = '\0';
    answer given = handle_request({from.fd, from.uid, nullptr}, packet);
    send_answer(from, std::move(given), packet.data(), receiver);
    if (from.answer) event_loop_tick(tend_connections);
}

bool is_whole(size_t size, const stream_header& header) {
    return size >= header.header_size + header.payload_size || size == receive_size;
}

// Handles the packet in `buffer` when it is just what its header announces.
void end_packet(connection& from, packet_buffer& buffer, size_t size, const stream_header& header) {
    const size_t wanted = header.header_size + header.payload_size;
    if (size < wanted) {
        log_and_raise(tag, "Client %d disconnected, no data from peer", from.fd);
    }
    if (size != wanted) {
        log_and_raise(tag, "Incomplete packet for stream from client %d, dropping.", from.fd);
        return;
    }
    handle_packet(from, {buffer.bytes.data() + header.header_size, header.payload_size},
                  "receive_stream_client");
}

std::unique_ptr<unfinished_packet> take_unfinished(connection& from) {
    --unfinished;
    return std::move(from.packet);
}

void end_unfinished(connection& from) {
    const std::unique_ptr<unfinished_packet> packet = take_unfinished(from);
    end_packet(from, packet->buffer, packet->size, packet->header);
}

void give_up_oldest() {
    connection* oldest = nullptr;
    for (connection* each = first_connection(); each != nullptr; each = each->next) {
        if (!each->packet) continue;
        if (oldest == nullptr || each->packet->deadline_ms < oldest->packet->deadline_ms) {
            oldest = each;
        }
    }
    if (oldest != nullptr) end_unfinished(*oldest);
}

// Keeps what has arrived of a packet until more comes.
void keep_unfinished(connection& from, packet_buffer& buffer, size_t size,
                     const stream_header& header) {
    if (unfinished == most_unfinished) give_up_oldest();
    from.packet.reset(new (std::nothrow) unfinished_packet);
    if (!from.packet) return end_packet(from, buffer, size, header);
    ++unfinished;
    const int64_t now_ms = monotonic_ms();
    from.packet->size = size;
    from.packet->header = header;
    from.packet->deadline_ms = now_ms + packet_ms;
    from.packet->gap_deadline_ms = now_ms + gap_ms;
    memcpy(from.packet->buffer.bytes.data(), buffer.bytes.data(), size);
    event_loop_tick(tend_connections);
}

void receive_more(connection& from) {
    unfinished_packet& packet = *from.packet;
    const ssize_t n =
        receive(from.fd, packet.buffer.bytes.data() + packet.size, receive_size - packet.size);
    if (n < 0 && errno == EAGAIN) return;
    if (n <= 0) return end_unfinished(from);
    packet.size += static_cast<size_t>(n);
    packet.gap_deadline_ms = monotonic_ms() + gap_ms;
    packet.deadline_ms += get_receive_delay();  // not the client's time
    if (is_whole(packet.size, packet.header)) end_unfinished(from);
}

// False, logged and raised, when the packet has no header that can be read.
bool check_header(const stream_header& header, int fd) {
    switch (header.status) {
        case stream_header_status::ok:
            return true;
        case stream_header_status::not_a_header:
            return log_and_raise(tag, "Invalid packet for stream from client %d, dropping.", fd);
        case stream_header_status::no_length:
            return log_and_raise(tag, "No length marked by client %d", fd);
        case stream_header_status::bad_length:
            return log_and_raise(tag, "Incorrect size of packet from client %d, dropping.", fd);
    }
    return false;
}

}  // namespace

void receive_seq_client(event_handler& handler) {
    auto& from = static_cast<connection&>(handler);
    if (from.answer) return continue_answer(from);
    char* const buffer = get_packet_buffers().packets.front().bytes.data();
    const size_t size = receive_packet(from, buffer, "seq");
    if (size > 0) handle_packet(from, {buffer, size}, "receive_seq_client");
}

void receive_stream_client(event_handler& handler) {
    auto& from = static_cast<connection&>(handler);
    if (from.answer) return continue_answer(from);
    if (from.packet) return receive_more(from);
    packet_buffer& buffer = get_packet_buffers().packets.front();
    const size_t size = receive_packet(from, buffer.bytes.data(), "stream");
    if (size == 0) return;
    const stream_header header = parse_stream_header(buffer.bytes.data());
    if (!check_header(header, from.fd)) return;
    is_whole(size, header) ? end_packet(from, buffer, size, header)
                           : keep_unfinished(from, buffer, size, header);
}

bool tend_connections(int64_t now_ms) {
    bool any_waits = false;
    for (connection* each = first_connection(); each != nullptr; each = each->next) {
        if (each->waiting) admit_connection(*each);
        if (each->answer) expire_answer(*each, now_ms);
        if (each->packet &&
            now_ms >= std::min(each->packet->deadline_ms, each->packet->gap_deadline_ms)) {
            end_unfinished(*each);
        }
        any_waits = any_waits || each->waiting || each->answer || each->packet;
    }
    return any_waits;
}

void connections_release() {
    while (connection* const each = first_connection()) {
        if (each->packet) (void)take_unfinished(*each);
        close_connection(*each);
    }
}

}  // namespace kivd
