#include "daemon/net/datagrams.h"

#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <span>

#include "daemon/error/log_and_raise.h"
#include "daemon/net/delays.h"
#include "daemon/net/packet_buffer.h"
#include "daemon/request/handle_request.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";

// Nothing that we do needs a client's descriptors, and kept ones would soon be all there are.
void close_received_descriptors(msghdr& message) {
    for (cmsghdr* control = CMSG_FIRSTHDR(&message); control != nullptr;
         control = CMSG_NXTHDR(&message, control)) {
        if (control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_RIGHTS) continue;
        const size_t count = (control->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        for (size_t i = 0; i < count; ++i) {
            int fd = -1;
            memcpy(&fd, CMSG_DATA(control) + i * sizeof fd, sizeof fd);
            (void)close(fd);
        }
    }
}

void handle_datagram(int fd, std::span<char> packet, msghdr& message) {
    close_received_descriptors(message);
    if (packet.empty()) return;
    if (packet.size() > max_packet_size) {
        (void)log_and_raise(tag, "Too large packet (dgram) from client %d, dropping.", fd);
        return;
    }
    packet.data()[packet.size()] = '\0';
    (void)handle_request(-1, packet, &message);
}

}  // namespace

void receive_dgram_client(event_handler& handler) {
    packet_buffers& buffers = get_packet_buffers();
    std::array<iovec, max_batch> pieces;
    std::array<mmsghdr, max_batch> messages;
    for (size_t i = 0; i < max_batch; ++i) {
        pieces[i] = {buffers.packets[i].bytes.data(), receive_size};
        messages[i] = {};
        messages[i].msg_hdr.msg_iov = &pieces[i];
        messages[i].msg_hdr.msg_iovlen = 1;
        messages[i].msg_hdr.msg_control = buffers.controls[i].bytes.data();
        messages[i].msg_hdr.msg_controllen = control_size;
    }
    wait_before_receive();
    int received = 0;
    do {
        received = recvmmsg(handler.fd, messages.data(), has_receive_delay() ? 1 : max_batch,
                            MSG_DONTWAIT | MSG_CMSG_CLOEXEC, nullptr);
    } while (received < 0 && errno == EINTR);

    for (int i = 0; i < received; ++i) {
        const auto slot = static_cast<size_t>(i);
        handle_datagram(handler.fd, {buffers.packets[slot].bytes.data(), messages[slot].msg_len},
                        messages[slot].msg_hdr);
    }
}

}  // namespace kivd
