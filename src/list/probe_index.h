// A hash index over elements that begin with a probe_key. A binary search among 20,000 counters
// touches more cold memory than all the rest of a request; this touches one slot and one element.
//
// An index can be lost: when it cannot grow, or when its keys are such that they no longer spread.
// Its owner then searches in another way.
#pragma once

#include <cstdint>

#include "format/probe_key.h"

namespace kivd {

struct probe_index {
    void** slots;       // null: there is no index
    uint32_t capacity;  // a power of two
    uint32_t count;
};

// Makes an empty index, or none when there is no memory.
[[nodiscard]] probe_index probe_index_create();

// Adds an element, unless there is no index or its key is there already.
void probe_index_add(probe_index& index, void* element);

// The element with that key, or null. There must be an index.
[[nodiscard]] void* probe_index_find(const probe_index& index, const probe_key& key);

void probe_index_release(probe_index& index);

}  // namespace kivd
