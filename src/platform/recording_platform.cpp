#include "platform/recording_platform.h"

#include <cstdarg>
#include <cstdio>
#include <mutex>
#include <utility>

#include "platform/android_log.h"
#include "platform/permission.h"
#include "platform/system_properties.h"

namespace kivd {
namespace {

std::mutex log_mutex;
lines log_lines;

}  // namespace

lines take_log() {
    const std::lock_guard lock(log_mutex);
    return std::exchange(log_lines, {});
}

void log_to_system() {}
void log_forget_descriptor() {}
void log_lock() { log_mutex.lock(); }
void log_unlock() { log_mutex.unlock(); }

bool check_permission(const char*, pid_t, uid_t) { return false; }
void forget_permissions() {}

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    const int size = __android_log_vprint(priority, tag, format, arguments);
    va_end(arguments);
    return size;
}

extern "C" int __android_log_vprint(int priority, const char* tag, const char* format,
                                    va_list arguments) {
    char text[32768];
    const int size = vsnprintf(text, sizeof text, format, arguments);
    const std::lock_guard lock(log_mutex);
    log_lines.push_back(std::string(1, "IWE"[priority - ANDROID_LOG_INFO]) + ' ' + tag + ": " +
                        text);
    return size;
}

extern "C" int property_get(const char* key, char* value, const char* default_value) {
    const auto found = properties.find(key);
    const char* const text = found != properties.end() ? found->second.c_str() : default_value;
    return snprintf(value, PROPERTY_VALUE_MAX, "%s", text);
}

}  // namespace kivd
