#include "daemon/loop/event_loop.h"

#include <sys/epoll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <span>
#include <utility>

#include "daemon/loop/save_clock.h"
#include "platform/android_log.h"
#include "runtime/client_lines.h"
#include "runtime/stop.h"
#include "util/clock.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr size_t max_events = 10;
constexpr int64_t tick_ms = 100;

constinit int epoll_fd = -1;

// It has nothing to do: the event only wakes the loop, which then looks at the flag.
constinit event_handler stop_handler = {[](event_handler&) {}, -1};

constinit std::array<event_handler*, 4> paused = {};
constinit tick_callback tick_function = nullptr;
constinit int64_t last_tick_ms = 0;

int change(int operation, event_handler& handler, uint32_t events) {
    epoll_event event = {};
    event.events = events;
    event.data.ptr = &handler;
    return epoll_ctl(epoll_fd, operation, handler.fd, &event);
}

bool is_ticking() {
    return tick_function != nullptr || are_lines_left_out() ||
           std::ranges::any_of(paused, [](const event_handler* each) { return each != nullptr; });
}

void start_ticking() {
    if (!is_ticking()) last_tick_ms = monotonic_ms();
}

void tick_when_due() {
    if (!is_ticking()) return;
    const int64_t now_ms = monotonic_ms();
    if (now_ms - last_tick_ms < tick_ms) return;
    last_tick_ms = now_ms;
    event_loop_resume();
    tell_lines_left_out();
    const line_cause_scope cause(line_cause::client);
    if (tick_function != nullptr && !tick_function(now_ms)) tick_function = nullptr;
}

void call_handlers(std::span<const epoll_event> events) {
    const line_cause_scope cause(line_cause::client);  // there is one behind each of them
    for (const epoll_event& event : events) {
        if (is_stop_requested()) return;
        auto& handler = *static_cast<event_handler*>(event.data.ptr);
        handler.callback(handler);
    }
}

}  // namespace

bool event_loop_init() {
    epoll_fd = epoll_create1(EPOLL_CLOEXEC);
    if (epoll_fd < 0) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "epoll_create failed: %s", strerror(errno));
        return false;
    }
    stop_handler.fd = stop_event_fd();
    (void)event_loop_add(stop_handler);
    return true;
}

bool event_loop_add(event_handler& handler) { return change(EPOLL_CTL_ADD, handler, EPOLLIN) == 0; }

void event_loop_remove(event_handler& handler) {
    std::ranges::replace(paused, &handler, nullptr);
    (void)epoll_ctl(epoll_fd, EPOLL_CTL_DEL, handler.fd, nullptr);
}

void event_loop_await(event_handler& handler, readiness awaited) {
    (void)change(EPOLL_CTL_MOD, handler, awaited == readiness::to_read ? EPOLLIN : EPOLLOUT);
}

void event_loop_pause(event_handler& handler) {
    auto* const place = std::ranges::find(paused, nullptr);
    if (place == paused.end()) return;
    start_ticking();
    event_loop_remove(handler);
    *place = &handler;
}

void event_loop_resume() {
    for (event_handler*& each : paused) {
        if (each != nullptr) (void)event_loop_add(*std::exchange(each, nullptr));
    }
}

void event_loop_tick(tick_callback tick) {
    start_ticking();
    tick_function = tick;
}

void event_loop_run() {
    std::array<epoll_event, max_events> events;
    while (!is_stop_requested()) {
        const int save_wait_ms = 1000 * seconds_until_save();
        const int64_t tick_wait_ms =
            is_ticking() ? std::max(last_tick_ms + tick_ms - monotonic_ms(), int64_t{0})
                         : save_wait_ms;
        const int wait_ms = static_cast<int>(std::min(int64_t{save_wait_ms}, tick_wait_ms));
        const int ready = epoll_wait(epoll_fd, events.data(), max_events, wait_ms);
        if (ready == 0 && wait_ms == save_wait_ms) save_data();
        if (ready > 0) call_handlers(std::span(events).first(static_cast<size_t>(ready)));
        tick_when_due();
    }
}

void event_loop_release() {
    paused.fill(nullptr);
    tick_function = nullptr;
    if (epoll_fd >= 0) (void)close(std::exchange(epoll_fd, -1));
}

}  // namespace kivd
