// The one event loop.
#pragma once

#include <cstdint>

namespace kivd {

// The object behind every descriptor in the loop. It must outlive its registration.
struct event_handler {
    // Called when `fd` is ready for what is awaited, or has hung up. It may free or close its own
    // handler, as its last act, and no other: up to ten events are taken in one wait and come with
    // raw pointers.
    void (*callback)(event_handler& handler);
    int fd;  // -1 while closed
};

enum class readiness : bool { to_read, to_write };

// Makes the loop. A failure has been logged.
[[nodiscard]] bool event_loop_init();

// Adds a handler with its descriptor, to be called when there is something to read, or takes it
// out, paused or not. False, with errno set, when it cannot be added.
[[nodiscard]] bool event_loop_add(event_handler& handler);
void event_loop_remove(event_handler& handler);

// What the handler is called for from now on.
void event_loop_await(event_handler& handler, readiness awaited);

// Leaves the handler out of the loop for one tick, or until event_loop_resume: for descriptors that
// stay ready while nothing can be done about it. There is room for a few.
void event_loop_pause(event_handler& handler);
void event_loop_resume();

// What is called every 100 ms from now on, with the time of the monotonic clock, for as long as it
// gives true. There is one such function.
using tick_callback = bool (*)(int64_t now_ms);
void event_loop_tick(tick_callback tick);

// Serves events, ticks and the timed save until a stop is requested.
void event_loop_run();

// Forgets what is paused and what ticks, and closes the loop.
void event_loop_release();

}  // namespace kivd
