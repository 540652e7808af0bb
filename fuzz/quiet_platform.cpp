// A platform layer that keeps nothing and permits nothing. Messages are still put together, so that
// a text without its end shows.
#include <cstdarg>
#include <cstdio>

#include "platform/android_log.h"
#include "platform/permission.h"
#include "platform/system_properties.h"

namespace kivd {

void log_to_system() {}
void log_forget_descriptor() {}

bool check_permission(const char*, pid_t, uid_t) { return false; }
void forget_permissions() {}

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    const int size = __android_log_vprint(priority, tag, format, arguments);
    va_end(arguments);
    return size;
}

extern "C" int __android_log_vprint(int /*priority*/, const char* /*tag*/, const char* format,
                                    va_list arguments) {
    char text[2048];
    return vsnprintf(text, sizeof text, format, arguments);
}

extern "C" int property_get(const char* /*key*/, char* value, const char* default_value) {
    return snprintf(value, PROPERTY_VALUE_MAX, "%s", default_value);
}

}  // namespace kivd
