// The Android log call on plain Linux: one line a message, on standard error in the layout of
// `logcat -v threadtime` (but with tags as they are, not padded) or, once the daemon has detached,
// in the system log. There syslog() would wait for a receiver that stopped reading, so lines go by
// a datagram that doesn't. Bytes that are no UTF-8 become "?" and what acts on a display becomes
// blanks, so no client can forge a line.
#pragma once

#include <cstdarg>
#include <cstdint>

extern "C" {

inline constexpr int ANDROID_LOG_INFO = 4;
inline constexpr int ANDROID_LOG_WARN = 5;
inline constexpr int ANDROID_LOG_ERROR = 6;

// Writes one message. It never ends the daemon and hardly delays it: while nobody reads them,
// lines are dropped, and counted in the first one that gets through again. There is room for a
// whole request in a line.
[[gnu::format(printf, 3, 4)]] int __android_log_print(int priority, const char* tag,
                                                      const char* format, ...);
[[gnu::format(printf, 3, 0)]] int __android_log_vprint(int priority, const char* tag,
                                                       const char* format, va_list arguments);

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
