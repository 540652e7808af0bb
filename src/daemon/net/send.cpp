#include "daemon/net/send.h"

#include <poll.h>
#include <sys/socket.h>

#include <cerrno>

#include "daemon/net/wait.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr int64_t reply_ms = 3000;  // for a whole reply

}  // namespace

ssize_t send_all(int fd, const char* bytes, size_t size) {
    const int64_t deadline_ms = monotonic_ms() + reply_ms;
    size_t sent = 0;
    while (sent < size) {
        const ssize_t n = send(fd, bytes + sent, size - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (n >= 0) {
            sent += static_cast<size_t>(n);
            continue;
        }
        if (errno == EINTR) continue;
        if (errno != EAGAIN) return -1;
        if (!wait_for_client(fd, POLLOUT, deadline_ms)) {
            errno = EAGAIN;
            return -1;
        }
    }
    return static_cast<ssize_t>(size);
}

}  // namespace kivd
