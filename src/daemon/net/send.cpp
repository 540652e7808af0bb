#include "daemon/net/send.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <cerrno>
#include <cstring>

#include "daemon/net/delays.h"
#include "daemon/net/wait.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr int64_t reply_ms = 3000;  // for a whole reply
constexpr int64_t descriptor_ms = 1000;

}  // namespace

bool send_all(int fd, const char* bytes, size_t size) {
    const int64_t deadline_ms = monotonic_ms() + reply_ms;
    size_t sent = 0;
    while (sent < size) {
        const ssize_t n = send(fd, bytes + sent, size - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (n >= 0) {
            sent += static_cast<size_t>(n);
            continue;
        }
        if (errno == EINTR) continue;
        if (errno != EAGAIN) return false;
        if (!wait_for_client(fd, POLLOUT, deadline_ms)) {
            errno = EAGAIN;
            return false;
        }
    }
    return true;
}

void send_fd_message(int fd, int descriptor) {
    wait_before_send();
    char text[] = {'O', 'K'};
    iovec data = {text, sizeof text};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof descriptor)] = {};
    msghdr message = {};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    cmsghdr& header = *CMSG_FIRSTHDR(&message);
    header.cmsg_level = SOL_SOCKET;
    header.cmsg_type = SCM_RIGHTS;
    header.cmsg_len = CMSG_LEN(sizeof descriptor);
    memcpy(CMSG_DATA(&header), &descriptor, sizeof descriptor);

    const int64_t deadline_ms = monotonic_ms() + descriptor_ms;
    while (sendmsg(fd, &message, MSG_NOSIGNAL | MSG_DONTWAIT) < 0) {
        if (errno == EINTR) continue;
        if (errno == EAGAIN && wait_for_client(fd, POLLOUT, deadline_ms)) continue;
        log_and_raise(tag, "Failed to send fd-message to client %d", fd);
        return;
    }
}

}  // namespace kivd
