#include "runtime/stop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>

#include "util/clock.h"

namespace kivd {
namespace {

constinit std::atomic<int> stop_flag = 0;
constinit std::atomic<int> stop_event = -1;
static_assert(std::atomic<int>::is_always_lock_free, "the signal handler writes them");

}  // namespace

bool stop_init() {
    stop_event = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    if (is_stop_requested()) request_stop();  // before there was an event to signal
    return stop_event >= 0;
}

void stop_release() {
    stop_flag = 0;
    if (const int event = stop_event.exchange(-1); event >= 0) (void)close(event);
}

int stop_event_fd() { return stop_event; }

void request_stop() {
    const int saved_errno = errno;
    stop_flag = 1;
    const uint64_t one = 1;
    if (const int event = stop_event; event >= 0) (void)!write(event, &one, sizeof one);
    errno = saved_errno;
}

bool is_stop_requested() { return stop_flag != 0; }

void wait_for_stop(int timeout_ms) {
    const int64_t deadline_ms = monotonic_ms() + timeout_ms;
    for (int64_t left_ms = timeout_ms; left_ms > 0; left_ms = deadline_ms - monotonic_ms()) {
        pollfd event = {stop_event, POLLIN, 0};
        if (is_stop_requested()) return;
        (void)poll(&event, 1, static_cast<int>(left_ms));
    }
}

void stop_forget_event() { stop_event = -1; }

}  // namespace kivd
