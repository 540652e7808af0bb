// The stop flag and the event that wakes whoever waits.
#pragma once

namespace kivd {

// Makes the event that request_stop signals. When it cannot be made, a stop is seen at the next
// wake-up.
void stop_init();

// Readable once a stop has been requested; -1 when there is none.
[[nodiscard]] int stop_event_fd();

// Asks the daemon to stop. Async-signal-safe.
void request_stop();
[[nodiscard]] bool is_stop_requested();

// Waits until a stop is requested.
void wait_for_stop();

// In a forked child: a signal there sets the child's flag and wakes nobody else.
void stop_forget_event();

}  // namespace kivd
