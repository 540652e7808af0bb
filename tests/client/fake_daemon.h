// A daemon's side to play on its sockets.
#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "util/unique_fd.h"

namespace kivd {

// Bound to a path, which it unlinks first, as a starting daemon does.
inline unique_fd bind_socket(int type, const std::string& path) {
    unique_fd fd(socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    unlink(address.sun_path);
    const auto* const generic = reinterpret_cast<const sockaddr*>(&address);
    if (bind(fd.get(), generic, sizeof address) != 0) abort();
    return fd;
}

// A message with descriptors attached, which stay the caller's.
struct control_answer {
    control_answer(std::string answered_text, std::vector<int> attached = {})
        : text(std::move(answered_text)), descriptors(std::move(attached)) {}
    control_answer(const char* answered_text) : text(answered_text) {}

    void send(int fd) {
        iovec part = {text.data(), text.size()};
        alignas(cmsghdr) char control[CMSG_SPACE(8 * sizeof(int))] = {};
        const size_t size = descriptors.size() * sizeof(int);
        msghdr message = {nullptr, 0, &part, 1, control, size > 0 ? CMSG_SPACE(size) : 0, 0};
        *reinterpret_cast<cmsghdr*>(control) = {CMSG_LEN(size), SOL_SOCKET, SCM_RIGHTS};
        if (size > 0) memcpy(control + CMSG_LEN(0), descriptors.data(), size);
        (void)sendmsg(fd, &message, MSG_NOSIGNAL);
    }

    std::string text;
    std::vector<int> descriptors;
};

// Answers on the control socket in a thread of its own. The answer to a request may be empty, for
// none, or absent: then the daemon hangs up.
class control_server {
 public:
    using answer_function = std::function<std::optional<control_answer>(const std::string&)>;

    control_server(const std::string& directory, answer_function answer)
        : socket_(bind_socket(SOCK_SEQPACKET, directory + "/kiv_co")), answer_(std::move(answer)) {
        listen(socket_.get(), 5);
        thread_ = std::jthread([this] { serve(); });
    }
    ~control_server() { shutdown(socket_.get(), SHUT_RDWR); }  // ends the accept

    // The requests of all connections so far, a blank before each.
    std::string take_requests() {
        const std::scoped_lock lock(mutex_);
        return std::exchange(requests_, {});
    }

 private:
    void serve() {
        for (;;) {
            const unique_fd fd(accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
            if (!fd.ok()) return;
            while (handle_request(fd.get())) continue;
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
        if (!answer->text.empty()) answer->send(fd);
        return true;
    }

    unique_fd socket_;
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

}  // namespace kivd
