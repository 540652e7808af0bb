#include "runtime/daemon_error.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <optional>
#include <utility>

#include "client/kiv.h"
#include "daemon_error.pb-c.h"
#include "platform/android_log.h"
#include "util/clock.h"
#include "util/mutex.h"
#include "util/releaser.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-error";

constinit mutex guard;  // guards everything below
constinit int32_t error_nr = 0;
constinit time_t error_time = 0;
constinit bool notice_logged = false;
constinit time_t flood_interval = error_flood_interval;
constinit const char* connection_directory = nullptr;
constinit kiv_handle* connection = nullptr;

bool read_clock(time_t& now) {
    now = time(nullptr);
    if (now != -1) return true;
    __android_log_print(ANDROID_LOG_ERROR, tag, "Failure to compute the current time: %s",
                        strerror(errno));
    return false;
}

// Counts the error. Returns nothing when it is suppressed, else the event's `flooding` value.
std::optional<bool> admit() {
    time_t now = 0;
    if (error_time == 0) {
        if (!read_clock(now)) return std::nullopt;
        error_time = now;
    }
    if (error_nr < INT32_MAX) ++error_nr;
    if (error_nr <= error_period_limit) return error_nr == error_period_limit;

    if (!read_clock(now)) return std::nullopt;
    // A clock that was set back counts as the period's end: it may have been ahead by years.
    const time_t elapsed = now - error_time;
    if (elapsed >= 0 && elapsed <= flood_interval) return std::nullopt;
    error_time = now;
    error_nr = 1;
    return false;
}

void log_suppression_once() {
    if (notice_logged) return;
    notice_logged = true;
    const time_t end = error_time + flood_interval;
    tm local = {};
    localtime_r(&end, &local);
    char until[20] = "";
    strftime(until, sizeof until, "%Y-%m-%d %H:%M:%S", &local);
    __android_log_print(ANDROID_LOG_ERROR, tag,
                        "KIV daemon error event will not be created until %s to prevent flooding.",
                        until);
}

bool connect_to_self() {
    if (connection != nullptr) return true;
    connection =
        connection_directory != nullptr ? kiv_create_from_path(connection_directory) : kiv_create();
    if (connection != nullptr) return true;
    __android_log_print(ANDROID_LOG_ERROR, tag,
                        "Tried to generate error probe data, failed to create a KIV connection");
    return false;
}

void send_event(char* text, bool flooding) {
    Kiv__DaemonError message = KIV__DAEMON_ERROR__INIT;
    message.log = text;
    message.has_flooding = flooding;
    message.flooding = flooding;
    const size_t size = kiv__daemon_error__get_packed_size(&message);
    const unique_malloc<uint8_t> bytes(static_cast<uint8_t*>(malloc(size)));
    if (!bytes) {
        __android_log_print(ANDROID_LOG_ERROR, tag,
                            "KIV daemon error event not created. Failed to allocate %zu bytes",
                            size);
        return;
    }
    kiv__daemon_error__pack(&message, bytes.get());
    (void)kiv_add_event(connection, "kiv", "DaemonError", bytes.get(), size);
}

}  // namespace

void daemon_error_init(const char* directory) {
    const std::lock_guard lock(guard);
    connection_directory = directory;
    if (is_test_mode()) flood_interval = error_flood_interval_in_test_mode;
}

void daemon_error_release() {
    const std::lock_guard lock(guard);
    error_nr = 0;
    error_time = 0;
    notice_logged = false;
    flood_interval = error_flood_interval;
    connection_directory = nullptr;
    kiv_destroy(std::exchange(connection, nullptr));
}

void raise_daemon_error(const char* format, ...) {
    const int saved_errno = errno;
    char text[error_text_size];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);

    const std::lock_guard lock(guard);
    if (const std::optional<bool> flooding = admit()) {
        notice_logged = false;
        if (connect_to_self()) {
            send_event(text, *flooding);
            (void)kiv_inc_counter(connection, "kiv", "Cnt_DaemonError", 1);
        }
    } else {
        log_suppression_once();
    }
    errno = saved_errno;
}

void fatal_error(const char* message) {
    __android_log_print(ANDROID_LOG_ERROR, "kivd-util", "%s", message);
    raise_daemon_error("kivd-util: %s", message);
    exit(1);
}

int32_t get_error_nr() {
    const std::lock_guard lock(guard);
    return error_nr;
}

void set_error_nr(int32_t count) {
    const std::lock_guard lock(guard);
    error_nr = count;
}

time_t get_error_time() {
    const std::lock_guard lock(guard);
    return error_time;
}

void set_error_time(time_t start) {
    const std::lock_guard lock(guard);
    error_time = start;
}

void daemon_error_lock() { guard.lock(); }

void daemon_error_unlock() { guard.unlock(); }

void daemon_error_forget_connection() { connection = nullptr; }

}  // namespace kivd
