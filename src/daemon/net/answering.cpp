#include "daemon/net/answering.h"

#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "daemon/net/delays.h"
#include "runtime/log_and_raise.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr int64_t text_ms = 3000;
constexpr int64_t descriptor_ms = 1000;
constexpr int flags = MSG_NOSIGNAL | MSG_DONTWAIT;

ssize_t send_descriptor(int fd, int descriptor) {
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
    return sendmsg(fd, &message, flags);
}

// Sends what the client has room for. True when that was all; false, with errno set, when not.
bool send_now(int fd, unsent_answer& left) {
    while (left.descriptor.ok() || left.sent < left.size) {
        const ssize_t n = left.descriptor.ok() ? send_descriptor(fd, left.descriptor.get())
                                               : send(fd, left.text.data() + left.sent,
                                                      left.size - left.sent, flags);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) return false;
        if (left.descriptor.ok()) return true;
        left.sent += static_cast<size_t>(n);
    }
    return true;
}

void tell_failure(int fd, const unsent_answer& lost, int error) {
    if (lost.descriptor.ok()) {
        log_and_raise(tag, "Failed to send fd-message to client %d", fd);
    } else {
        log_and_raise(tag, "%s: failed to send to client %d, errno=%d (%s)", lost.receiver, fd,
                      error, strerror(error));
    }
}

void end_answer(connection& to) {
    to.answer.reset();
    event_loop_await(to, readiness::to_read);
}

}  // namespace

void send_answer(connection& to, answer given, const char* text, const char* receiver) {
    const int64_t time_ms = given.descriptor.ok() ? descriptor_ms : text_ms;
    unsent_answer left = {{}, given.size, 0, std::move(given.descriptor), receiver, 0};
    memcpy(left.text.data(), text, left.size);
    wait_before_send();
    if (send_now(to.fd, left)) return;
    const int error = errno;
    if (error == EAGAIN) {
        left.deadline_ms = monotonic_ms() + time_ms;
        to.answer.reset(new (std::nothrow) unsent_answer);
        if (to.answer) {
            *to.answer = std::move(left);
            return event_loop_await(to, readiness::to_write);
        }
    }
    tell_failure(to.fd, left, error);
}

void continue_answer(connection& to) {
    if (!send_now(to.fd, *to.answer)) {
        if (errno == EAGAIN) return;
        tell_failure(to.fd, *to.answer, errno);
    }
    end_answer(to);
}

void expire_answer(connection& to, int64_t now_ms) {
    // A socket counts as writable only when most of what it holds has been read.
    continue_answer(to);
    if (!to.answer || now_ms < to.answer->deadline_ms) return;
    tell_failure(to.fd, *to.answer, EAGAIN);
    end_answer(to);
}

}  // namespace kivd
