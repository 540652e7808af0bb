// The one event loop.
#pragma once

namespace kivd {

// The object behind every descriptor in the loop. It must outlive its registration.
struct event_handler {
    // Called when `fd` is readable. It may free or close its own handler, as its last act, and no
    // other: up to ten events are taken in one wait and come with raw pointers.
    void (*callback)(event_handler& handler);
    int fd;  // -1 while closed
};

// Makes the loop. A failure has been logged.
[[nodiscard]] bool event_loop_init();

// Ends it, whatever is still in it.
void event_loop_release();

// Adds a handler with its descriptor, or takes it out. False, with errno set, when it cannot be
// added.
[[nodiscard]] bool event_loop_add(event_handler& handler);
void event_loop_remove(event_handler& handler);

// Serves events and the timed save until a stop is requested.
void event_loop_run();

}  // namespace kivd
