#include "daemon/net/stall_guard.h"

#include <sys/socket.h>
#include <sys/time.h>

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

stall_guard::stall_guard() { set_stall_timer(1); }

stall_guard::~stall_guard() { set_stall_timer(0); }

void refuse_descriptors(int fd) {
    const int off = 0;
    if (setsockopt(fd, SOL_SOCKET, SO_PASSRIGHTS, &off, sizeof off) != 0) guard_stalls = true;
}

}  // namespace kivd
