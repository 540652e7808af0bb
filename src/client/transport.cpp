#include "transport.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <ctime>

namespace libkiv {

int request::send_to(int fd) const {
    msghdr message{};
    message.msg_iov = const_cast<iovec*>(parts_);
    message.msg_iovlen = count_;
    while (sendmsg(fd, &message, MSG_DONTWAIT | MSG_NOSIGNAL) < 0) {
        if (errno != EINTR) return -errno;
    }
    return 0;
}

int64_t now_ms() {
    timespec now;
    clock_gettime(CLOCK_MONOTONIC, &now);
    return int64_t{now.tv_sec} * 1000 + now.tv_nsec / 1'000'000;
}

int await(int fd, short events, int64_t deadline_ms) {
    for (;;) {
        const int64_t left_ms = deadline_ms - now_ms();
        if (left_ms <= 0) return -ETIMEDOUT;
        pollfd entry = {fd, events, 0};
        const int ready = poll(&entry, 1, static_cast<int>(std::min<int64_t>(left_ms, INT_MAX)));
        if (ready > 0) return 0;
        if (ready < 0 && errno != EINTR) return -errno;
    }
}

bool is_peer_gone(int error) {
    // a send that meets a dead daemon also cuts the connection, and the next sender finds it cut
    return error == -ECONNREFUSED || error == -ENOTCONN || error == -ECONNRESET || error == -EPIPE;
}

int make_address(const char* directory, const char* name, sockaddr_un& address) {
    address = {};
    address.sun_family = AF_UNIX;
    const size_t directory_size = strnlen(directory, sizeof address.sun_path);
    if (directory_size == 0) return -EINVAL;
    const size_t slash_size = directory[directory_size - 1] == '/' ? 0 : 1;
    const size_t name_size = strlen(name) + 1;  // with its NUL
    if (directory_size + slash_size + name_size > sizeof address.sun_path) return -ENAMETOOLONG;
    memcpy(address.sun_path, directory, directory_size);
    memcpy(address.sun_path + directory_size, "/", slash_size);
    memcpy(address.sun_path + directory_size + slash_size, name, name_size);
    return 0;
}

int connect_to(int fd, const sockaddr_un& address) {
    const auto* generic = reinterpret_cast<const sockaddr*>(&address);
    return connect(fd, generic, sizeof address) == 0 ? 0 : -errno;
}

}  // namespace libkiv
