#include "platform/android_log.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <mutex>
#include <span>
#include <string_view>

#include "util/mutex.h"
#include "util/utf8.h"

namespace kivd {
namespace {

constexpr size_t line_size = 32768;  // longer ones are cut
constexpr int stalled_wait_ms = 20;  // what a receiver that stopped reading may cost, once

constinit mutex guard;  // guards everything below, and the time zone that dates are made with
constinit bool to_system = false;
constinit int system_log_fd = -1;
constinit unsigned lines_lost = 0;
constinit bool is_torn = false;  // standard error has only the beginning of the last line
constinit std::array<char, line_size> line = {};

int connect_system_log() {
    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) return -1;
    const sockaddr_un address = {AF_UNIX, "/dev/log"};
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) return fd;
    (void)close(fd);
    return -1;
}

// A restarted logger needs a new connection, so a failed send is repeated once on one.
bool send_to_system(std::string_view text) {
    for (int attempt = 0; attempt < 2; ++attempt) {
        if (system_log_fd < 0) system_log_fd = connect_system_log();
        if (system_log_fd < 0) return false;
        const ssize_t sent =
            send(system_log_fd, text.data(), text.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent >= 0) return true;
        if (errno == EAGAIN) return false;
        (void)close(system_log_fd);
        system_log_fd = -1;
    }
    return false;
}

// Asks first, since a write to a pipe that nobody empties would block for ever.
bool write_piece(std::string_view piece) {
    pollfd room = {STDERR_FILENO, POLLOUT, 0};
    if (poll(&room, 1, lines_lost == 0 ? stalled_wait_ms : 0) != 1) return false;
    return write(STDERR_FILENO, piece.data(), piece.size()) == std::ssize(piece);
}

// In pieces for which a pipe that has any room has enough.
bool write_to_stderr(std::string_view text) {
    if (is_torn && !write_piece("\n")) return false;
    for (size_t at = 0; at < text.size(); at += PIPE_BUF) {
        is_torn = at > 0;
        if (!write_piece(text.substr(at, PIPE_BUF))) return false;
    }
    is_torn = false;
    return true;
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

// "11-22 21:15:59.123  pid  tid E tag: "
int put_stderr_head(char letter, const char* tag) {
    timeval now = {};
    gettimeofday(&now, nullptr);
    tm local = {};
    localtime_r(&now.tv_sec, &local);
    char date[sizeof "11-22 21:15:59"];
    strftime(date, sizeof date, "%m-%d %H:%M:%S", &local);
    return snprintf(line.data(), line.size(), "%s.%03d %5d %5d %c %s: ", date,
                    static_cast<int>(now.tv_usec / 1000), getpid(),
                    static_cast<int>(syscall(SYS_gettid)), letter, tag);
}

// "<priority>Nov 22 21:15:59 kivd[pid]: tag: ", the layout that every reader of /dev/log takes.
int put_system_head(int severity, const char* tag) {
    const time_t now = time(nullptr);
    tm local = {};
    localtime_r(&now, &local);
    char date[sizeof "Nov 22 21:15:59"];
    strftime(date, sizeof date, "%b %e %H:%M:%S", &local);
    return snprintf(line.data(), line.size(), "<%d>%s kivd[%d]: %s: ", LOG_DAEMON | severity, date,
                    getpid(), tag);
}

// Begins `line` anew; gives the size of its head. Tags are short.
size_t begin_line(int priority, const char* tag) {
    const priority_names names = names_of(priority);
    return static_cast<size_t>(to_system ? put_system_head(names.severity, tag)
                                         : put_stderr_head(names.letter, tag));
}

// The log shows names that clients chose: none of them may look like a line of ours.
void make_harmless(std::span<char> text) {
    while (!text.empty()) {
        const size_t length = utf8_length({text.data(), text.size()});
        const std::span<char> character = text.first(std::max(length, size_t{1}));
        if (length == 0) {
            character[0] = '?';
        } else if (is_control({character.data(), length})) {
            std::ranges::fill(character, ' ');
        }
        text = text.subspan(character.size());
    }
}

// Puts the text behind the head and sends the line. What does not fit is cut.
[[gnu::format(printf, 2, 0)]] bool end_line(size_t head, const char* format, va_list arguments) {
    const int wanted = vsnprintf(line.data() + head, line.size() - head, format, arguments);
    if (wanted < 0) return false;
    size_t size = std::min(head + static_cast<size_t>(wanted), line.size() - 1);
    while (size > head && line[size - 1] == '\n') --size;
    make_harmless(std::span(line).subspan(head, size - head));
    if (to_system) return send_to_system({line.data(), size});
    line[size] = '\n';
    return write_to_stderr({line.data(), size + 1});
}

[[gnu::format(printf, 3, 4)]] bool log_line(int priority, const char* tag, const char* format,
                                            ...) {
    va_list arguments;
    va_start(arguments, format);
    const bool logged = end_line(begin_line(priority, tag), format, arguments);
    va_end(arguments);
    return logged;
}

}  // namespace

void log_to_system() { to_system = true; }

void log_forget_descriptor() { system_log_fd = -1; }

void log_lock() { guard.lock(); }

void log_unlock() { guard.unlock(); }

extern "C" int __android_log_print(int priority, const char* tag, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    const int result = __android_log_vprint(priority, tag, format, arguments);
    va_end(arguments);
    return result;
}

extern "C" int __android_log_vprint(int priority, const char* tag, const char* format,
                                    va_list arguments) {
    const int saved_errno = errno;
    const std::lock_guard lock(guard);
    const bool caught_up = lines_lost == 0 || log_line(ANDROID_LOG_WARN, "kivd",
                                                       "%u log lines were lost here", lines_lost);
    if (caught_up) lines_lost = 0;
    const bool written = caught_up && end_line(begin_line(priority, tag), format, arguments);
    if (!written) ++lines_lost;
    errno = saved_errno;
    return written ? 1 : -1;
}

}  // namespace kivd
