#include "list/sorted_list.h"

#include <cstring>

#include "platform/android_log.h"

namespace kivd {
namespace {

constexpr char tag[] = "kivd-list";

}  // namespace

void any_list::swap(any_list& other) noexcept {
    std::swap(keys_, other.keys_);
    std::swap(count_, other.count_);
    std::swap(capacity_, other.capacity_);
    std::swap(grow_by_, other.grow_by_);
    std::swap(order_, other.order_);
    std::swap(index_, other.index_);
}

void any_list::use_index() {
    index_.create();
    for (probe_key* const key : keys()) index_.add(key);
}

bool any_list::make_room() {
    if (count_ < capacity_) return true;
    const size_t capacity = size_t{count_} + grow_by_;
    void* const grown = realloc(keys_, capacity * sizeof(void*));
    if (grown == nullptr) {
        __android_log_print(ANDROID_LOG_WARN, tag, "Failed to grow list to %zu elements", capacity);
        return false;
    }
    keys_ = static_cast<probe_key**>(grown);
    capacity_ = static_cast<uint32_t>(capacity);
    return true;
}

// The position of the entry equal to `key`, or the one at which it would be inserted.
uint32_t any_list::search(const probe_key& key, bool& found) const {
    uint32_t low = 0;
    uint32_t high = count_;
    found = false;
    while (low < high) {
        const uint32_t middle = low + (high - low) / 2;
        const int order = order_(key, *keys_[middle]);
        if (order == 0) {
            found = true;
            return middle;
        }
        if (order < 0) {
            high = middle;
        } else {
            low = middle + 1;
        }
    }
    return low;
}

probe_key* any_list::find_key(const probe_key& key) const {
    if (index_.exists()) return index_.find(key);
    bool found = false;
    const uint32_t position = search(key, found);
    return found ? keys_[position] : nullptr;
}

bool any_list::add_key(probe_key* added) {
    if (!make_room()) return false;
    bool found = false;
    const uint32_t position = search(*added, found);
    if (found) {
        __android_log_print(ANDROID_LOG_WARN, tag, "list_add: Duplicate found!");
        return false;
    }
    probe_key** const slot = keys_ + position;
    memmove(slot + 1, slot, (count_ - position) * sizeof(void*));
    *slot = added;
    ++count_;
    index_.add(added);
    return true;
}

bool any_list::append_key(probe_key* added) {
    if (!make_room()) return false;
    keys_[count_++] = added;
    index_.add(added);
    return true;
}

void any_list::keep_first(uint32_t count) {
    count_ = count;
    if (index_.exists()) use_index();
}

void any_list::forget_keys() {
    free(keys_);
    keys_ = nullptr;
    count_ = capacity_ = 0;
    index_.release();
}

}  // namespace kivd
