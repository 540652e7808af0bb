#include "bench/bare_receivers.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <span>
#include <utility>
#include <vector>

#include "bench/measure.h"
#include "config/limits.h"

namespace kivd::bench {

namespace {

constexpr size_t buffer_size = 31177;
constexpr size_t control_size = 1024;
constexpr unsigned batch_size = 16;
constexpr int idle_limit_ms = 30'000;
constexpr int max_events = 10;

unique_fd bind_socket(int type, const std::string& path) {
    unique_fd fd(socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) give_up("%s: path too long", path.c_str());
    memcpy(address.sun_path, path.data(), path.size());
    if (bind(fd.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == -1)
        give_up("bind %s: %s", path.c_str(), strerror(errno));
    return fd;
}

unique_fd watch(int fd) {
    unique_fd poller(epoll_create1(EPOLL_CLOEXEC));
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = fd;
    if (epoll_ctl(poller.get(), EPOLL_CTL_ADD, fd, &event) == -1)
        give_up("epoll_ctl: %s", strerror(errno));
    return poller;
}

void receive_one_a_wait(int fd, int file, const std::vector<char>& head, size_t payload_at) {
    const unique_fd poller = watch(fd);
    const auto buffer = std::make_unique<char[]>(buffer_size);
    epoll_event events[max_events];
    while (epoll_wait(poller.get(), events, max_events, idle_limit_ms) > 0) {
        alignas(cmsghdr) char control[control_size];
        iovec part{buffer.get(), buffer_size};
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control;
        message.msg_controllen = sizeof control;
        const ssize_t size = recvmsg(fd, &message, 0);
        if (size <= static_cast<ssize_t>(payload_at)) continue;
        const size_t payload_size = static_cast<size_t>(size) - payload_at;
        if (write(file, head.data(), head.size()) == -1) return;
        if (write(file, buffer.get() + payload_at, payload_size) == -1) return;
        if (lseek(file, 0, SEEK_END) == -1) return;
    }
}

struct batch {
    mmsghdr messages[batch_size];
    iovec parts[batch_size];
    alignas(cmsghdr) char control[batch_size][control_size];
    char packets[batch_size][buffer_size];
};

// How many packets there were; none is no failure.
int receive_batch(int fd, batch& into) {
    for (unsigned i = 0; i < batch_size; ++i) {
        into.parts[i] = {into.packets[i], buffer_size};
        msghdr& header = into.messages[i].msg_hdr;
        header = {};
        header.msg_iov = &into.parts[i];
        header.msg_iovlen = 1;
        header.msg_control = into.control[i];
        header.msg_controllen = control_size;
    }
    return recvmmsg(fd, into.messages, batch_size, MSG_DONTWAIT, nullptr);
}

void receive_batched(int fd, int file, std::vector<char>& head, size_t payload_at) {
    const unique_fd poller = watch(fd);
    const auto packets = std::make_unique<batch>();
    epoll_event events[max_events];
    while (epoll_wait(poller.get(), events, max_events, idle_limit_ms) > 0) {
        const int count = receive_batch(fd, *packets);
        if (file == -1) continue;
        for (int i = 0; i < count; ++i) {
            const size_t size = packets->messages[i].msg_len;
            if (size <= payload_at) continue;
            const iovec record[] = {{head.data(), head.size()},
                                    {packets->packets[i] + payload_at, size - payload_at}};
            if (writev(file, record, 2) == -1) return;
        }
    }
}

// The event file of a receiver that makes reports.
class reported_file {
 public:
    reported_file(std::string directory, gzip_level level)
        : directory_(std::move(directory)), level_(level) {
        std::filesystem::create_directory(directory_ + "/output");
        open();
    }
    // False when the records cannot be written.
    bool append(std::span<const iovec> pieces, size_t size) {
        const ssize_t n = writev(file_.get(), pieces.data(), static_cast<int>(pieces.size()));
        if (n != static_cast<ssize_t>(size)) return false;
        size_ += size;
        if (size_ >= limits().max_report_size) flush();
        return true;
    }

 private:
    void open() {
        file_ = unique_fd(::open((directory_ + "/events").c_str(),
                                 O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, S_IRWXU));
        if (!file_.ok()) give_up("%s/events: %s", directory_.c_str(), strerror(errno));
        size_ = 0;
    }
    void flush() {
        const std::string flushed = directory_ + "/flushed";
        const std::string copy = directory_ + "/copy";
        const std::string report = directory_ + "/output/kiv_" + std::to_string(++reports_);
        if (child_ > 0) (void)waitpid(child_, nullptr, 0);
        if (rename((directory_ + "/events").c_str(), flushed.c_str()) != 0) return;
        child_ = fork();
        if (child_ == 0) {
            const bool made = gzip_file(flushed.c_str(), copy.c_str(), level_) &&
                              rename(copy.c_str(), report.c_str()) == 0;
            _exit(made && unlink(flushed.c_str()) == 0 ? 0 : 1);
        }
        open();
    }

    std::string directory_;
    gzip_level level_;
    unique_fd file_;
    size_t size_ = 0;
    unsigned reports_ = 0;
    pid_t child_ = -1;
};

void receive_gathered(int fd, const std::string& directory, std::vector<char>& head,
                      size_t payload_at, gzip_level level) {
    const unique_fd poller = watch(fd);
    const auto packets = std::make_unique<batch>();
    reported_file file(directory, level);
    epoll_event events[max_events];
    while (epoll_wait(poller.get(), events, max_events, idle_limit_ms) > 0) {
        const int count = receive_batch(fd, *packets);
        std::vector<iovec> pieces;
        size_t bytes = 0;
        for (int i = 0; i < count; ++i) {
            const size_t size = packets->messages[i].msg_len;
            if (size <= payload_at) continue;
            pieces.push_back({head.data(), head.size()});
            pieces.push_back({packets->packets[i] + payload_at, size - payload_at});
            bytes += head.size() + size - payload_at;
        }
        if (!pieces.empty() && !file.append(pieces, bytes)) return;
    }
}

void echo(int listener) {
    const unique_fd poller = watch(listener);
    epoll_event events[max_events];
    for (;;) {
        const int count = epoll_wait(poller.get(), events, max_events, idle_limit_ms);
        if (count <= 0) return;
        for (int i = 0; i < count; ++i) {
            const int fd = events[i].data.fd;
            if (fd == listener) {
                epoll_event added{};
                added.events = EPOLLIN;
                added.data.fd = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
                (void)epoll_ctl(poller.get(), EPOLL_CTL_ADD, added.data.fd, &added);
                continue;
            }
            char packet[64];
            const ssize_t size = recv(fd, packet, sizeof packet, 0);
            if (size <= 0) {
                (void)close(fd);
                continue;
            }
            (void)send(fd, "1", 1, MSG_NOSIGNAL);
        }
    }
}

}  // namespace

child_process start_receiver(receiver kind, const std::string& directory, size_t head_size,
                             size_t payload_at, gzip_level level) {
    const unique_fd fd = bind_socket(SOCK_DGRAM, directory + "/kiv_cl");
    const timeval timeout{.tv_sec = 1, .tv_usec = 0};
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
    const int on = 1;
    (void)setsockopt(fd.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    return fork_child([&] {
        std::vector<char> head(head_size, 'h');
        if (kind == receiver::batched_discard) return receive_batched(fd.get(), -1, head, 0);
        if (kind == receiver::gathered)
            return receive_gathered(fd.get(), directory, head, payload_at, level);
        const std::string path = directory + "/events";
        const unique_fd file(
            open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, S_IRWXU));
        if (!file.ok()) give_up("%s: %s", path.c_str(), strerror(errno));
        if (kind == receiver::one_a_wait)
            return receive_one_a_wait(fd.get(), file.get(), head, payload_at);
        receive_batched(fd.get(), file.get(), head, payload_at);
    });
}

child_process start_echo_server(const std::string& directory) {
    const unique_fd fd = bind_socket(SOCK_SEQPACKET, directory + "/kiv_co");
    if (listen(fd.get(), 5) == -1) give_up("listen: %s", strerror(errno));
    return fork_child([&] { echo(fd.get()); });
}

}  // namespace kivd::bench
