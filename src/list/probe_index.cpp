#include "list/probe_index.h"

#include <cstdlib>
#include <functional>
#include <string_view>

namespace kivd {
namespace {

constexpr uint32_t first_capacity = 256;
constexpr uint32_t max_probes = 1024;  // clients choose the keys, and could choose colliding ones

uint32_t first_slot(const probe_index& index, const probe_key& key) {
    constexpr std::hash<std::string_view> hash;
    constexpr size_t factor = 0x9E3779B97F4A7C15;  // tells (a, b) from (b, a)
    return static_cast<uint32_t>(hash(key.package) * factor + hash(key.name)) &
           (index.capacity - 1);
}

// The slot of the element with that key, or the free one where it would go; null when either is
// too far away.
void** find_slot(const probe_index& index, const probe_key& key) {
    uint32_t slot = first_slot(index, key);
    for (uint32_t probe = 0; probe < max_probes; ++probe) {
        void** const candidate = index.slots + slot;
        if (*candidate == nullptr || compare_probes(&key, *candidate) == 0) return candidate;
        slot = (slot + 1) & (index.capacity - 1);
    }
    return nullptr;
}

void** allocate_slots(uint32_t capacity) {
    return static_cast<void**>(calloc(capacity, sizeof(void*)));
}

void insert(probe_index& index, void* element) {
    void** const slot = find_slot(index, *static_cast<const probe_key*>(element));
    if (slot == nullptr) return probe_index_release(index);
    if (*slot != nullptr) return;
    *slot = element;
    ++index.count;
}

void grow(probe_index& index) {
    const probe_index old = index;
    index = {allocate_slots(old.capacity * 2), old.capacity * 2, 0};
    for (uint32_t i = 0; i < old.capacity && index.slots != nullptr; ++i) {
        if (old.slots[i] != nullptr) insert(index, old.slots[i]);
    }
    free(old.slots);
}

}  // namespace

probe_index probe_index_create() { return {allocate_slots(first_capacity), first_capacity, 0}; }

void probe_index_add(probe_index& index, void* element) {
    if (index.slots != nullptr && index.count >= index.capacity / 4 * 3) grow(index);
    if (index.slots != nullptr) insert(index, element);
}

void* probe_index_find(const probe_index& index, const probe_key& key) {
    void** const slot = find_slot(index, key);
    return slot != nullptr ? *slot : nullptr;
}

void probe_index_release(probe_index& index) {
    free(index.slots);
    index = {};
}

}  // namespace kivd
