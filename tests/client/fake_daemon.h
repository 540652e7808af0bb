// The sockets of a daemon, and a daemon's side to play on them.
#pragma once

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace kivd {

// A fresh directory for them, gone afterwards.
struct socket_directory {
    socket_directory() {
        std::string pattern = std::filesystem::temp_directory_path() / "kiv_test_XXXXXX";
        if (mkdtemp(pattern.data()) == nullptr) abort();
        path = pattern;
    }
    socket_directory(const socket_directory&) = delete;
    socket_directory& operator=(const socket_directory&) = delete;
    ~socket_directory() { std::filesystem::remove_all(path); }

    std::string path;
};

// A socket bound to a path, which it unlinks first, as a starting daemon does.
class bound_socket {
 public:
    bound_socket(int type, const std::string& path) : fd_(socket(AF_UNIX, type | SOCK_CLOEXEC, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        unlink(address.sun_path);
        const auto* generic = reinterpret_cast<const sockaddr*>(&address);
        if (bind(fd_, generic, sizeof address) != 0) abort();
    }
    bound_socket(const bound_socket&) = delete;
    bound_socket& operator=(const bound_socket&) = delete;
    ~bound_socket() { close(fd_); }

    int fd() const { return fd_; }

    // The next message, waiting up to `timeout_ms` for it.
    std::optional<std::string> receive(int timeout_ms = 10'000) const {
        pollfd entry = {fd_, POLLIN, 0};
        if (poll(&entry, 1, timeout_ms) != 1) return std::nullopt;
        std::string message(40'000, '\0');
        const ssize_t size = recv(fd_, message.data(), message.size(), MSG_DONTWAIT);
        if (size < 0) return std::nullopt;
        message.resize(static_cast<size_t>(size));
        return message;
    }

    // What has been received already.
    std::optional<std::string> receive_now() const { return receive(0); }

 private:
    int fd_;
};

// A message with descriptors attached, which stay the caller's.
struct control_answer {
    control_answer(std::string answered_text, std::vector<int> attached = {})
        : text(std::move(answered_text)), descriptors(std::move(attached)) {}
    control_answer(const char* answered_text) : text(answered_text) {}

    std::string text;
    std::vector<int> descriptors;
};

inline void send_answer(int fd, control_answer& answer) {
    iovec part = {answer.text.data(), answer.text.size()};
    alignas(cmsghdr) char control_part[CMSG_SPACE(8 * sizeof(int))] = {};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    const size_t size = answer.descriptors.size() * sizeof(int);
    if (size > 0) {
        message.msg_control = control_part;
        message.msg_controllen = CMSG_SPACE(size);
        cmsghdr* header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET;
        header->cmsg_type = SCM_RIGHTS;
        header->cmsg_len = CMSG_LEN(size);
        memcpy(CMSG_DATA(header), answer.descriptors.data(), size);
    }
    (void)sendmsg(fd, &message, MSG_NOSIGNAL);
}

// Answers on the control socket in a thread of its own. The answer to a request may be empty, for
// none, or absent: then the daemon hangs up.
class control_server {
 public:
    using answer_function = std::function<std::optional<control_answer>(const std::string&)>;

    control_server(const std::string& directory, answer_function answer)
        : socket_(SOCK_SEQPACKET, directory + "/kiv_co"), answer_(std::move(answer)) {
        listen(socket_.fd(), 5);
        thread_ = std::jthread([this] { serve(); });
    }
    ~control_server() { shutdown(socket_.fd(), SHUT_RDWR); }  // ends the accept

    // The requests of all connections so far, a blank before each.
    std::string take_requests() {
        const std::scoped_lock lock(mutex_);
        return std::exchange(requests_, {});
    }

 private:
    void serve() {
        int fd;
        while ((fd = accept4(socket_.fd(), nullptr, nullptr, SOCK_CLOEXEC)) >= 0) {
            while (handle_request(fd)) continue;
            close(fd);
        }
    }

    bool handle_request(int fd) {
        char text[40'000];
        const ssize_t size = recv(fd, text, sizeof text, 0);
        if (size <= 0) return false;
        const std::string request(text, static_cast<size_t>(size));
        {
            const std::scoped_lock lock(mutex_);
            requests_ += ' ' + request;
        }
        auto answer = answer_(request);
        if (!answer) return false;
        if (!answer->text.empty()) send_answer(fd, *answer);
        return true;
    }

    bound_socket socket_;
    answer_function answer_;
    std::mutex mutex_;
    std::string requests_;
    std::jthread thread_;  // last: it uses the others
};

// What a daemon answers to a caller that it lets do everything. It has no diagnostics files, but
// once had those up to number 5.
inline control_server::answer_function allowing(std::string device_id,
                                                std::string is_config_taken = "1",
                                                std::string last_file = "5") {
    return [=](const std::string& request) -> std::optional<control_answer> {
        if (request == "GD") return device_id;
        if (request == "NC") return is_config_taken;
        if (request.starts_with("PA ")) return request == "PA p wanted" ? "1" : "0";
        if (request.starts_with("GC ") || request.starts_with("FG ")) return "FAIL";
        if (request.starts_with("FN ")) return request < "FN 750 0000000005" ? last_file : "-1";
        return request == "IA" ? "1" : "";
    };
}

// What a daemon answers to a caller without permission.
inline control_server::answer_function refusing() { return allowing("", "0", "-1"); }

}  // namespace kivd
