#include "runtime/log_and_raise.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include "platform/android_log.h"
#include "runtime/daemon_error.h"

namespace kivd {

bool log_and_raise(const char* tag, const char* format, ...) {
    const int saved_errno = errno;
    char text[error_text_size];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    __android_log_print(ANDROID_LOG_ERROR, tag, "%s", text);
    raise_daemon_error("%s: %s", tag, text);
    errno = saved_errno;
    return false;
}

}  // namespace kivd
