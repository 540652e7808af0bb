#include "kivctl/watch_command.h"

#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <iterator>
#include <memory>
#include <optional>
#include <string_view>

#include "kiv.h"
#include "kivctl/io.h"
#include "kivctl/watch_frames.h"
#include "kivctl/watch_line.h"
#include "util/file_io.h"
#include "util/releaser.h"
#include "util/unique_fd.h"

namespace kivd {
namespace {

constexpr char port[] = "2305";

// Everything that has been read is written before the next wait, so nothing is lost here, not even
// when this interrupts a write.
void end_now(int /*signal*/) { _exit(status_done); }

void end_on_signals() {
    struct sigaction action = {};
    action.sa_handler = end_now;
    for (const int number : {SIGINT, SIGTERM}) (void)sigaction(number, &action, nullptr);
    (void)signal(SIGPIPE, SIG_IGN);  // writes then fail with EPIPE
}

[[noreturn]] void fail_to_connect(const watch_options& options, const std::string& why) {
    throw failure("no debug interface at " + options.host + ", port " + port + ": " + why +
                      "; kivd has one when it is started with the option -d",
                  status_unreachable);
}

// A name service may be slow and a name may stand for several machines, so one limit covers the
// whole attempt.
void give_up(int /*signal*/) {
    constexpr char text[] = "kivctl: the debug interface could not be reached in time\n";
    (void)!write(STDERR_FILENO, text, sizeof text - 1);
    _exit(status_unreachable);
}

// Gives up after so many milliseconds; 0 removes the limit.
void limit_time(unsigned milliseconds) {
    (void)signal(SIGALRM, give_up);
    const itimerval limit = {
        {}, {milliseconds / 1000, static_cast<suseconds_t>(milliseconds % 1000) * 1000}};
    (void)setitimer(ITIMER_REAL, &limit, nullptr);
}

// 0 when it answers, else the error of libkiv.
int ask_daemon(const watch_options& options, unsigned timeout_ms) {
    const std::unique_ptr<kiv_handle, releaser<kiv_destroy>> daemon(
        kiv_create_from_path(options.base.c_str()));
    if (!daemon) return -errno;
    kiv_set_timeout(daemon.get(), timeout_ms);
    return kiv_is_alive(daemon.get());
}

bool is_loopback(const addrinfo& address) {
    sockaddr_in internet = {};
    memcpy(&internet, address.ai_addr, sizeof internet);
    return ntohl(internet.sin_addr.s_addr) >> 24U == IN_LOOPBACKNET;
}

// The kernel also connects to a daemon that is stopped, and nothing would ever arrive.
void check_local_daemon(const watch_options& options, unsigned timeout_ms) {
    if (ask_daemon(options, timeout_ms) != -ETIMEDOUT) return;
    throw failure("the daemon in " + options.base + " has not answered within " +
                      std::to_string(options.timeout_ms) + " ms; it may be busy or stopped",
                  status_unreachable);
}

// Not ok, with errno set, when the connection fails.
unique_fd connect_to(const addrinfo& address) {
    unique_fd fd(socket(address.ai_family, address.ai_socktype | SOCK_CLOEXEC, 0));
    if (!fd.ok()) return fd;
    const int on = 1;  // notices a machine that has vanished
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_KEEPALIVE, &on, sizeof on);
    if (connect(fd.get(), address.ai_addr, address.ai_addrlen) != 0) fd.reset();
    return fd;
}

unique_fd connect_to_host(const watch_options& options) {
    const deadline end(options.timeout_ms);
    limit_time(options.timeout_ms);
    addrinfo wanted = {};
    wanted.ai_family = AF_INET;
    wanted.ai_socktype = SOCK_STREAM;
    addrinfo* list = nullptr;
    const int result = getaddrinfo(options.host.c_str(), port, &wanted, &list);
    if (result != 0) fail_to_connect(options, gai_strerror(result));
    const std::unique_ptr<addrinfo, releaser<freeaddrinfo>> found(list);
    for (const addrinfo* each = found.get(); each != nullptr; each = each->ai_next) {
        limit_time(0);
        if (is_loopback(*each)) check_local_daemon(options, end.left_ms());
        limit_time(std::max(end.left_ms(), 1U));
        unique_fd fd = connect_to(*each);
        if (fd.ok()) {
            limit_time(0);
            return fd;
        }
    }
    limit_time(0);
    fail_to_connect(options, strerror(errno));
}

// Whether both ends of the connection are on this machine.
bool is_local(int fd) {
    sockaddr_in own = {}, other = {};
    socklen_t own_size = sizeof own, other_size = sizeof other;
    if (getsockname(fd, reinterpret_cast<sockaddr*>(&own), &own_size) != 0) return false;
    if (getpeername(fd, reinterpret_cast<sockaddr*>(&other), &other_size) != 0) return false;
    return own.sin_addr.s_addr == other.sin_addr.s_addr;
}

// The side that closes first keeps the port for a minute, during which no daemon could be started
// with -d. A reset frees it.
void reset_connection(unique_fd& connection) {
    const linger no_time = {1, 0};
    (void)setsockopt(connection.get(), SOL_SOCKET, SO_LINGER, &no_time, sizeof no_time);
    connection.reset();
}

// Throws why the connection was closed. A daemon that found it full has left a frame unfinished.
[[noreturn]] void tell_why_closed(const watch_options& options, bool was_local,
                                  bool is_inside_frame) {
    std::string text;
    if (is_inside_frame) {
        text = "requests came faster than they were shown, and the daemon hung up";
    } else {
        text = "another client has taken the place of this one at the debug interface";
    }
    if (!was_local) {
        text = options.host + " closed the connection: the daemon there has ended, or " + text;
    } else if (ask_daemon(options, options.timeout_ms) != 0) {
        text =
            "the daemon has ended: it closed the connection, and none answers in " + options.base;
    }
    throw failure(text, status_unreachable);
}

// Waits for input on `fd`. False when nobody reads standard output any more.
bool wait_readable(int fd) {
    pollfd entries[] = {{fd, POLLIN, 0}, {STDOUT_FILENO, 0, 0}};
    while (poll(entries, std::size(entries), -1) < 0 && errno == EINTR) continue;
    return entries[1].revents == 0;
}

// False when nobody reads standard output any more.
bool write_output(std::string_view text) {
    if (write_all(STDOUT_FILENO, text.data(), text.size())) return true;
    if (errno == EPIPE) return false;
    fail_output();
}

// As in the daemon's log.
std::string local_time() {
    timespec now = {};
    (void)clock_gettime(CLOCK_REALTIME, &now);
    tm local = {};
    (void)localtime_r(&now.tv_sec, &local);
    char day_and_time[32], text[40];
    (void)strftime(day_and_time, sizeof day_and_time, "%m-%d %H:%M:%S", &local);
    snprintf(text, sizeof text, "%s.%03d", day_and_time, static_cast<int>(now.tv_nsec / 1'000'000));
    return text;
}

// Takes the whole frames and gives what to show of them.
std::string take_frames(frame_reader& frames, const watch_options& options) {
    std::string text;
    const std::string time = local_time();
    while (const std::optional<debug_frame> frame = frames.next()) {
        if (!options.package.empty() && package_of(frame->packet) != options.package) continue;
        if (options.is_raw) {
            text += frame->bytes;
        } else {
            text += time + describe_request(frame->packet) + '\n';
        }
    }
    return text;
}

}  // namespace

int run_watch(const watch_options& options) {
    end_on_signals();
    // otherwise the connection would get its number
    if (fcntl(STDOUT_FILENO, F_GETFD) < 0) fail_output();
    unique_fd connection = connect_to_host(options);
    const bool was_local = is_local(connection.get());
    frame_reader frames;
    std::array<char, 65536> bytes;
    while (wait_readable(connection.get())) {
        const ssize_t size = recv(connection.get(), bytes.data(), bytes.size(), 0);
        if (size < 0 && errno == EINTR) continue;
        if (size <= 0) {
            reset_connection(connection);
            tell_why_closed(options, was_local, frames.is_inside_frame());
        }
        frames.add({bytes.data(), static_cast<size_t>(size)});
        if (!write_output(take_frames(frames, options))) return status_done;
        if (frames.is_broken()) {
            throw failure("what came from " + options.host + ", port " + port +
                          ", is no frame of a debug interface; it may not be kivd that serves it");
        }
    }
    return status_done;
}

}  // namespace kivd
