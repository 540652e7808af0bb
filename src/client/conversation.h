// Requests that the daemon answers. Each conversation has a connection of its own and a deadline.
#pragma once

#include <unistd.h>

#include <cstddef>
#include <initializer_list>
#include <string_view>

#include "handle.h"
#include "transport.h"

namespace libkiv {

inline constexpr size_t answer_size_max = 40;  // that of a device id

// Owns a descriptor, or none.
struct owned_fd {
    explicit owned_fd(int new_fd = -1) : fd(new_fd) {}
    owned_fd(const owned_fd&) = delete;
    owned_fd& operator=(const owned_fd&) = delete;
    ~owned_fd() {
        if (fd >= 0) close(fd);
    }

    int fd;
};

struct reply {
    char text[answer_size_max];
    size_t size = 0;
    owned_fd attached;

    [[nodiscard]] std::string_view view() const { return {text, size}; }
};

enum class access { open, privileged };

// What comes back from the daemon.
struct answers {
    reply device_id;  // of privileged requests
    reply last;
};

// Has the daemon carry out `requests` (null for none) and waits until it has. Only the last one has
// an answer, which comes whoever asks and is `refusal` for a caller without permission. Gives 0, or
// a negative errno value as the control calls of kiv.h do.
[[nodiscard]] int converse(const kiv_handle& handle, access needed,
                           std::initializer_list<const request*> requests, std::string_view refusal,
                           answers& got);

}  // namespace libkiv
