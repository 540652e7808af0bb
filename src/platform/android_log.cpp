#include "platform/android_log.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <mutex>

namespace kivd {
namespace {

constexpr size_t line_size = 2048;   // longer messages are cut
constexpr int stalled_wait_ms = 20;  // what a receiver that stopped reading may cost, once

constinit std::mutex mutex;  // guards everything below, and the time zone that dates are made with
constinit bool to_system = false;
constinit int system_log_fd = -1;
constinit unsigned lines_lost = 0;

int connect_system_log() {
    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) return -1;
    const sockaddr_un address = {AF_UNIX, "/dev/log"};
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) return fd;
    (void)close(fd);
    return -1;
}

// A restarted logger needs a new connection, so a failed send is repeated once on one.
bool send_to_system(const char* line, size_t size) {
    for (int attempt = 0; attempt < 2; ++attempt) {
        if (system_log_fd < 0) system_log_fd = connect_system_log();
        if (system_log_fd < 0) return false;
        if (send(system_log_fd, line, size, MSG_NOSIGNAL | MSG_DONTWAIT) >= 0) return true;
        if (errno == EAGAIN) return false;
        (void)close(system_log_fd);
        system_log_fd = -1;
    }
    return false;
}

// Asks first, since a write to a pipe that nobody empties would block for ever.
bool write_to_stderr(const char* line, size_t size) {
    pollfd room = {STDERR_FILENO, POLLOUT, 0};
    if (poll(&room, 1, lines_lost == 0 ? stalled_wait_ms : 0) != 1) return false;
    return write(STDERR_FILENO, line, size) >= 0;
}

// "11-22 21:15:59.123  pid  tid E tag: "
int format_stderr_head(char* out, size_t size, char letter, const char* tag) {
    timeval now = {};
    gettimeofday(&now, nullptr);
    tm local = {};
    localtime_r(&now.tv_sec, &local);
    char date[sizeof "11-22 21:15:59"];
    strftime(date, sizeof date, "%m-%d %H:%M:%S", &local);
    return snprintf(out, size, "%s.%03d %5d %5d %c %s: ", date,
                    static_cast<int>(now.tv_usec / 1000), getpid(),
                    static_cast<int>(syscall(SYS_gettid)), letter, tag);
}

// "<priority>Nov 22 21:15:59 kivd[pid]: tag: ", the layout that every reader of /dev/log takes.
int format_system_head(char* out, size_t size, int severity, const char* tag) {
    const time_t now = time(nullptr);
    tm local = {};
    localtime_r(&now, &local);
    char date[sizeof "Nov 22 21:15:59"];
    strftime(date, sizeof date, "%b %e %H:%M:%S", &local);
    return snprintf(out, size, "<%d>%s kivd[%d]: %s: ", LOG_DAEMON | severity, date, getpid(), tag);
}

struct priority_names {
    char letter;
    int severity;
};

priority_names names_of(int priority) {
    if (priority >= ANDROID_LOG_ERROR) return {'E', LOG_ERR};
    if (priority == ANDROID_LOG_WARN) return {'W', LOG_WARNING};
    return {'I', LOG_INFO};
}

bool log_line(int priority, const char* tag, const char* text) {
    const priority_names names = names_of(priority);
    char line[line_size];
    const int head = to_system ? format_system_head(line, sizeof line, names.severity, tag)
                               : format_stderr_head(line, sizeof line, names.letter, tag);
    if (head < 0) return false;
    const size_t start = std::min(static_cast<size_t>(head), sizeof line / 2);
    size_t length = std::min(strlen(text), sizeof line - start - 1);
    while (length > 0 && text[length - 1] == '\n') --length;
    // The log shows names that clients chose: none of them may look like a line of ours.
    std::transform(text, text + length, line + start, [](char c) {
        const auto byte = static_cast<unsigned char>(c);
        return byte < ' ' || byte == 0x7F ? ' ' : c;
    });
    length += start;
    if (to_system) return send_to_system(line, length);
    line[length++] = '\n';
    return write_to_stderr(line, length);
}

}  // namespace

void log_to_system() { to_system = true; }

void log_forget_descriptor() { system_log_fd = -1; }

void log_lock() { mutex.lock(); }

void log_unlock() { mutex.unlock(); }

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    const int saved_errno = errno;
    char text[line_size];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);

    const std::lock_guard lock(mutex);
    const unsigned lost = lines_lost;
    char notice[64];
    snprintf(notice, sizeof notice, "%u log lines were lost here", lost);
    const bool caught_up = lost == 0 || log_line(ANDROID_LOG_WARN, "kivd", notice);
    if (caught_up) lines_lost = 0;
    const bool written = caught_up && log_line(priority, tag, text);
    if (!written) ++lines_lost;
    errno = saved_errno;
    return written ? 1 : -1;
}

}  // namespace kivd
