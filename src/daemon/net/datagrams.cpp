#include "daemon/net/datagrams.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <span>

#include "daemon/debug/debug_interface.h"
#include "daemon/net/delays.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/net/stall_guard.h"
#include "daemon/request/handle_request.h"
#include "runtime/log_and_raise.h"
#include "store/events.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// Room for the sender's credentials, which come first, and for no descriptor: the kernel drops
// those that are attached, so they never become ours.
struct alignas(cmsghdr) control_buffer {
    std::array<char, CMSG_SPACE(sizeof(ucred))> bytes;
};

void handle_datagram(int fd, std::span<char> packet, const msghdr& message) {
    if (packet.empty()) return;
    if (packet.size() > max_packet_size) {
        log_and_raise(tag, "Too large packet (dgram) from client %d, dropping.", fd);
        return;
    }
    packet.data()[packet.size()] = '\0';
    (void)handle_request({-1, 0, &message}, packet);
}

// A delay is meant for each packet, and a debug client sees a packet when the one before it has
// been stored.
bool takes_one() { return get_receive_delay() > 0 || debug_has_client(); }

int receive_batch(int fd, std::span<mmsghdr> messages) {
    const auto wanted = static_cast<unsigned>(takes_one() ? 1 : messages.size());
    const stall_guard guard;
    int received = 0;
    do {
        received = recvmmsg(fd, messages.data(), wanted, MSG_DONTWAIT | MSG_CMSG_CLOEXEC, nullptr);
    } while (received < 0 && errno == EINTR);
    return received;
}

}  // namespace

bool receive_datagrams(int fd) {
    packet_buffers& buffers = get_packet_buffers();
    std::array<control_buffer, max_batch> controls;
    std::array<iovec, max_batch> pieces;
    std::array<mmsghdr, max_batch> messages;
    for (size_t i = 0; i < max_batch; ++i) {
        pieces[i] = {buffers.packets[i].bytes.data(), receive_size};
        messages[i] = {};
        messages[i].msg_hdr.msg_iov = &pieces[i];
        messages[i].msg_hdr.msg_iovlen = 1;
        messages[i].msg_hdr.msg_control = controls[i].bytes.data();
        messages[i].msg_hdr.msg_controllen = controls[i].bytes.size();
    }
    wait_before_receive();
    const int received = receive_batch(fd, messages);

    const event_batch batch;
    for (int i = 0; i < received; ++i) {
        const auto slot = static_cast<size_t>(i);
        handle_datagram(fd, {buffers.packets[slot].bytes.data(), messages[slot].msg_len},
                        messages[slot].msg_hdr);
    }
    // Each comes with credentials; a socket that takes no more gives messages without.
    return received > 0 && messages[0].msg_hdr.msg_controllen > 0;
}

void receive_dgram_client(event_handler& handler) { (void)receive_datagrams(handler.fd); }

}  // namespace kivd
