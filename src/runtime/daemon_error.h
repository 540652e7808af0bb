// The daemon's own errors as probe data: an event "DaemonError" and a counter "Cnt_DaemonError" of
// package "kiv", sent to itself as by any client and thus part of the next report. A flood guard
// lets 100 of them through in a period of ten hours (6 seconds in test mode).
//
// Safe to call from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <ctime>

namespace kivd {

inline constexpr size_t error_text_size = 1024;  // NUL included; longer texts are cut

inline constexpr int32_t error_period_limit = 100;
inline constexpr time_t error_flood_interval = 36000;  // seconds
inline constexpr time_t error_flood_interval_in_test_mode = 6;

// `directory` is where the daemon's own sockets are; the caller keeps the text.
void daemon_error_init(const char* directory);

// Disconnects, forgets the directory, and begins a new period.
void daemon_error_release();

// Formats a text and sends it, without waiting; a failure is not the caller's concern. Keeps errno.
[[gnu::format(printf, 1, 2)]] void raise_daemon_error(const char* format, ...);

// Logs and raises `message`, then ends the process with exit status 1.
[[noreturn]] void fatal_error(const char* message);

// The flood guard's period, which the state file keeps: errors counted in it, and its start (0:
// none yet).
[[nodiscard]] int32_t get_error_nr();
void set_error_nr(int32_t count);
[[nodiscard]] time_t get_error_time();
void set_error_time(time_t start);

// For the one place that forks: no other thread is inside the facility between the two calls. In
// the child, `daemon_error_forget_connection` makes the next error connect anew.
void daemon_error_lock();
void daemon_error_unlock();
void daemon_error_forget_connection();

}  // namespace kivd
