// A daemon in a process of its own, and clients that speak to its sockets byte by byte. The
// measurements and the tests share both.
#pragma once

#include <sys/resource.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "util/unique_fd.h"

namespace kivd {

// Looks every few milliseconds until `holds` gives true; false after `limit_ms`. The usual limit
// leaves room for sanitizers on a busy machine: what takes that long never happens.
[[nodiscard]] bool wait_until(const std::function<bool()>& holds, int limit_ms = 20000);

[[nodiscard]] std::string gunzip_file(const std::string& path);  // empty when it is cut or spoilt

struct start_options {
    std::vector<std::string> arguments;
    rlim_t descriptor_limit = 0;  // 0: that of the test
    uid_t uid = 0;                // 0: that of the test
};

// Owns a process, by its id, and kills it when it has not ended.
class child_process {
 public:
    child_process() = default;
    explicit child_process(pid_t child) : pid_(child) {}
    child_process(child_process&& other) noexcept : child_process() { *this = std::move(other); }
    child_process& operator=(child_process&& other) noexcept;
    ~child_process();

    [[nodiscard]] pid_t pid() const { return pid_; }
    // The exit status, 128 and the signal's number after a signal; -1 while it runs on.
    [[nodiscard]] int wait_exit(int limit_ms = 20000);
    void send_signal(int signal) const;
    [[nodiscard]] int stop();  // SIGTERM, then as above

 private:
    [[nodiscard]] bool reap();

    pid_t pid_ = -1;
    int status_ = -1;
};

// What it prints goes to unnamed files, so it never waits for a reader.
class daemon_process : public child_process {
 public:
    daemon_process() = default;
    daemon_process(const std::string& program, const start_options& options);
    explicit daemon_process(pid_t child) : child_process(child) {}  // one that is running already

    [[nodiscard]] bool wait_ready();  // false when it ends instead

    [[nodiscard]] std::string output() const;
    [[nodiscard]] std::string log(size_t from = 0) const;
    [[nodiscard]] bool wait_log(std::string_view text, size_t from = 0) const;
    [[nodiscard]] size_t count_in_log(std::string_view text) const;

    [[nodiscard]] size_t descriptors() const;
    [[nodiscard]] int64_t anonymous_kib() const;  // memory that no file backs, counted page by page
    [[nodiscard]] bool wait_idle() const;         // until it takes no more CPU time

 private:
    [[nodiscard]] std::string proc(const char* name) const;

    unique_fd output_;
    unique_fd log_;
};

enum class socket_kind : uint8_t { datagram, packets, stream };

// Connected to a socket in `directory`; invalid when no daemon listens there.
[[nodiscard]] unique_fd connect_client(socket_kind kind, const std::string& directory = ".");
// Both give up after ten seconds. Receiving gives an empty text then, and when the peer closed.
bool send_text(int fd, std::string_view text);
[[nodiscard]] std::string receive_text(int fd);
[[nodiscard]] std::string ask(int fd, std::string_view request);
// "HD 2 IA" for "IA".
[[nodiscard]] std::string framed(std::string_view request);
// Until the daemon has taken from the socket all that was sent.
[[nodiscard]] bool wait_taken(int fd);

}  // namespace kivd
