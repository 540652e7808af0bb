// The pair of texts that names a probe and that the elements of every list begin with.
#pragma once

#include <cstddef>

namespace kivd {

struct probe_key {
    const char* package;
    const char* name;
};

// Compares packages, then names, byte by byte; for elements that begin with a probe_key. Below 0
// when `key` sorts before `element`, 0 when equal, above 0 when after.
[[nodiscard]] int compare_probes(const void* key, const void* element);

// A block of malloc of `fixed_size` bytes that begins with a probe_key, with copies of the two
// texts behind it. The caller fills in the rest; null when there is no memory.
[[nodiscard]] void* new_probe_element(size_t fixed_size, const probe_key& key);

}  // namespace kivd
