#include "runtime/give_up.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "platform/android_log.h"
#include "runtime/daemon_error.h"

namespace kivd {

void give_up(const char* tag, const char* format, ...) {
    char text[error_text_size];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    __android_log_print(ANDROID_LOG_ERROR, tag, "%s", text);
    exit(1);
}

}  // namespace kivd
