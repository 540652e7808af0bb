#include "daemon/stop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>

namespace kivd {
namespace {

constinit std::atomic<int> stop_flag = 0;
constinit std::atomic<int> stop_event = -1;
static_assert(std::atomic<int>::is_always_lock_free, "the signal handler writes them");

}  // namespace

void stop_init() { stop_event = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK); }

int stop_event_fd() { return stop_event; }

void request_stop() {
    const int saved_errno = errno;
    stop_flag = 1;
    const uint64_t one = 1;
    if (const int event = stop_event; event >= 0) (void)!write(event, &one, sizeof one);
    errno = saved_errno;
}

bool is_stop_requested() { return stop_flag != 0; }

void wait_for_stop() {
    constexpr int day_ms = 86400 * 1000;
    while (!is_stop_requested()) {
        pollfd event = {stop_event, POLLIN, 0};
        (void)poll(&event, 1, day_ms);
    }
}

void stop_forget_event() { stop_event = -1; }

}  // namespace kivd
