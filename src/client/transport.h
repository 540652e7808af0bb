// What producing and control calls share: requests, addresses and waiting.
#pragma once

#include <sys/uio.h>
#include <sys/un.h>

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <string_view>

namespace libkiv {

inline constexpr size_t request_size_max = 31176;

// One message, gathered where its at most six pieces lie. The casts are for sendmsg, which asks for
// more than it needs: it only reads.
class request {
 public:
    request(std::initializer_list<std::string_view> pieces) {
        for (const std::string_view piece : pieces) {
            parts_[count_++] = {const_cast<char*>(piece.data()), piece.size()};
            size_ += piece.size();
        }
    }

    [[nodiscard]] size_t size() const { return size_; }

    // 0, or a negative errno value; never waits.
    [[nodiscard]] int send_to(int fd) const;

 private:
    iovec parts_[6];
    size_t count_ = 0;
    size_t size_ = 0;
};

[[nodiscard]] int64_t now_ms();  // of a clock that nobody sets

// 0 once one of `events` or an error is there, -ETIMEDOUT, or another negative errno value.
[[nodiscard]] int await(int fd, short events, int64_t deadline_ms);

// Whether sending failed with `error`, a negative errno value, because the daemon has ended.
[[nodiscard]] bool is_peer_gone(int error);

// 0, -ENAMETOOLONG or -EINVAL.
[[nodiscard]] int make_address(const char* directory, const char* name, sockaddr_un& address);

// 0 or a negative errno value.
[[nodiscard]] int connect_to(int fd, const sockaddr_un& address);

}  // namespace libkiv
