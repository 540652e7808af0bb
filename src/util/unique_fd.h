// Owners of what the system hands out: descriptors, streams, directories.
#pragma once

#include <dirent.h>

#include <cstdio>
#include <memory>
#include <utility>

#include "util/releaser.h"

namespace kivd {

using unique_file = std::unique_ptr<FILE, releaser<fclose>>;
using unique_dir = std::unique_ptr<DIR, releaser<closedir>>;

// Owns a descriptor; -1 is none.
class unique_fd {
 public:
    constexpr explicit unique_fd(int fd = -1) noexcept : fd_(fd) {}
    unique_fd(unique_fd&& other) noexcept : fd_(other.release()) {}
    unique_fd& operator=(unique_fd&& other) noexcept {
        reset(other.release());
        return *this;
    }
    ~unique_fd() { reset(); }

    [[nodiscard]] int get() const noexcept { return fd_; }
    [[nodiscard]] bool ok() const noexcept { return fd_ >= 0; }  // not operator bool: 0 is valid
    [[nodiscard]] int release() noexcept { return std::exchange(fd_, -1); }
    void reset(int fd = -1) noexcept;  // closes once, not again after EINTR; keeps errno

 private:
    int fd_;
};

}  // namespace kivd
