#include "runtime/log_and_raise.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>

#include "platform/android_log.h"
#include "runtime/client_lines.h"
#include "runtime/daemon_error.h"

namespace kivd {

bool log_and_raise(const char* tag, const char* format, ...) {
    const int saved_errno = errno;
    va_list arguments;
    va_start(arguments, format);
    va_list logged;
    va_copy(logged, arguments);
    if (take_line()) __android_log_vprint(ANDROID_LOG_ERROR, tag, format, logged);
    va_end(logged);
    char text[error_text_size];
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    raise_daemon_error("%s: %s", tag, text);
    errno = saved_errno;
    return false;
}

}  // namespace kivd
