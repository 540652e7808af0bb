// The Android log call on plain Linux: one line a message on standard error or, once the daemon has
// detached, in the system log.
#pragma once

#include <cstdint>

extern "C" {

inline constexpr int ANDROID_LOG_INFO = 4;
inline constexpr int ANDROID_LOG_WARN = 5;
inline constexpr int ANDROID_LOG_ERROR = 6;

// Writes one message. It never ends the daemon and hardly delays it: while nobody takes the lines
// off they are dropped, and counted in the first line that gets through again.
[[gnu::format(printf, 3, 4)]] int __android_log_print(int priority, const char* tag,
                                                      const char* format, ...);

}  // extern "C"

namespace kivd {

// From now on the system log (/dev/log) instead of standard error.
void log_to_system();

// Held across a fork, so that the child can log.
void log_lock();
void log_unlock();

// In a forked child that has closed its copy of the log's descriptor.
void log_forget_descriptor();

}  // namespace kivd
