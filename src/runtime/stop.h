// The stop flag and the event that wakes whoever waits.
#pragma once

namespace kivd {

// Makes the event that request_stop signals. False, with errno set, when it cannot be made.
[[nodiscard]] bool stop_init();

// Closes the event and withdraws the request.
void stop_release();

// Readable once a stop has been requested; -1 when there is none.
[[nodiscard]] int stop_event_fd();

// Asks the daemon to stop. Async-signal-safe.
void request_stop();
[[nodiscard]] bool is_stop_requested();

// Waits until a stop is requested, for at most that time.
void wait_for_stop(int timeout_ms);

// For a forked child: a signal there is to set the child's own flag and wake nobody else.
void stop_forget_event();

}  // namespace kivd
