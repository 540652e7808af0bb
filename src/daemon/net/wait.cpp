#include "daemon/net/wait.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "runtime/stop.h"
#include "util/clock.h"

namespace kivd {
namespace {

#ifndef SO_PASSRIGHTS
constexpr int SO_PASSRIGHTS = 83;  // Linux 6.16
#endif

constinit bool guard_stalls = false;

void set_stall_timer(time_t seconds) {
    if (!guard_stalls) return;
    const itimerval timer = {{seconds, 0}, {seconds, 0}};
    (void)setitimer(ITIMER_REAL, &timer, nullptr);
}

}  // namespace

bool wait_for_client(int fd, short events, int64_t deadline_ms) {
    while (!is_stop_requested()) {
        const int64_t left_ms = std::max(deadline_ms - monotonic_ms(), int64_t{0});
        std::array waits = {pollfd{fd, events, 0}, pollfd{stop_event_fd(), POLLIN, 0}};
        const int ready = poll(waits.data(), waits.size(), static_cast<int>(left_ms));
        if (ready > 0) return waits[0].revents != 0;
        if (ready == 0 || errno != EINTR) return false;
    }
    return false;
}

stall_guard::stall_guard() { set_stall_timer(1); }

stall_guard::~stall_guard() { set_stall_timer(0); }

void refuse_descriptors(int fd) {
    const int off = 0;
    if (setsockopt(fd, SOL_SOCKET, SO_PASSRIGHTS, &off, sizeof off) != 0) guard_stalls = true;
}

}  // namespace kivd
