#include "daemon/net/send.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>

namespace kivd {
namespace {

constexpr int max_attempts = 3;
constexpr useconds_t attempt_interval_us = 500;

}  // namespace

ssize_t send_all(int fd, const char* bytes, size_t size) {
    size_t sent = 0;
    int attempts_left = max_attempts;
    while (sent < size) {
        const ssize_t n = send(fd, bytes + sent, size - sent, MSG_NOSIGNAL);
        if (n >= 0) {
            sent += static_cast<size_t>(n);
            attempts_left = max_attempts;
            continue;
        }
        if (errno == EINTR) continue;
        --attempts_left;
        if (errno != EAGAIN) return -1;
        usleep(attempt_interval_us);
        errno = EAGAIN;
        if (attempts_left == 0) return -1;
    }
    return static_cast<ssize_t>(size);
}

}  // namespace kivd
