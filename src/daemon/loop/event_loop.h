// The event loop, of which there is one.
#pragma once

namespace kivd {

// The object behind every descriptor in the loop. It must outlive its registration.
struct event_handler {
    // Called when `fd` is readable. As its last act it may close or free its own handler, but no
    // other: one wait takes up to ten events, which hold raw pointers.
    void (*callback)(event_handler& handler);
    int fd;  // -1 while closed
};

// Makes the loop. A failure has been logged.
[[nodiscard]] bool event_loop_init();

// Closes the loop, whatever is still in it.
void event_loop_release();

// Adds a handler with its descriptor, or takes it out. False, with errno set, when it cannot be
// added.
[[nodiscard]] bool event_loop_add(event_handler& handler);
void event_loop_remove(event_handler& handler);

// Serves events and the timed save until a stop is requested.
void event_loop_run();

}  // namespace kivd
