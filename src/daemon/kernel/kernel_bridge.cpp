#include "daemon/kernel/kernel_bridge.h"

#include <linux/netlink.h>
#include <poll.h>
#include <pthread.h>
#include <semaphore.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>

#include "daemon/kernel/process_kill.h"
#include "format/request_words.h"
#include "platform/android_log.h"
#include "runtime/client_lines.h"
#include "runtime/log_and_raise.h"
#include "runtime/stop.h"
#include "util/paths.h"
#include "util/releaser.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivkb";
constexpr int retry_ms = 100;
constexpr suseconds_t send_timeout_us = 50000;  // then it looks whether the daemon is to stop

constinit pthread_t thread = {};
constinit bool thread_started = false;
sem_t is_set_up = {};

// These stay open until the process ends, so that nobody else takes the port.
constinit daemon_socket to_daemon;
constinit unique_fd from_kernel;

// Logs "WHAT [errno/text]".
bool fail(const char* what, const char* end = "") {
    __android_log_print(ANDROID_LOG_ERROR, tag, "%s [%d/%s]%s", what, errno, strerror(errno), end);
    return false;
}

// Waits until `fd` is readable; false when the daemon is to stop.
bool wait_for_message(int fd) {
    pollfd awaited[] = {{fd, POLLIN, 0}, {stop_event_fd(), POLLIN, 0}};
    while (!is_stop_requested()) {
        if (poll(awaited, 2, -1) > 0 && awaited[0].revents != 0) return true;
    }
    return false;
}

// The size of the message that waits, without taking it; -1 on failure.
ssize_t peek_size(int netlink) {
    return recv(netlink, nullptr, 0, MSG_PEEK | MSG_TRUNC | MSG_DONTWAIT);
}

// The message is still there after an error that lasts, and would be found again at once.
void wait_after(int error) {
    const bool is_over = error == EAGAIN || error == EINTR || error == ENOBUFS;  // it tells a loss
    if (!is_over) wait_for_stop(retry_ms);
}

// Waits for room in the daemon's queue, until the daemon is to stop. Returns what sendto returns.
ssize_t send_request(const daemon_socket& daemon, std::string_view text) {
    const auto* const address = reinterpret_cast<const sockaddr*>(&daemon.address);
    for (;;) {
        const ssize_t sent = sendto(daemon.fd.get(), text.data(), text.size(), MSG_NOSIGNAL,
                                    address, sizeof daemon.address);
        if (sent >= 0 || (errno != EAGAIN && errno != EINTR) || is_stop_requested()) return sent;
    }
}

// The next token from `position` on, which then moves behind it. Blanks separate tokens.
std::string_view next_token(std::string_view text, size_t& position) {
    const size_t start = std::min(text.find_first_not_of(' ', position), text.size());
    const size_t end = std::min(text.find(' ', start), text.size());
    position = end;
    return text.substr(start, end - start);
}

// "EV package name RECORD": the record is replaced by its translation.
void pass_event(const daemon_socket& daemon, std::span<char> message, size_t position) {
    const std::string_view text(message.data(), message.size());
    const std::string_view package = next_token(text, position);
    const std::string_view name = next_token(text, position);
    if (package.empty() || name.empty()) {
        log_and_raise(tag, "Badly formatted event - dropping.");
        return;
    }
    const size_t start = std::min(position + 1, text.size());
    const std::span<char> record = message.subspan(start);
    if (record.size() > max_payload_size) {
        log_and_raise(tag, "Too large event - dropping.");
        return;
    }
    const std::optional<packed_event> packed = translate_event(package, name, record);
    if (packed && packed->size == 0) {
        log_and_raise(tag, "Failed to pack %zu bytes.", record.size());
        return;
    }
    if (!packed || packed->size >= record.size()) {
        log_and_raise(tag, "Packed size greater than unpacked size, bailing...");
        return;
    }
    memcpy(record.data(), packed->bytes.get(), packed->size);
    (void)send_request(daemon, text.substr(0, start + packed->size));
}

void pass_counter(const daemon_socket& daemon, std::string_view text) {
    const ssize_t sent = send_request(daemon, text);
    if (sent == static_cast<ssize_t>(text.size())) return;
    log_and_raise(tag, "Failed to pass counter data to kivd (%d/%d).",
                  static_cast<int>(text.size()), static_cast<int>(sent));
}

// Passes on nothing but translated events and counters: every local user can send to this netlink
// port, and the daemon takes what the bridge sends for its own.
void pass_on(const daemon_socket& daemon, std::span<char> message) {
    const line_cause_scope cause(line_cause::client);
    const std::string_view text(message.data(), message.size());
    size_t position = 0;
    const std::string_view command = next_token(text, position);
    if (command.empty()) {
        log_and_raise(tag, "Failed to parse input.");
    } else if (command == "EV") {
        pass_event(daemon, message, position);
    } else if (command == "CI" || command == "CS") {
        pass_counter(daemon, text);
    }
}

void* run_thread(void* /*argument*/) {
    (void)pthread_setname_np(pthread_self(), "kivkb");
    run_kernel_bridge();
    return nullptr;
}

}  // namespace

bool open_daemon_socket(daemon_socket& daemon) {
    daemon.address = {};
    daemon.address.sun_family = AF_UNIX;
    snprintf(daemon.address.sun_path, sizeof daemon.address.sun_path, "%s%s", KIV_DEFAULT_DIRECTORY,
             paths::datagram_socket);
    daemon.fd.reset(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (!daemon.fd.ok()) return fail("Failed to create unix socket");
    const timeval timeout = {0, send_timeout_us};
    (void)setsockopt(daemon.fd.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
    return true;
}

bool open_netlink_socket(unique_fd& netlink) {
    netlink.reset(socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_USERSOCK));
    if (!netlink.ok()) return fail("Failed to create netlink socket");
    sockaddr_nl own = {};
    own.nl_family = AF_NETLINK;
    own.nl_pid = static_cast<uint32_t>(getpid());
    if (bind(netlink.get(), reinterpret_cast<const sockaddr*>(&own), sizeof own) == 0) return true;
    fail("Failed to assign netlink socket name", ".");
    if (close(netlink.release()) != 0) {
        __android_log_print(ANDROID_LOG_ERROR, tag, "Failed to close netlink socket.");
    }
    return false;
}

bool send_pid_to_kernel(int netlink) {
    char digits[6];  // longer ids are cut, as the kernel expects
    snprintf(digits, sizeof digits, "%d", getpid());
    sockaddr_nl kernel = {};
    kernel.nl_family = AF_NETLINK;
    if (sendto(netlink, digits, strlen(digits) + 1, 0, reinterpret_cast<const sockaddr*>(&kernel),
               sizeof kernel) >= 0) {
        __android_log_print(ANDROID_LOG_INFO, tag, "Ready to serve the kernel!");
        return true;
    }
    return errno == ECONNREFUSED ? false : fail("Failed to send pid to kernel");
}

void receive_kernel_message(int netlink, daemon_socket& daemon) {
    if (!wait_for_message(netlink)) return;
    const ssize_t peeked = peek_size(netlink);
    if (peeked < 0) return wait_after(errno);
    const auto size = static_cast<size_t>(peeked);
    const unique_malloc<char> buffer(static_cast<char*>(malloc(size + 1)));
    if (!buffer) {
        log_and_raise(tag, "Unable to create buffer.\n");
        return wait_after(ENOMEM);
    }
    const ssize_t received = recv(netlink, buffer.get(), size + 1, MSG_DONTWAIT);
    if (received < 0) return wait_after(errno);
    const std::span<char> message(buffer.get(), static_cast<size_t>(received));
    pass_on(daemon, message.subspan(std::min(sizeof(nlmsghdr), message.size())));
}

void run_kernel_bridge() {
    const bool serving = open_daemon_socket(to_daemon) && open_netlink_socket(from_kernel) &&
                         send_pid_to_kernel(from_kernel.get());
    (void)sem_post(&is_set_up);
    if (!serving) return;
    while (!is_stop_requested()) receive_kernel_message(from_kernel.get(), to_daemon);
    __android_log_print(ANDROID_LOG_INFO, tag, "Shutting Down...");
}

bool start_kernel_bridge() {
    if (sem_init(&is_set_up, 0, 0) != 0) return false;
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);  // a stop signal has to wake the loop
    thread_started = pthread_create(&thread, nullptr, run_thread, nullptr) == 0;
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    // What it opens is open from the start on.
    while (thread_started && sem_wait(&is_set_up) != 0 && errno == EINTR) {
    }
    return thread_started;
}

void join_kernel_bridge() {
    if (thread_started) (void)pthread_join(thread, nullptr);
    thread_started = false;
}

}  // namespace kivd
