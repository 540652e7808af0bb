#include "conversation.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace libkiv {

using std::string_view;

namespace {

// A descriptor, or a negative errno value.
int connect_control(const kiv_handle& handle, int64_t deadline_ms) {
    const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    if (fd < 0) return -errno;
    int result;
    do {
        // bounds the wait for a place in the daemon's backlog; zero would mean for ever
        const int64_t left_ms = std::max<int64_t>(deadline_ms - now_ms(), 1);
        const timeval limit = {static_cast<time_t>(left_ms / 1000),
                               static_cast<suseconds_t>(left_ms % 1000 * 1000)};
        (void)setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
        result = connect_to(fd, handle.control_address);
    } while (result == -EINTR);
    if (result == 0) return fd;
    close(fd);
    return result == -EAGAIN ? -ETIMEDOUT : result;
}

// 0 or a negative errno value.
int send_before(int fd, const request& packet, int64_t deadline_ms) {
    if (packet.size() > request_size_max) return -EMSGSIZE;
    for (;;) {
        int result = packet.send_to(fd);
        if (result == -EAGAIN) {
            result = await(fd, POLLOUT, deadline_ms);
            if (result == 0) continue;
        }
        return is_peer_gone(result) ? -ECONNRESET : result;
    }
}

// The descriptor that came with a message for whose control part there was room for one; or -1.
int find_attached(msghdr& message) {
    const cmsghdr* header = CMSG_FIRSTHDR(&message);
    if (header == nullptr || header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS ||
        header->cmsg_len != CMSG_LEN(sizeof(int))) {
        return -1;
    }
    int fd;
    memcpy(&fd, CMSG_DATA(header), sizeof fd);
    return fd;
}

// 1 when there was a reply, 0 when the daemon has closed the connection, or a negative errno value.
int receive_before(int fd, reply& answer, int64_t deadline_ms) {
    for (;;) {
        const int result = await(fd, POLLIN, deadline_ms);
        if (result < 0) return result;
        iovec text = {answer.text, sizeof answer.text};
        alignas(cmsghdr) char control_part[CMSG_SPACE(sizeof(int))];
        msghdr message{};
        message.msg_iov = &text;
        message.msg_iovlen = 1;
        message.msg_control = control_part;
        message.msg_controllen = CMSG_LEN(sizeof(int));  // its padding would let a second one in
        const ssize_t size = recvmsg(fd, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
        if (size < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (size < 0) return -errno;
        answer.attached.fd = find_attached(message);
        if (size == 0) return 0;
        answer.size = static_cast<size_t>(size);
        if ((message.msg_flags & MSG_TRUNC) != 0) return -EPROTO;
        if ((message.msg_flags & MSG_CTRUNC) == 0) return 1;
        // the kernel drops the descriptors that don't fit, and all of them when we have too many
        return answer.attached.fd >= 0 ? -EPROTO : -EMFILE;
    }
}

}  // namespace

// "GD" goes before privileged requests and tells how the daemon sees the caller: answered with the
// device id, or not answered. A device id might look like a refusal, so a single answer only counts
// as one when nothing follows it; the daemon closes its end once it has read everything from a
// caller that will send no more.
int converse(const kiv_handle& handle, access needed,
             std::initializer_list<const request*> requests, string_view refusal, answers& got) {
    const int64_t deadline_ms = now_ms() + handle.timeout_ms.load(std::memory_order_relaxed);
    const owned_fd daemon(connect_control(handle, deadline_ms));
    if (daemon.fd < 0) return daemon.fd;

    int result = 0;
    if (needed == access::privileged) result = send_before(daemon.fd, {"GD"}, deadline_ms);
    for (const request* packet : requests) {
        if (result == 0 && packet) result = send_before(daemon.fd, *packet, deadline_ms);
    }
    if (result < 0) return result;
    (void)shutdown(daemon.fd, SHUT_WR);

    if (needed == access::privileged) {
        result = receive_before(daemon.fd, got.device_id, deadline_ms);
        if (result <= 0) return result < 0 ? result : -ECONNRESET;
    }
    result = receive_before(daemon.fd, got.last, deadline_ms);
    if (result != 0) return std::min(result, 0);
    const bool is_refused = needed == access::privileged && got.device_id.view() == refusal;
    return is_refused ? -EPERM : -ECONNRESET;
}

}  // namespace libkiv
