// Sharing out what is scarce: how many things of one kind each user has.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <span>

#include "util/releaser.h"

namespace kivd {

// Whether it is root, or whom this process runs as: they may use what is kept from others.
[[nodiscard]] bool is_privileged(uid_t uid);

// There are few users, so a search from the first one on is quick.
class user_counts {
 public:
    constexpr user_counts() = default;

    [[nodiscard]] uint32_t of(uid_t uid) const;
    // False when there is no memory.
    [[nodiscard]] bool add(uid_t uid);
    void remove(uid_t uid);
    void clear();

 private:
    struct count {
        uid_t uid;
        uint32_t things;  // 0: the place is free
    };
    [[nodiscard]] std::span<count> all() const { return {counts_.get(), size_}; }
    [[nodiscard]] count* find(uid_t uid) const;

    unique_malloc<count> counts_;
    size_t size_ = 0;
};

}  // namespace kivd
