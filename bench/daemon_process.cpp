#include "bench/daemon_process.h"

#include <fcntl.h>
#include <linux/sockios.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <thread>
#include <utility>

namespace kivd {
namespace {

constexpr time_t client_limit_s = 10;
constexpr char ready_text[] = "Ready to serve the world.";

// In the child, between fork and exec: system calls only.
void become(const start_options& options, char* const* arguments, int output, int log) {
    if (options.descriptor_limit > 0) {
        const rlimit limit = {options.descriptor_limit, options.descriptor_limit};
        (void)setrlimit(RLIMIT_NOFILE, &limit);
    }
    const int program = open(arguments[0], O_PATH | O_CLOEXEC);  // others may not see where it is
    if (options.uid != 0 && (setgid(options.uid) != 0 || setuid(options.uid) != 0)) _exit(126);
    (void)prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (dup2(output, STDOUT_FILENO) < 0 || dup2(log, STDERR_FILENO) < 0) _exit(126);
    (void)fexecve(program, arguments, environ);
    _exit(127);
}

std::string read_from(int fd, size_t start) {
    std::string text;
    std::array<char, 16384> piece;
    for (ssize_t n = 1; n > 0;) {
        n = pread(fd, piece.data(), piece.size(), static_cast<off_t>(start + text.size()));
        if (n > 0) text.append(piece.data(), static_cast<size_t>(n));
    }
    return text;
}

}  // namespace

bool wait_until(const std::function<bool()>& holds, int limit_ms) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(limit_ms);
    while (!holds()) {
        if (std::chrono::steady_clock::now() > deadline) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

std::string gunzip_file(const std::string& path) {
    const gzFile file = gzopen(path.c_str(), "re");
    if (file == nullptr) return {};
    std::string text;
    std::array<char, 16384> piece;
    int n = 1;
    while (n > 0) {
        n = gzread(file, piece.data(), piece.size());
        if (n > 0) text.append(piece.data(), static_cast<size_t>(n));
    }
    const bool whole = n == 0 && gzdirect(file) == 0;
    return gzclose(file) == Z_OK && whole ? text : std::string();
}

child_process& child_process::operator=(child_process&& other) noexcept {
    std::swap(pid_, other.pid_);
    std::swap(status_, other.status_);
    return *this;
}

child_process::~child_process() {
    if (pid_ <= 0 || reap()) return;
    send_signal(SIGKILL);
    (void)wait_exit();
}

bool child_process::reap() {
    if (status_ >= 0) return true;
    int status = 0;
    if (waitpid(pid_, &status, WNOHANG) != pid_) return false;
    status_ = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    return true;
}

int child_process::wait_exit(int limit_ms) {
    if (reap()) return status_;
    const unique_fd process(static_cast<int>(syscall(SYS_pidfd_open, pid_, 0)));
    pollfd end = {process.get(), POLLIN, 0};
    (void)poll(&end, 1, limit_ms);
    (void)reap();
    return status_;
}

void child_process::send_signal(int signal) const {
    if (pid_ > 0 && status_ < 0) (void)kill(pid_, signal);
}

int child_process::stop() {
    send_signal(SIGTERM);
    return wait_exit();
}

daemon_process::daemon_process(const std::string& program, const start_options& options)
    : output_(memfd_create("output", MFD_CLOEXEC)), log_(memfd_create("log", MFD_CLOEXEC)) {
    std::vector<char*> arguments = {const_cast<char*>(program.c_str())};
    for (const std::string& each : options.arguments) {
        arguments.push_back(const_cast<char*>(each.c_str()));
    }
    arguments.push_back(nullptr);
    // Its children log, too: where two of them share a position, one line would end up in another.
    (void)fcntl(log_.get(), F_SETFL, O_APPEND);
    const pid_t child = fork();
    if (child == 0) become(options, arguments.data(), output_.get(), log_.get());
    child_process::operator=(child_process(child));
}

bool daemon_process::wait_ready() {
    const auto has_ended = [this] { return wait_exit(0) >= 0; };
    return wait_until([&] { return has_ended() || count_in_log(ready_text) > 0; }) && !has_ended();
}

std::string daemon_process::output() const { return read_from(output_.get(), 0); }

std::string daemon_process::log(size_t from) const { return read_from(log_.get(), from); }

bool daemon_process::wait_log(std::string_view text, size_t from) const {
    return wait_until([&] { return log(from).find(text) != std::string::npos; });
}

size_t daemon_process::count_in_log(std::string_view text) const {
    const std::string all = log();
    size_t count = 0;
    for (size_t at = all.find(text); at != std::string::npos; at = all.find(text, at + 1)) ++count;
    return count;
}

std::string daemon_process::proc(const char* name) const {
    return "/proc/" + std::to_string(pid()) + "/" + name;
}

size_t daemon_process::descriptors() const {
    std::error_code error;
    const std::filesystem::directory_iterator entries(proc("fd"), error);
    return static_cast<size_t>(std::distance(begin(entries), end(entries)));
}

int64_t daemon_process::anonymous_kib() const {
    std::ifstream file(proc("smaps_rollup"));
    for (std::string line; std::getline(file, line);) {
        if (line.starts_with("Anonymous:")) return std::stoll(line.substr(sizeof "Anonymous:"));
    }
    return 0;
}

bool daemon_process::wait_idle() const {
    std::string before;
    int quiet = 0;
    return wait_until([&] {
        std::string now;
        std::getline(std::ifstream(proc("schedstat")), now);
        quiet = now == before ? quiet + 1 : 0;
        before = now;
        return quiet == 100;  // looks, which is a fifth of a second or more
    });
}

unique_fd connect_client(socket_kind kind, const std::string& directory) {
    struct {
        int type;
        const char* name;
    } static constexpr sockets[] = {
        {SOCK_DGRAM, "/kiv_cl"}, {SOCK_SEQPACKET, "/kiv_co"}, {SOCK_STREAM, "/kiv_co_stream"}};
    const auto& [type, name] = sockets[static_cast<size_t>(kind)];
    unique_fd fd(socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    const timeval limit = {client_limit_s, 0};
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    (directory + name).copy(address.sun_path, sizeof address.sun_path - 1);
    if (connect(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        fd.reset();
    }
    return fd;
}

bool send_text(int fd, std::string_view text) {
    return send(fd, text.data(), text.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(text.size());
}

std::string receive_text(int fd) {
    std::array<char, 1024> reply;
    const ssize_t n = recv(fd, reply.data(), reply.size(), 0);
    return {reply.data(), static_cast<size_t>(std::max<ssize_t>(n, 0))};
}

std::string ask(int fd, std::string_view request) {
    return send_text(fd, request) ? receive_text(fd) : std::string();
}

std::string framed(std::string_view request) {
    return "HD " + std::to_string(request.size()) + " " + std::string(request);
}

bool wait_taken(int fd) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(client_limit_s);
    int left = 0;
    while (ioctl(fd, SIOCOUTQ, &left) == 0 && left > 0) {
        if (std::chrono::steady_clock::now() > deadline) return false;
        (void)usleep(10);  // what is measured waits here
    }
    return true;
}

}  // namespace kivd
