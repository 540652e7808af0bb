#include "daemon/loop/event_loop.h"

#include <sys/epoll.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <span>
#include <utility>

#include "daemon/loop/save_clock.h"
#include "platform/android_log.h"
#include "runtime/stop.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd";
constexpr size_t max_events = 10;

constinit int epoll_fd = -1;

// It has nothing to do: the event only wakes the loop, which then looks at the flag.
constinit event_handler stop_handler = {[](event_handler&) {}, -1};

void call_handlers(std::span<const epoll_event> events) {
    for (const epoll_event& event : events) {
        if (is_stop_requested()) return;
        if ((event.events & EPOLLIN) == 0) continue;
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

void event_loop_release() {
    if (epoll_fd >= 0) (void)close(std::exchange(epoll_fd, -1));
}

bool event_loop_add(event_handler& handler) {
    epoll_event event = {};
    event.events = EPOLLIN;
    event.data.ptr = &handler;
    return epoll_ctl(epoll_fd, EPOLL_CTL_ADD, handler.fd, &event) == 0;
}

void event_loop_remove(event_handler& handler) {
    (void)epoll_ctl(epoll_fd, EPOLL_CTL_DEL, handler.fd, nullptr);
}

void event_loop_run() {
    std::array<epoll_event, max_events> events;
    while (!is_stop_requested()) {
        const int ready =
            epoll_wait(epoll_fd, events.data(), max_events, 1000 * seconds_until_save());
        if (ready == 0) save_data();
        if (ready > 0) call_handlers(std::span(events).first(static_cast<size_t>(ready)));
    }
}

}  // namespace kivd
