#include "list/probe_index.h"

#include <cstddef>
#include <cstdlib>
#include <functional>
#include <string_view>

namespace kivd {
namespace {

constexpr uint32_t first_capacity = 256;
constexpr uint32_t max_probes = 1024;  // clients choose the keys, and could choose colliding ones

probe_key** allocate_slots(uint32_t capacity) {
    return static_cast<probe_key**>(calloc(capacity, sizeof(void*)));
}

}  // namespace

void probe_index::create() {
    release();
    slots_ = allocate_slots(first_capacity);
    capacity_ = first_capacity;
}

void probe_index::release() {
    free(slots_);
    slots_ = nullptr;
    capacity_ = count_ = 0;
}

uint32_t probe_index::first_slot(const probe_key& key) const {
    constexpr std::hash<std::string_view> hash;
    constexpr uint64_t factor = 0x9E3779B97F4A7C15;  // tells (a, b) from (b, a)
    return static_cast<uint32_t>(hash(key.package) * factor + hash(key.name)) & (capacity_ - 1);
}

// The slot of the entry with that key, or the free one where it would go; null when either is too
// far away.
probe_key** probe_index::find_slot(const probe_key& key) const {
    uint32_t slot = first_slot(key);
    for (uint32_t probe = 0; probe < max_probes; ++probe) {
        probe_key** const candidate = slots_ + slot;
        if (*candidate == nullptr || compare_probes(key, **candidate) == 0) return candidate;
        slot = (slot + 1) & (capacity_ - 1);
    }
    return nullptr;
}

void probe_index::insert(probe_key* added) {
    probe_key** const slot = find_slot(*added);
    if (slot == nullptr) return release();
    if (*slot != nullptr) return;
    *slot = added;
    ++count_;
}

void probe_index::grow() {
    probe_index grown;
    grown.slots_ = allocate_slots(capacity_ * 2);
    grown.capacity_ = capacity_ * 2;
    for (uint32_t i = 0; i < capacity_ && grown.exists(); ++i) {
        if (slots_[i] != nullptr) grown.insert(slots_[i]);
    }
    swap(grown);
}

void probe_index::add(probe_key* added) {
    if (exists() && count_ >= capacity_ / 4 * 3) grow();
    if (exists()) insert(added);
}

probe_key* probe_index::find(const probe_key& key) const {
    probe_key** const slot = find_slot(key);
    return slot != nullptr ? *slot : nullptr;
}

}  // namespace kivd
