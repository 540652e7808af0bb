// A hash index over the entries of a list. A binary search among 20,000 counters touches more cold
// memory than all the rest of a request; this touches one slot and one entry.
//
// An index can be lost: when it cannot grow, or when its keys, which clients choose, no longer
// spread. Its owner then searches in another way.
#pragma once

#include <cstdint>
#include <utility>

#include "format/probe_key.h"

namespace kivd {

class probe_index {
 public:
    constexpr probe_index() = default;
    probe_index(probe_index&& other) noexcept { swap(other); }
    probe_index& operator=(probe_index&& other) noexcept {
        swap(other);
        return *this;
    }
    ~probe_index() { release(); }

    // Makes an empty index, or none when there is no memory.
    void create();
    void release();
    [[nodiscard]] bool exists() const { return slots_ != nullptr; }

    // Adds an entry's key, which stays the caller's, unless there is no index or such a key is
    // there.
    void add(probe_key* added);

    // The entry's key equal to `key`, or null. There must be an index.
    [[nodiscard]] probe_key* find(const probe_key& key) const;

 private:
    void swap(probe_index& other) noexcept {
        std::swap(slots_, other.slots_);
        std::swap(capacity_, other.capacity_);
        std::swap(count_, other.count_);
    }
    [[nodiscard]] uint32_t first_slot(const probe_key& key) const;
    [[nodiscard]] probe_key** find_slot(const probe_key& key) const;
    void insert(probe_key* added);
    void grow();

    probe_key** slots_ = nullptr;  // null: there is no index
    uint32_t capacity_ = 0;        // a power of two
    uint32_t count_ = 0;
};

}  // namespace kivd
